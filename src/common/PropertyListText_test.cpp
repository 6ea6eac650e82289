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
