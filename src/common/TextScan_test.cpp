#include "common/TextScan.h"

#include <gtest/gtest.h>

#include <string>

namespace halyard {
namespace {

TEST(PlainLength, IsThatOfATextWithoutAnythingSpecial) {
    for (std::size_t length = 0; length < 40; ++length) {
        EXPECT_EQ((plainLength<'"', '\\'>(std::string(length, 'x'))), length);
    }
    EXPECT_EQ(plainLength<'"'>(" !#~\x7f\x80\xff\xc3\xbc"), 9u);
}

TEST(PlainLength, EndsAtTheFirstSpecialByteWhereverItStands) {
    for (std::size_t length = 1; length < 30; ++length) {
        for (std::size_t place = 0; place < length; ++place) {
            for (const char special : {'\0', '\x1f', '\n', '"', '\x7f'}) {
                std::string text(length, '\xff');
                text[place] = special;
                text.back() = place + 1 < length ? '"' : text.back();
                EXPECT_EQ((plainLength<'"', '\x7f'>(text)), place) << length;
            }
        }
    }
}

TEST(PlainLength, KnowsEveryByte) {
    for (int byte = 0; byte < 256; ++byte) {
        const std::string text(11, static_cast<char>(byte));
        const bool isSpecial = byte < 0x20 || byte == '"' || byte == '\\';
        EXPECT_EQ((plainLength<'"', '\\'>(text)), isSpecial ? 0u : 11u) << byte;
    }
}

} // namespace
} // namespace halyard
