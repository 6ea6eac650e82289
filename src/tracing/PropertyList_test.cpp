#include "tracing/PropertyList.h"

#include <gtest/gtest.h>
#include <limits>

#include "common/Description.h"
#include "common/PropertyListText.h"

namespace halyard {
namespace {

constexpr const char* kBadBinary = "a binary property list that is damaged or too large";

std::string errorOf(std::string_view bytes) {
    const auto result = parsePropertyList(bytes);
    const auto* const error = std::get_if<Error>(&result);
    return error != nullptr ? error->message : "none";
}

Value parsedXml(const std::string& body) {
    const auto result =
        parsePropertyList("<?xml version=\"1.0\"?><plist version=\"1.0\">" + body + "</plist>");
    const auto* const error = std::get_if<Error>(&result);
    EXPECT_EQ(error, nullptr) << error->message;
    return error == nullptr ? std::get<Value>(result) : Value();
}

TEST(PropertyListTest, XmlScalarsKeepTheirKinds) {
    EXPECT_EQ(parsedXml("<string>a &amp; b</string>"), Value("a & b"));
    EXPECT_EQ(parsedXml("<string/>"), Value(""));
    EXPECT_EQ(parsedXml("<integer>100</integer>").kind(), Value::Kind::Int);
    EXPECT_EQ(parsedXml("<integer>-1</integer>"), Value(-1));
    EXPECT_EQ(parsedXml("<real>0.5</real>"), Value(0.5));
    EXPECT_EQ(parsedXml("<true/>"), Value(true));
    EXPECT_EQ(parsedXml("<true/>").kind(), Value::Kind::Bool);
    EXPECT_EQ(parsedXml("<false/>"), Value(false));
    EXPECT_EQ(describe(parsedXml("<date>2024-02-29T12:34:56Z</date>")),
              "2024-02-29 12:34:56 +0000");
    EXPECT_EQ(parsedXml("<date>2024-02-29T12:34:56Z</date>"), Value(Date{1'709'210'096, 0}));
    EXPECT_EQ(parsedXml("<data/>"), Value("<>"));
    EXPECT_EQ(parsedXml("<data>D713HCc1rg==</data>"), Value("<0fbd771c2735ae>"));
}

TEST(PropertyListTest, XmlContainersKeepTheirOrder) {
    const Value value = parsedXml("<dict><key>b</key><array><string>x</string></array>"
                                  "<key>a</key><dict/></dict>");
    EXPECT_EQ(value, Value(Dictionary{{"b", List{Value("x")}}, {"a", Dictionary()}}));
    EXPECT_EQ(value.dictionary().begin()->key, Value("b"));
}

TEST(PropertyListTest, WhatBeginsLikeXmlIsReadAsXml) {
    for (const char* const begin :
         {"", " \t\r\n", "<?xml version=\"1.0\"?>", "<!DOCTYPE plist>", "<!-- { -->"}) {
        const auto result = parsePropertyList(std::string(begin) + "<plist><true/></plist>");
        EXPECT_EQ(std::get_if<Error>(&result), nullptr) << begin;
    }
    for (const char* const damaged : {"<?xml", "<!DOCTYPE", "<plist", "<!--", "\xEF\xBB\xBF<"}) {
        EXPECT_EQ(errorOf(damaged), "a damaged XML property list") << damaged;
    }
}

TEST(PropertyListTest, AnythingElseIsTakenForText) {
    EXPECT_EQ(std::get<Value>(parsePropertyList("{ a = 1; }")), Value(Dictionary{{"a", "1"}}));
    EXPECT_EQ(errorOf(""), "line 1: the text is empty");
}

TEST(PropertyListTest, DamageIsTold) {
    EXPECT_EQ(errorOf("<plist><dict>"), "a damaged XML property list");
    EXPECT_EQ(errorOf("bplist00"), kBadBinary);
}

TEST(PropertyListTest, ReferencesOfArchivesAreNoValues) {
    std::string bytes = "bplist00\x80\x01"; // object 0, at 8
    bytes += '\x08';                        // the table of objects, at 10
    std::string trailer(32, '\0');
    trailer[6] = trailer[7] = trailer[15] = 1; // bytes of an offset, of a number; objects
    trailer[31] = 10;
    EXPECT_EQ(errorOf(bytes + trailer), "a value of unknown type");
}

TEST(PropertyListTest, ErrorsSayWhoseTheyAre) {
    for (const char* const bytes : {"<plist><dict>", "bplist00"}) {
        const auto result = parsePropertyList(bytes);
        const auto& error = std::get<Error>(result);
        EXPECT_EQ(error.domain, kPropertyListErrorDomain);
        EXPECT_EQ(error.code, 1);
    }
}

TEST(PropertyListTest, DepthAndSizeAreBounded) {
    std::string deep = "<plist>";
    for (int i = 0; i <= kMostPropertyListLevels; ++i) {
        deep += "<array>";
    }
    EXPECT_EQ(errorOf(deep), "too many levels");
    EXPECT_EQ(errorOf(std::string(kMostPropertyListBytes, ' ')), "line 1: the text is empty");
    EXPECT_EQ(errorOf(std::string(kMostPropertyListBytes + 1, ' ')), "too large");
}

// `pairs` times a list in a dictionary.
std::string nested(int pairs) {
    std::string begin = "<plist>";
    std::string end;
    for (int i = 0; i < pairs; ++i) {
        begin += "<dict><key>k</key><array>";
        end += "</array></dict>";
    }
    return begin + end + "</plist>";
}

TEST(PropertyListTest, AsManyLevelsAsThereMayBeAreRead) {
    static_assert(kMostPropertyListLevels % 2 == 0);
    EXPECT_EQ(errorOf(nested(kMostPropertyListLevels / 2)), "none");
    EXPECT_EQ(errorOf(nested(kMostPropertyListLevels / 2 + 1)), "too many levels");
}

TEST(PropertyListTest, OnlyWhatIsOpenCountsAsALevel) {
    std::string siblings;
    for (int i = 0; i <= kMostPropertyListLevels; ++i) {
        siblings += "<array></array><dict></dict><array/><dict />";
    }
    EXPECT_EQ(parsedXml("<array>" + siblings + "</array>").list().size(),
              4U * (kMostPropertyListLevels + 1));
}

TEST(PropertyListTest, ListsAndDictionariesOfXmlAreBounded) {
    std::string most;
    for (int i = 0; i < 9'999; ++i) {
        most += "<array></array>";
    }
    EXPECT_EQ(errorOf("<plist><array>" + most + "</array></plist>"), "none");
    EXPECT_EQ(errorOf("<plist><array><dict></dict>" + most + "</array></plist>"),
              "too many lists and dictionaries");
}

// What looks like an end may be none.
TEST(PropertyListTest, LevelsThatAreHiddenAreBoundedToo) {
    for (const char* const level : {"<array </array>", "<array><!-- </array> -->"}) {
        std::string text = "<plist>";
        while (text.size() < kMostPropertyListBytes - 100) {
            text += level;
        }
        EXPECT_EQ(errorOf(text), "too many lists and dictionaries") << level;
    }
}
} // namespace
} // namespace halyard
