#include "common/Description.h"

#include <gtest/gtest.h>
#include <limits>

namespace halyard {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

TEST(DescriptionTest, ScalarsReadAsThemselves) {
    EXPECT_EQ(describe(Value()), "(null)");
    EXPECT_EQ(describe(Value("a \"text\"\n")), "a \"text\"\n");
    EXPECT_EQ(describe(Value(true)), "1");
    EXPECT_EQ(describe(Value(false)), "0");
    EXPECT_EQ(describe(Value(-42)), "-42");
    EXPECT_EQ(describe(Value(std::numeric_limits<std::int64_t>::min())), "-9223372036854775808");
    EXPECT_EQ(describe(Value(std::numeric_limits<std::uint64_t>::max())), "18446744073709551615");
}

TEST(DescriptionTest, RealsTakeTheShortestFormThatReadsBack) {
    EXPECT_EQ(describe(Value(0.1)), "0.1");
    EXPECT_EQ(describe(Value(0.1f)), "0.1");
    EXPECT_EQ(describe(Value(static_cast<double>(0.1f))), "0.10000000149011612");
    EXPECT_EQ(describe(Value(2.0)), "2");
    EXPECT_EQ(describe(Value(1e300)), "1e+300");
    EXPECT_EQ(describe(Value(-0.0)), "-0");
    EXPECT_EQ(describe(Value(kInfinity)), "inf");
    EXPECT_EQ(describe(Value(-kInfinity)), "-inf");
    EXPECT_EQ(describe(Value(std::numeric_limits<double>::quiet_NaN())), "nan");
}

TEST(DescriptionTest, DatesReadInUtc) {
    EXPECT_EQ(describe(Date{0, 0}), "1970-01-01 00:00:00 +0000");
    EXPECT_EQ(describe(Date{1'709'210'096, 999'999'999}), "2024-02-29 12:34:56 +0000");
    EXPECT_EQ(describe(Date{-1, 0}), "1969-12-31 23:59:59 +0000");
}

TEST(DescriptionTest, DatesBeyondFourDigitYearsStopAtTheEdge) {
    constexpr auto kMin = std::numeric_limits<std::int64_t>::min();
    constexpr auto kMax = std::numeric_limits<std::int64_t>::max();
    EXPECT_EQ(describe(Date{kMin, 0}), "0000-01-01 00:00:00 +0000");
    EXPECT_EQ(describe(Date{kMax, 0}), "9999-12-31 23:59:59 +0000");
    EXPECT_EQ(rfc3339(Date{253'402'300'799, 0}), "9999-12-31T23:59:59Z");
    EXPECT_EQ(rfc3339(Date{kMax, 0}), "9999-12-31T23:59:59Z");
}

TEST(DescriptionTest, Rfc3339KeepsTheFractionWithoutTrailingZeros) {
    EXPECT_EQ(rfc3339(Date{0, 0}), "1970-01-01T00:00:00Z");
    EXPECT_EQ(rfc3339(Date{0, 500'000'000}), "1970-01-01T00:00:00.5Z");
    EXPECT_EQ(rfc3339(Date{0, 1}), "1970-01-01T00:00:00.000000001Z");
}

TEST(DescriptionTest, ListsAndDictionariesReadAsAPropertyList) {
    EXPECT_EQ(describe(List{Value(1), Value("b")}), "(\n    1,\n    b\n)");
    EXPECT_EQ(describe(Dictionary{{"key", "value"}}), "{\n    key = value;\n}");
    EXPECT_EQ(describe(List()), "(\n)");
    EXPECT_EQ(describe(Dictionary()), "{\n}");
}

TEST(DescriptionTest, KeysAreSortedAndContentsIndented) {
    const Dictionary dictionary{{"b", List{Value(1)}}, {"a", Dictionary{{"x", 0.5}}}};
    EXPECT_EQ(describe(dictionary), "{\n"
                                    "    a = {\n"
                                    "        x = 0.5;\n"
                                    "    };\n"
                                    "    b = (\n"
                                    "        1\n"
                                    "    );\n"
                                    "}");
}

std::string describeInList(std::string_view text) {
    const std::string whole = describe(List{Value(text)});
    return whole.substr(6, whole.size() - 8);
}

TEST(DescriptionTest, ContainedTextIsQuotedWhereItMustBe) {
    EXPECT_EQ(describeInList("plain_$.:/-09"), "plain_$.:/-09");
    EXPECT_EQ(describeInList(""), "\"\"");
    EXPECT_EQ(describeInList("two words"), "\"two words\"");
    EXPECT_EQ(describeInList("a//b"), "\"a//b\""); // Would begin a comment.
    EXPECT_EQ(describeInList("a=b;"), "\"a=b;\"");
    EXPECT_EQ(describeInList("\xC3\xA4"), "\"\xC3\xA4\"");
}

TEST(DescriptionTest, OnlyTheseCharactersStandWithoutQuotes) {
    const std::string_view plain = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789"
                                   "_$.:-/";
    for (int byte = 0; byte < 256; ++byte) {
        const char c = static_cast<char>(byte);
        const bool quoted = describeInList(std::string(1, c)).starts_with('"');
        EXPECT_EQ(quoted, plain.find(c) == std::string_view::npos) << byte;
    }
    EXPECT_EQ(describeInList("/a/"), "/a/");
    EXPECT_EQ(describeInList("//"), "\"//\"");
}

TEST(DescriptionTest, ContainedNumbersAreQuotedWhereTheyMustBe) {
    EXPECT_EQ(describe(List{Value(-1), Value(true), Value(-0.5), Value(1e300)}),
              "(\n    -1,\n    1,\n    -0.5,\n    \"1e+300\"\n)");
}

TEST(DescriptionTest, KeysOfLargeDictionariesAreSortedToo) {
    for (const int size : {16, 17, 40}) {
        Dictionary dictionary;
        std::string expected = "{\n";
        for (int i = 0; i < size; ++i) {
            dictionary.set("key" + std::to_string(99 - i), i);
            expected += "    key" + std::to_string(100 - size + i) + " = " +
                        std::to_string(size - 1 - i) + ";\n";
        }
        EXPECT_EQ(describe(dictionary), expected + "}");
    }
}

TEST(DescriptionTest, ContainedTextIsEscaped) {
    EXPECT_EQ(describeInList("\"\\\n\r\t"), "\"\\\"\\\\\\n\\r\\t\"");
    EXPECT_EQ(describeInList(std::string_view("\0\x1F\x7F"
                                              "1",
                                              4)),
              "\"\\000\\037\\1771\"");
}

TEST(DescriptionTest, ContainedDatesAreQuoted) {
    EXPECT_EQ(describe(List{Value(Date{0, 0})}), "(\n    \"1970-01-01 00:00:00 +0000\"\n)");
}

TEST(DescriptionTest, ALongTextIsCutBetweenCharacters) {
    EXPECT_EQ(shortened("four", 4), "four");
    EXPECT_EQ(shortened("fiver", 4), "five... (1 bytes more)");
    EXPECT_EQ(shortened("abc\xC3\xA9", 4), "abc... (2 bytes more)");
    EXPECT_EQ(shortened(std::string(3, '\x80'), 2), "... (3 bytes more)");
}

} // namespace
} // namespace halyard
