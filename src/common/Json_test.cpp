#include "common/Json.h"

#include <gtest/gtest.h>
#include <limits>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "common/ValueArena.h"

namespace halyard {
namespace {

TEST(JsonTest, ScalarsTakeTheirJsonForm) {
    EXPECT_EQ(toJson(Value()), "null");
    EXPECT_EQ(toJson(true), "true");
    EXPECT_EQ(toJson(false), "false");
    EXPECT_EQ(toJson(-1), "-1");
    EXPECT_EQ(toJson("text"), "\"text\"");
}

TEST(JsonTest, IntegersStayExact) {
    EXPECT_EQ(toJson(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
    EXPECT_EQ(toJson(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
}

TEST(JsonTest, RealsTakeTheShortestFormThatReadsBack) {
    EXPECT_EQ(toJson(0.1), "0.1");
    EXPECT_EQ(toJson(0.1f), "0.1");
    EXPECT_EQ(toJson(1e300), "1e+300");
    EXPECT_EQ(toJson(5e-324), "5e-324");
    EXPECT_EQ(toJson(2.0), "2");
}

TEST(JsonTest, WhatJsonCannotWriteBecomesText) {
    EXPECT_EQ(toJson(std::numeric_limits<double>::quiet_NaN()), "\"NaN\"");
    EXPECT_EQ(toJson(std::numeric_limits<double>::infinity()), "\"Infinity\"");
    EXPECT_EQ(toJson(-std::numeric_limits<float>::infinity()), "\"-Infinity\"");
    EXPECT_EQ(toJson(Date{0, 500'000'000}), "\"1970-01-01T00:00:00.5Z\"");
}

TEST(JsonTest, TextIsEscapedAndRepaired) {
    EXPECT_EQ(toJson("\"\\\n\x01"), "\"\\\"\\\\\\n\\u0001\"");
    EXPECT_EQ(toJson(std::string_view("\0", 1)), "\"\\u0000\"");
    EXPECT_EQ(toJson("\xC3\xA4\xFF"), "\"\xC3\xA4\xEF\xBF\xBD\"");
    EXPECT_EQ(toJson(Dictionary{{"\xFF", 1}}), "{\"\xEF\xBF\xBD\":1}");
}

TEST(JsonTest, EveryByteIsEscapedWhereverItStands) {
    const std::string plain(17, 'x');
    for (std::size_t at = 0; at < plain.size(); ++at) {
        for (int byte = 0; byte < 0x80; ++byte) {
            std::string text = plain;
            text[at] = static_cast<char>(byte);
            rapidjson::StringBuffer expected;
            rapidjson::Writer<rapidjson::StringBuffer>(expected).String(
                text.data(), static_cast<rapidjson::SizeType>(text.size()));
            ASSERT_EQ(toJson(text), expected.GetString()) << byte << " at " << at;
        }
    }
}

TEST(JsonTest, LongTextsAreWhole) {
    const std::string text(100'000, 'x');
    EXPECT_EQ(toJson(List{Value(text), Value("\n" + text)}),
              "[\"" + text + "\",\"\\n" + text + "\"]");
}

TEST(JsonTest, ContainersKeepTheirOrder) {
    const Dictionary dictionary{{"b", List{Value(1), Value(), Value("x")}}, {"a", Dictionary()}};
    EXPECT_EQ(toJson(dictionary), "{\"b\":[1,null,\"x\"],\"a\":{}}");
    EXPECT_EQ(toJson(List()), "[]");
}

TEST(JsonTest, PrettyFormIndentsByTwo) {
    EXPECT_EQ(toPrettyJson(Dictionary{{"a", List{Value(1)}}}), "{\n  \"a\": [\n    1\n  ]\n}");
}

TEST(JsonTest, ThePrettyFormDiffersInItsBlanksOnly) {
    const double infinity = std::numeric_limits<double>::infinity();
    const Value everything = Dictionary{
        {"none", List{Value()}},
        {"bools", List{true, false}},
        {"integers", List{-1, std::numeric_limits<std::uint64_t>::max()}},
        {"reals", List{0.1f, 1e300, 2.0, std::numeric_limits<double>::quiet_NaN()}},
        {"infinities", List{infinity, -infinity, std::numeric_limits<float>::infinity()}},
        {"texts", List{"", "\"\\\n\x01", "\xC3\xA4\xFF"}},
        {"date", Date{0, 500'000'000}},
        {"\xFF", Dictionary{{"empty", Dictionary()}, {"list", List()}}}};
    std::string pretty = toPrettyJson(everything);
    std::erase_if(pretty, [](char c) { return c == ' ' || c == '\n'; });
    EXPECT_EQ(pretty, toJson(everything));
}

TEST(JsonTest, OneWriterWritesManyValues) {
    JsonWriter writer;
    EXPECT_EQ(writer.write(Dictionary{{"a", 1}}), "{\"a\":1}");
    EXPECT_EQ(writer.write(List{Value(2)}), "[2]");
    EXPECT_EQ(writer.write(Dictionary{{"b", 3}}), "{\"b\":3}");
}

TEST(JsonTest, AWriterLetsGoOfTheRoomOfALongText) {
    JsonWriter writer;
    (void)writer.write(Value(std::string(40'000, 'x')));
    writer.shrink();
    const std::size_t usual = writer.capacity();
    EXPECT_GE(usual, 40'000U) << "room for what comes every day stays";
    (void)writer.write(Value(std::string(1'000'000, 'x')));
    writer.shrink();
    EXPECT_LT(writer.capacity(), usual);
    EXPECT_EQ(writer.write(Value("short")), "\"short\"");
}

Dictionary withTop(Dictionary message, const Dictionary::Entry& top) {
    message.set(top.key, top.value);
    return message;
}

TEST(JsonTest, AnEntryOnTopIsWrittenAsIfItHadBeenSet) {
    const Dictionary message{{"a", 1}, {"b", List{}}};
    JsonWriter writer;
    for (const Dictionary::Entry& top :
         {Dictionary::Entry{"a", "x"}, {"b", 2}, {"c", 3}, {"a", Value()}, {"c", Value()}}) {
        EXPECT_EQ(writer.write(message, top), toJson(withTop(message, top)));
    }
    EXPECT_EQ(writer.write({}, {"a", Value()}), "{}");
}

// As a message is decoded: with room for one entry behind it.
Dictionary decoded(const Dictionary& message) {
    ValueArena arena(message.size() + 1, ValueArena::Size());
    for (const auto& [key, value] : message) {
        arena.root().add(key, value);
    }
    return arena.finish();
}

TEST(JsonTest, TextsOfOneMessageAreThoseOfEachByItself) {
    const Dictionary message = decoded({{"a", 1}, {"b", "text"}, {"c", true}});
    Dictionary tagged = message;
    tagged.set("tag", "x");
    JsonWriter writer;
    for (int i = 0; i < 2; ++i) {
        for (const Dictionary::Entry& top :
             {Dictionary::Entry{"d", "y"}, {"a", 2}, {"tag", 3}, {"a", Value()}, {"d", Value()}}) {
            EXPECT_EQ(writer.writeShared(message, top), toJson(withTop(message, top)));
            EXPECT_EQ(writer.writeShared(tagged, top), toJson(withTop(tagged, top)));
        }
        EXPECT_EQ(writer.writeShared(tagged), toJson(tagged));
        EXPECT_EQ(writer.writeShared(message), toJson(message));
        EXPECT_EQ(writer.writeShared(Dictionary{{"e", 1}}), "{\"e\":1}");
        writer.forget();
    }
}

TEST(JsonTest, TheSharedTextOfAMessageIsWrittenOnce) {
    const Dictionary message = decoded({{"a", 1}});
    const Dictionary other = message;
    JsonWriter writer;
    EXPECT_EQ(writer.writeShared(message), "{\"a\":1}");
    const_cast<Dictionary::Entry*>(other.begin())->value = 2; // Nobody else may.
    EXPECT_EQ(writer.writeShared(other, {"b", 3}), "{\"a\":1,\"b\":3}");
    writer.forget();
    EXPECT_EQ(writer.writeShared(other), "{\"a\":2}");
}

TEST(JsonTest, LongTextsGrowWithoutLosingAnything) {
    List list;
    std::string expected = "[";
    for (std::size_t length = 0; length < 3000; length += 7) {
        list.append(std::string(length, 'x') + "\n");
        expected += (length > 0 ? ",\"" : "\"") + std::string(length, 'x') + "\\n\"";
    }
    EXPECT_EQ(toJson(list), expected + "]");
}

} // namespace
} // namespace halyard
