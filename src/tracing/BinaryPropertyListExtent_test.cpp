#include "tracing/BinaryPropertyListExtent.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>

namespace halyard {
namespace {

using ::testing::Optional;
using namespace std::string_literals;

constexpr int kLevels = 4;
constexpr std::uint64_t kBytes = 1000;

// A file of these objects, the first of which is the root; all its numbers are of
// one byte.
std::string file(const std::vector<std::string>& objects) {
    std::string bytes = "bplist00";
    std::string table;
    for (const std::string& object : objects) {
        table += static_cast<char>(bytes.size());
        bytes += object;
    }
    const std::size_t tableOffset = bytes.size();
    bytes += table + "\0\0\0\0\0\0\1\1"s;
    for (const std::size_t number : {objects.size(), std::size_t{0}, tableOffset}) {
        bytes += "\0\0\0\0\0\0\0"s + static_cast<char>(number);
    }
    return bytes;
}

std::optional<std::uint64_t> measure(const std::string& bytes) {
    return BinaryPropertyListExtent(bytes, kLevels, kBytes).measure();
}

// Of `width` references to `object`.
std::string array(int width, char object) {
    return static_cast<char>(0xA0 + width) + std::string(static_cast<std::size_t>(width), object);
}

TEST(BinaryPropertyListExtentTest, AValueCountsItsBytesAndWhatItTakesAnyway) {
    EXPECT_THAT(measure(file({"\x09"})), Optional(16U));
    EXPECT_THAT(measure(file({"\x10\x07"})), Optional(17U));
    EXPECT_THAT(measure(file({"\x53"
                              "abc"})),
                Optional(19U));
    EXPECT_THAT(measure(file({"\x5F\x10\x14" + std::string(20, 'a')})), Optional(36U));
}

TEST(BinaryPropertyListExtentTest, WhatIsReferredToOftenCountsAsOften) {
    EXPECT_THAT(measure(file({array(3, 1), "\x51"
                                           "a"})),
                Optional(16U + 3 * 17));
    EXPECT_THAT(measure(file({"\xD1\1\1"s, "\x51"
                                           "a"})),
                Optional(16U + 2 * 17));
}

TEST(BinaryPropertyListExtentTest, ABombIsRefusedBeforeItIsRead) {
    EXPECT_EQ(measure(file({array(14, 1), array(14, 2), array(14, 3), "\x09"})), std::nullopt);
}

TEST(BinaryPropertyListExtentTest, AValueThatHoldsItselfIsRefused) {
    EXPECT_EQ(measure(file({array(1, 0)})), std::nullopt);
    EXPECT_EQ(measure(file({array(1, 1), array(1, 0)})), std::nullopt);
}

TEST(BinaryPropertyListExtentTest, LevelsAreBoundedWhereverAValueIsMetFirst) {
    const std::string leaf = "\x09";
    EXPECT_NE(measure(file({array(1, 1), array(1, 2), array(1, 3), leaf})), std::nullopt);
    EXPECT_EQ(measure(file({array(1, 1), array(1, 2), array(1, 3), array(1, 4), leaf})),
              std::nullopt);
    // 2 is met at the second level first, where it fits, and then at the third.
    EXPECT_EQ(measure(file({"\xA2\2\1"s, array(1, 2), array(1, 3), array(1, 4), leaf})),
              std::nullopt);
}

TEST(BinaryPropertyListExtentTest, ReferencesAndOffsetsOutsideTheFileAreRefused) {
    EXPECT_EQ(measure(file({array(1, 9)})), std::nullopt);
    std::string bytes = file({"\x09"});
    bytes[9] = '\x7F'; // the only entry of the table
    EXPECT_EQ(measure(bytes), std::nullopt);
    EXPECT_EQ(measure(file({"\x5F\x13\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF"})), std::nullopt);
}

TEST(BinaryPropertyListExtentTest, KeysAreTextsWithoutAZero) {
    const auto withKey = [](const std::string& key) {
        return measure(file({"\xD1\1\2"s, key, "\x09"}));
    };
    EXPECT_NE(withKey("\x52"
                      "kv"),
              std::nullopt);
    EXPECT_EQ(withKey("\x52"
                      "k\0"s),
              std::nullopt);
    EXPECT_NE(withKey("\x61\0k"s), std::nullopt);
    EXPECT_EQ(withKey("\x61\0\0"s), std::nullopt);
    EXPECT_EQ(withKey("\x09"), std::nullopt);
}

TEST(BinaryPropertyListExtentTest, EveryShorterFileIsRefused) {
    const std::string whole = file({array(2, 1), "\x09"});
    for (std::size_t length = 0; length < whole.size(); ++length) {
        EXPECT_EQ(measure(whole.substr(0, length)), std::nullopt) << length;
    }
}

} // namespace
} // namespace halyard
