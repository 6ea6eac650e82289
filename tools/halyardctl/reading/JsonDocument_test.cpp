#include <cmath>

#include <gtest/gtest.h>

#include "reading/JsonDocument.h"

namespace halyard::reading {
namespace {

class JsonDocumentTest : public testing::Test {
protected:
    // The one item of a list.
    const rapidjson::Value& item(const std::string& text) {
        const bool isGood = parseJson("[" + text + "]", Encoding::Any, document_);
        EXPECT_TRUE(isGood) << text;
        return isGood ? document_[0] : null_;
    }
    bool isJson(std::string_view text, Encoding encoding = Encoding::Any) {
        return parseJson(text, encoding, document_);
    }

    rapidjson::Document document_;
    rapidjson::Value null_;
};

TEST_F(JsonDocumentTest, RealNumbersAreExact) {
    EXPECT_EQ(item("0.1").GetDouble(), 0.1);
    EXPECT_EQ(item("1795314018.168").GetDouble(), 1795314018.168);
    EXPECT_EQ(item("2.2250738585072011e-308").GetDouble(), 2.2250738585072011e-308);
    EXPECT_TRUE(item("1e3").IsDouble());
}

TEST_F(JsonDocumentTest, AZeroWithAnyExponentIsZero) {
    EXPECT_EQ(item("0e-88").GetDouble(), 0);
    EXPECT_EQ(item("0E+99").GetDouble(), 0);
    EXPECT_TRUE(std::signbit(item("-0").GetDouble()));
}

TEST_F(JsonDocumentTest, IntegersKeepAllTheirBits) {
    EXPECT_EQ(item("-9223372036854775808").GetInt64(), INT64_MIN);
    EXPECT_EQ(item("18446744073709551615").GetUint64(), UINT64_MAX);
    EXPECT_EQ(item("0").GetInt64(), 0);
    EXPECT_EQ(item("18446744073709551616").GetDouble(), 18446744073709551616.0);
}

TEST_F(JsonDocumentTest, ANumberThatNothingHoldsIsNoJson) {
    EXPECT_FALSE(isJson("[1e999]"));
    EXPECT_FALSE(isJson("[1e-999]"));
    EXPECT_TRUE(document_.IsNull());
}

TEST_F(JsonDocumentTest, OtherValuesComeAsTheyAre) {
    ASSERT_TRUE(isJson(R"({"a":[true,null,"x\u00e9"],"b":{}})"));
    EXPECT_TRUE(document_["a"][0].GetBool());
    EXPECT_TRUE(document_["a"][1].IsNull());
    EXPECT_STREQ(document_["a"][2].GetString(), "x\xc3\xa9");
    EXPECT_TRUE(document_["b"].ObjectEmpty());
}

TEST_F(JsonDocumentTest, WhatFollowsTheValueIsNoJson) {
    EXPECT_FALSE(isJson("{} {}"));
    EXPECT_FALSE(isJson(""));
    EXPECT_FALSE(isJson("{\"a\":"));
}

TEST_F(JsonDocumentTest, TheEncodingIsCheckedWhereAsked) {
    EXPECT_TRUE(isJson("[\"\xff\"]"));
    EXPECT_FALSE(isJson("[\"\xff\"]", Encoding::Checked));
}

TEST_F(JsonDocumentTest, DepthTakesNoStack) {
    const std::string deep(1'000'000, '[');
    EXPECT_TRUE(isJson(deep + std::string(deep.size(), ']')));
}

} // namespace
} // namespace halyard::reading
