#include "common/PropertyListText.h"

#include <gtest/gtest.h>

#include "common/Description.h"

namespace halyard {
namespace {

Value parsed(std::string_view text) {
    const auto result = parsePropertyListText(text);
    const auto* const error = std::get_if<Error>(&result);
    EXPECT_EQ(error, nullptr) << error->message;
    return error == nullptr ? std::get<Value>(result) : Value();
}

std::string errorOf(std::string_view text) {
    const auto result = parsePropertyListText(text);
    const auto* const error = std::get_if<Error>(&result);
    return error != nullptr ? error->message : "none";
}

// The same value with every scalar as its text.
Value asTexts(const Value& value) {
    if (value.isList()) {
        List result;
        for (const Value& each : value.list()) {
            result.append(asTexts(each));
        }
        return result;
    }
    if (value.isDictionary()) {
        Dictionary result;
        for (const Dictionary::Entry& entry : value.dictionary()) {
            result.set(entry.key, asTexts(entry.value));
        }
        return result;
    }
    return describe(value);
}

void expectRoundTrip(const Value& value) {
    EXPECT_EQ(parsed(describe(value)), asTexts(value)) << describe(value);
}

TEST(PropertyListTextTest, DescribedContainersReadBackAsTexts) {
    expectRoundTrip(List());
    expectRoundTrip(Dictionary());
    expectRoundTrip(List{Value(1), Value(-2.5), Value(true), Value(Date{0, 0}), Value()});
    expectRoundTrip(Dictionary{{"b", List{Value("x"), List()}}, {"a", Dictionary{{"x", 0.5}}}});
    expectRoundTrip(Dictionary{{"", ""}, {"two words", "{;=(,)}<\"'>"}, {"a//b", "/* no */"}});
}

TEST(PropertyListTextTest, EveryByteReadsBack) {
    std::string ascii;
    for (int c = 0; c < 128; ++c) {
        ascii += static_cast<char>(c);
        expectRoundTrip(List{Value(std::string(1, static_cast<char>(c)))});
        expectRoundTrip(List{Value(std::string(1, static_cast<char>(c)) + "7")});
    }
    expectRoundTrip(List{Value(ascii), Value("\xC3\xA4\xE2\x82\xAC\xF0\x9F\x8E\xB5")});
    expectRoundTrip(List{Value("\xFF\x80 no UTF-8")});
}

TEST(PropertyListTextTest, TextsOutsideContainersReadAsTheyStand) {
    EXPECT_EQ(parsed("0x21040010"), Value("0x21040010"));
    EXPECT_EQ(parsed(" \"two words\" \n"), Value("two words"));
    EXPECT_EQ(parsed("<0fbd 77>"), Value("<0fbd 77>"));
}

TEST(PropertyListTextTest, HandWrittenFormsAreTaken) {
    EXPECT_EQ(parsed("// traces\n{ a = (1, 2,); /* more */ 'b c' = \"d\"; }"),
              Value(Dictionary{{"a", List{Value("1"), Value("2")}}, {"b c", "d"}}));
    EXPECT_EQ(parsed("(a/*b*/,c//d\n)"), Value(List{Value("a"), Value("c")}));
}

TEST(PropertyListTextTest, EscapesAreUnderstood) {
    EXPECT_EQ(parsed(R"("\a\b\f\n\r\t\v\"\'\\\q")"), Value("\a\b\f\n\r\t\v\"'\\q"));
    EXPECT_EQ(parsed(R"("\1013")"), Value("A3"));
    EXPECT_EQ(parsed(R"("\U00e4\u20AC\Ud83c\Udfb5")"),
              Value("\xC3\xA4\xE2\x82\xAC\xF0\x9F\x8E\xB5"));
    EXPECT_EQ(parsed(R"("\Ud83cx\Udfb5")"), Value("\xEF\xBF\xBDx\xEF\xBF\xBD"));
}

TEST(PropertyListTextTest, EscapedCodesOfEveryLengthAreUnderstood) {
    EXPECT_EQ(parsed(R"("\U007f\U0080\U07ff")"), Value("\x7F\xC2\x80\xDF\xBF"));
    EXPECT_EQ(parsed(R"("\U0800\uffff")"), Value("\xE0\xA0\x80\xEF\xBF\xBF"));
    EXPECT_EQ(parsed(R"("\Ud800\Udc00\Udbff\udfff")"), Value("\xF0\x90\x80\x80\xF4\x8F\xBF\xBF"));
    EXPECT_EQ(parsed(R"("\UABCDE")"), Value("\xEA\xAF\x8D"
                                            "E"));
    EXPECT_EQ(parsed(R"("\18\377\777\0")"), Value(std::string_view("\x01"
                                                                   "8\xC3\xBF\xC3\xBF\0",
                                                                   7)));
}

TEST(PropertyListTextTest, HalvesOfPairsAloneAreReplaced) {
    EXPECT_EQ(parsed(R"("\Ud83c\U0041")"), Value("\xEF\xBF\xBD"
                                                 "A"));
    EXPECT_EQ(parsed(R"("\Ud83c\Ue000")"), Value("\xEF\xBF\xBD\xEE\x80\x80"));
    EXPECT_EQ(parsed(R"("\Ud83c\n")"), Value("\xEF\xBF\xBD\n"));
    EXPECT_EQ(parsed(R"("\Udc00\Udfff")"), Value("\xEF\xBF\xBD\xEF\xBF\xBD"));
    EXPECT_EQ(parsed(R"("\Ud7ff")"), Value("\xED\x9F\xBF"));
}

TEST(PropertyListTextTest, BlanksOfEveryKindStandBetween) {
    EXPECT_EQ(parsed("\t\n\v\f\r (\t1\v,\f2\r)\n"), Value(List{Value("1"), Value("2")}));
    EXPECT_EQ(errorOf("(\x08)"), "line 1: a character that needs quotes");
    EXPECT_EQ(errorOf("(\x0E)"), "line 1: a character that needs quotes");
}

TEST(PropertyListTextTest, WhatPeopleLeaveUnquotedIsTaken) {
    const std::string plain = "_$.:-+*#@!?&%azAZ09/x";
    EXPECT_EQ(parsed(plain), Value(plain));
    for (const char* other : {"`", "{x", "[", "^", ";", ",", "=", "~", "|", ">"}) {
        EXPECT_NE(errorOf("(" + std::string(other) + ")"), "none") << other;
    }
}

TEST(PropertyListTextTest, DataIsHexadecimal) {
    EXPECT_EQ(parsed("<09afAF\t>"), Value("<09afAF\t>"));
    EXPECT_EQ(parsed("<>"), Value("<>"));
    for (const char* other : {"<0g>", "<0G>", "<0`>", "<0@>", "<0:>", "<0/>", "<0"}) {
        EXPECT_EQ(errorOf(other), "line 1: data that is not hexadecimal") << other;
    }
}

TEST(PropertyListTextTest, OfEqualKeysTheLastWins) {
    EXPECT_EQ(parsed("{ a = 1; a = 2; }"), Value(Dictionary{{"a", "2"}}));
}

TEST(PropertyListTextTest, MistakesAreNamedWithTheirLine) {
    EXPECT_EQ(errorOf(""), "line 1: the text is empty");
    EXPECT_EQ(errorOf(" // nothing\n"), "line 2: the text is empty");
    EXPECT_EQ(errorOf("{\n a = 1\n}"), "line 3: an entry without \";\"");
    EXPECT_EQ(errorOf("{ a 1; }"), "line 1: a key without \"=\"");
    EXPECT_EQ(errorOf("(a b)"), "line 1: a list without \")\"");
    EXPECT_EQ(errorOf("{ a = \n"), "line 2: the text ends too early");
    EXPECT_EQ(errorOf("{ a = ; }"), "line 1: a character that needs quotes");
    EXPECT_EQ(errorOf("\"a\\"), "line 1: a quoted string has no end");
    EXPECT_EQ(errorOf("\"a"), "line 1: a quoted string has no end");
    EXPECT_EQ(errorOf("\"\\Ux\""), "line 1: an escape without digits");
    EXPECT_EQ(errorOf("/* a"), "line 1: a comment has no end");
    EXPECT_EQ(errorOf("<xy>"), "line 1: data that is not hexadecimal");
    EXPECT_EQ(errorOf("a b"), "line 1: there is something after the value");
}

TEST(PropertyListTextTest, DepthIsBounded) {
    const auto nested = [](std::size_t levels) {
        return std::string(levels, '(') + "x" + std::string(levels, ')');
    };
    EXPECT_EQ(errorOf(nested(kMostPropertyListLevels - 1)), "none");
    EXPECT_EQ(errorOf(nested(kMostPropertyListLevels)), "line 1: too many levels");
    EXPECT_EQ(errorOf(std::string(1'000'000, '(')), "line 1: too many levels");
}

} // namespace
} // namespace halyard
