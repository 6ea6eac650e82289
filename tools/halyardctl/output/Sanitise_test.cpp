#include "output/Sanitise.h"

#include <clocale>
#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

class SanitiseTest : public ::testing::Test {
protected:
    SanitiseTest() { EXPECT_NE(std::setlocale(LC_CTYPE, "C.UTF-8"), nullptr); }
};

TEST_F(SanitiseTest, LettersOfAllScriptsStay) {
    EXPECT_EQ(sanitised("Lied \xC3\xBC\x62\x65r 音楽 \xF0\x9F\x8E\xB5"),
              "Lied \xC3\xBC\x62\x65r 音楽 \xF0\x9F\x8E\xB5");
}

TEST_F(SanitiseTest, ControlCharactersAreShownAndNotSent) {
    EXPECT_EQ(sanitised("\x1b[2J\a\n\t\x7f"), "\\x1b[2J\\x07\\n\\t\\x7f");
    EXPECT_EQ(sanitised(std::string_view("a\0b", 3)), "a\\x00b");
    EXPECT_EQ(sanitised("\xC2\x9B"), "\\u{9b}"); // one byte of Latin-1 begins a sequence
}

TEST_F(SanitiseTest, TextThatLooksLikeAnEscapeCanBeToldFromOne) {
    EXPECT_EQ(sanitised("\\x1b"), "\\\\x1b");
}

TEST_F(SanitiseTest, BytesThatAreNoTextAreReplaced) {
    EXPECT_EQ(sanitised("a\xFF\xC3"), "a\xEF\xBF\xBD\xEF\xBF\xBD");
}

TEST_F(SanitiseTest, OverridesOfDirectionAreShown) {
    EXPECT_EQ(sanitised("\u202Egnp.exe"), "\\u{202e}gnp.exe");
    EXPECT_EQ(sanitised("\u2066\u2069\u200F\u061C"), "\\u{2066}\\u{2069}\\u{200f}\\u{61c}");
    EXPECT_EQ(sanitised("\u2028\uFEFF\u200B"), "\\u{2028}\\u{feff}\\u{200b}");
}

TEST_F(SanitiseTest, TowersOfMarksAreCutDown) {
    const std::string tower = "a\u0301\u0301\u0301\u0301\u0301";
    EXPECT_EQ(sanitised(tower), "a\u0301\u0301\u0301\u0301\\u{301}");
    EXPECT_EQ(sanitised("\u0301"), "\\u{301}");
}

TEST_F(SanitiseTest, WidthCountsCellsAndNotBytes) {
    EXPECT_EQ(displayWidth("abc"), 3U);
    EXPECT_EQ(displayWidth("音楽"), 4U);
    EXPECT_EQ(displayWidth("e\u0301"), 1U);
}

TEST_F(SanitiseTest, WhatIsTooLongIsCutBetweenLetters) {
    EXPECT_EQ(shortened("abcdef", 6), "abcdef");
    EXPECT_EQ(shortened("abcdefg", 6), "abcde…");
    EXPECT_EQ(shortened("音楽音楽", 6), "音楽…");
    EXPECT_EQ(shortened("音楽", 1), "…");
    EXPECT_EQ(shortened("abc", 0), "");
}

} // namespace
} // namespace halyard::ctl
