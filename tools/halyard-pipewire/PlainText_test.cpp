#include "PlainText.h"

#include <gtest/gtest.h>

namespace halyard::pipewire {
namespace {

TEST(PlainTextTest, WordsOfAnyScriptStay) {
    EXPECT_EQ(plainText("Musik für Élise 音楽 🎵", 48), "Musik für Élise 音楽 🎵");
}

TEST(PlainTextTest, ControlCharactersAreShownByNumber) {
    EXPECT_EQ(plainText("a\x1b[31mb\n\tc\x7f", 48), "a\\x1b[31mb\\x0a\\x09c\\x7f");
    EXPECT_EQ(plainText("\xc2\x9b"
                        "5n",
                        48),
              "\\x9b5n");
}

TEST(PlainTextTest, MarksThatTurnTheWritingAreShownByNumber) {
    EXPECT_EQ(plainText("a\u202eb\u2066c\u200fd", 48), "a\\u{202e}b\\u{2066}c\\u{200f}d");
}

TEST(PlainTextTest, BytesThatAreNoUtf8AreShownByNumber) {
    EXPECT_EQ(plainText("a\xff"
                        "b",
                        48),
              "a\\xffb");
    EXPECT_EQ(plainText("\xe2\x82", 48), "\\xe2\\x82") << "cut off";
    EXPECT_EQ(plainText("\xc0\xaf", 48), "\\xc0\\xaf") << "longer than needed";
    EXPECT_EQ(plainText("\xe0\x80\xaf", 48), "\\xe0\\x80\\xaf") << "longer than needed";
    EXPECT_EQ(plainText("\xed\xa0\x80", 48), "\\xed\\xa0\\x80") << "half of a pair";
    EXPECT_EQ(plainText("\xf4\x90\x80\x80", 48), "\\xf4\\x90\\x80\\x80") << "beyond the last";
    EXPECT_EQ(plainText("\x80", 48), "\\x80") << "goes on with nothing";
}

TEST(PlainTextTest, LongTextEndsInAnEllipsis) {
    EXPECT_EQ(plainText("abcd", 4), "abcd");
    EXPECT_EQ(plainText("abcde", 4), "abc…");
    EXPECT_EQ(plainText("äöüßx", 4), "äöü…");
    EXPECT_EQ(plainText("ab\x01", 4), "ab…") << "a number is not cut in two";
}

TEST(PlainTextTest, WidthIsInCharacters) {
    EXPECT_EQ(widthOf(""), 0U);
    EXPECT_EQ(widthOf("für…"), 4U);
}

} // namespace
} // namespace halyard::pipewire
