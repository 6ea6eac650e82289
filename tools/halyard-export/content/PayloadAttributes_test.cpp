#include <gtest/gtest.h>
#include <string>
#include <vector>

#include "content/PayloadAttributes.h"

namespace halyard::exporting {
namespace {

constexpr otlp::Tag kTag = 6;
constexpr std::uint64_t kKind = 1;

const std::vector<std::string> kTexts = {
    "",
    "{}",
    "7",
    "[1]",
    R"({"a":1})",
    R"({"a":-0,"b":0.5,"c":1e3,"d":-12E-2,"e":18446744073709551615})",
    R"({"a":01})",
    R"({"a":1.})",
    R"({"a":-})",
    R"({"a":+1})",
    R"({"a":.5})",
    R"({"a":1e})",
    R"({"a":1e999})",
    R"({"a":0e999,"b":1})",
    R"({"a":0E+309,"b":1e-5})",
    R"({"a":"x","b":"y","c":"x"})",
    R"({"a":"x","c":"z"})",
    R"({"b":"x","a":"y"})",
    R"({"a":"x\"y","\u0061":"\u00e9"})",
    "{\"a\":\"\xc3\",\"b\":[\"\xff\"],\"c\xc3\":1}",
    "{\"a\":\"x\ty\"}",
    R"({"a":true,"b":null,"c":false})",
    R"({"a":false,"b":true,"c":null})",
    R"({"a":truth})",
    R"({"a":["x",1],"b":{"k":"v","secret":1},"c":[]})",
    R"({"a":["x",2],"b":{"k":"v","secret":2},"c":[[]]})",
    R"({"a":["x",1,"b":2]})",
    R"({"a":[1})",
    R"({"a":"x","a":"x"})",
    R"({"a":"x"}})",
    R"({"a":"x"} )",
    R"({ "a" : "x" })",
    R"({"a":"x",})",
    R"({"a":"x)",
    R"({"a":"x")",
    R"({"a":"x"1)",
    R"({"a":12,"b":"x"})",
    R"({"a":123,"b":"xy"})",
    R"({"secret":"x","passed":"y","b":"z"})",
    R"({"secret":true,"passed":[1],"b":"z"})",
    R"({"secret":1e999,"passed":"y"})",
    R"({"a":"said by player","player":1})",
    R"({"a":"x","HY_Session_Summary_Event":"1","b":"secret = 1"})",
    R"({"HY_Session_Summary_Event":"1","b":"secret = 1"})",
    R"({"HY_Session_Summary_Events":"1","b":"secret = 1"})",
};

bool passes(std::string_view key) {
    return key == "passed";
}

// What is remembered of others must change nothing.
class PayloadAttributesTest : public ::testing::Test {
protected:
    std::string bytesOf(PayloadAttributes& payload, const std::string& json, bool isOfKind) {
        AttributeBytes bytes;
        isOfKind ? payload.addOfKind(bytes, kTag, kKind, json, passes)
                 : payload.add(bytes, kTag, json, passes);
        return bytes.texts + "|" + bytes.numbers;
    }
    std::string alone(const std::string& json) {
        PayloadAttributes fresh(omission_);
        fresh.setNames(names_);
        return bytesOf(fresh, json, false);
    }

    Omission omission_{{"secret", "application"}};
    std::vector<std::string> names_;
};

TEST_F(PayloadAttributesTest, AMessageIsTheSameWhateverWasBefore) {
    for (const std::string& before : kTexts) {
        for (const std::string& json : kTexts) {
            PayloadAttributes payload(omission_);
            (void)bytesOf(payload, before, true);
            EXPECT_EQ(bytesOf(payload, json, true), alone(json)) << before << " then " << json;
            EXPECT_EQ(bytesOf(payload, json, true), alone(json)) << json << " twice";
        }
    }
}

TEST_F(PayloadAttributesTest, AMessageThatIsBrokenAnywhereIsTheSameWhateverWasBefore) {
    PayloadAttributes payload(omission_);
    const std::string whole =
        R"({"v":0.94,"on":1,"p":"radio","d":["out"],"ev":{"s":"S","secret":2},"t":1.5e9})";
    for (std::size_t at = 0; at < whole.size(); ++at) {
        for (const char c : std::string("\"\\{}[],:019.-eEx\x01\xff \0", 20)) {
            std::string broken = whole;
            broken[at] = c;
            EXPECT_EQ(bytesOf(payload, broken, true), alone(broken)) << broken;
        }
        EXPECT_EQ(bytesOf(payload, whole.substr(0, at), true), alone(whole.substr(0, at)));
        EXPECT_EQ(bytesOf(payload, whole, true), alone(whole));
    }
}

TEST_F(PayloadAttributesTest, OnlyInASummaryATextIsLookedThroughForKeys) {
    const std::string text = R"("b":"secret = 1"})";
    const auto leaves = [&](const std::string& begin) {
        return alone(begin + text).find("secret = 1") != std::string::npos;
    };
    EXPECT_FALSE(leaves(R"({"HY_Session_Summary_Event":"1",)"));
    EXPECT_FALSE(leaves(R"({"a":1,"HY_Session_Summary_Event":"1",)"));
    EXPECT_TRUE(leaves(R"({"HY_Session_Summary_Events":"1",)"));
    EXPECT_TRUE(leaves(R"({"a":{"HY_Session_Summary_Event":"1"},)"));
}

TEST_F(PayloadAttributesTest, AnotherApplicationsNameIsAnotherMatter) {
    const std::string json = R"({"a":"said by player","player":1,"radio":"x"})";
    PayloadAttributes payload(omission_);
    for (const char* const name : {"nobody", "player", "radio", "player"}) {
        names_ = {name};
        payload.setNames(names_);
        EXPECT_EQ(bytesOf(payload, json, true), alone(json)) << name;
    }
}

TEST_F(PayloadAttributesTest, WhatIsRememberedIsBounded) {
    PayloadAttributes payload(omission_);
    for (std::uint64_t kind = 0; kind < 100; ++kind) {
        std::string before = "{";
        for (int at = 0; at < 50; ++at) {
            AttributeBytes bytes;
            payload.addOfKind(bytes, kTag, kind,
                              before + "\"x\":\"" + std::string(3000, 'x') + "\"}");
            before += "\"k\":1,";
            ASSERT_LE(payload.rememberedBytes(), PayloadAttributes::kMostRemembered);
        }
    }
}

TEST_F(PayloadAttributesTest, AnyNumberOfKindsIsTheSame) {
    const std::string json = R"({"a":"x","b":1,"c":["y"]})";
    PayloadAttributes payload(omission_);
    for (std::uint64_t kind = 0; kind < 1000; ++kind) {
        AttributeBytes bytes;
        payload.addOfKind(bytes, kTag, kind, json);
        EXPECT_EQ(bytes.texts + "|" + bytes.numbers, alone(json));
    }
}

} // namespace
} // namespace halyard::exporting
