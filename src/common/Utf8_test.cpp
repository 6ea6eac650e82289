#include "common/Utf8.h"

#include <gtest/gtest.h>

namespace halyard {
namespace {

const std::string kReplacement = "\xEF\xBF\xBD";

TEST(Utf8Test, AcceptsTheFirstAndLastOfEachLength) {
    for (const char* text :
         {"", "a", "\x7F", "\xC2\x80", "\xDF\xBF", "\xE0\xA0\x80", "\xED\x9F\xBF", "\xEE\x80\x80",
          "\xEF\xBF\xBF", "\xF0\x90\x80\x80", "\xF4\x8F\xBF\xBF"}) {
        EXPECT_TRUE(isValidUtf8(text)) << text;
        EXPECT_EQ(replaceInvalidUtf8(text), text);
    }
    EXPECT_TRUE(isValidUtf8(std::string_view("a\0b", 3)));
}

TEST(Utf8Test, RejectsOverlongSurrogateAndOutOfRangeForms) {
    for (const char* text : {"\x80", "\xBF", "\xC0\x80", "\xC1\xBF", "\xE0\x9F\xBF", "\xED\xA0\x80",
                             "\xF0\x8F\xBF\xBF", "\xF4\x90\x80\x80", "\xF5\x80\x80\x80", "\xFF",
                             "\xC2", "\xE2\x82", "\xF0\x9F\x98"}) {
        EXPECT_FALSE(isValidUtf8(text));
        EXPECT_TRUE(isValidUtf8(replaceInvalidUtf8(text)));
    }
}

TEST(Utf8Test, FindsABadByteAtEveryOffset) {
    for (std::size_t offset = 0; offset < 24; ++offset) {
        std::string text(24, 'a');
        text[offset] = '\xFF';
        EXPECT_FALSE(isValidUtf8(text)) << offset;
    }
}

TEST(Utf8Test, ReplacesEachMaximalIllFormedPartOnce) {
    // The example of the Unicode standard, table 3-8 and following.
    EXPECT_EQ(replaceInvalidUtf8("\x61\xF1\x80\x80\xE1\x80\xC2\x62\x80\x63\x80\xBF\x64"),
              "a" + kReplacement + kReplacement + kReplacement + "b" + kReplacement + "c" +
                  kReplacement + kReplacement + "d");
    EXPECT_EQ(replaceInvalidUtf8("\xE0\x80"), kReplacement + kReplacement);
    EXPECT_EQ(replaceInvalidUtf8("\xF0\x9F\x98"), kReplacement);
}

} // namespace
} // namespace halyard
