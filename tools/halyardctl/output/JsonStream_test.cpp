#include "output/JsonStream.h"

#include <array>
#include <cstdio>
#include <functional>
#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

std::string written(const std::function<void(JsonStream&)>& write) {
    std::FILE* const file = std::tmpfile();
    JsonStream json(file);
    write(json);
    std::fflush(file);
    std::rewind(file);
    std::string text;
    std::array<char, 4096> buffer{};
    while (const std::size_t count = std::fread(buffer.data(), 1, buffer.size(), file)) {
        text.append(buffer.data(), count);
    }
    std::fclose(file);
    return text;
}

std::string passedOn(std::string_view text) {
    return written([&](JsonStream& json) {
        json.beginDocument();
        json.json(text);
    });
}

TEST(JsonStreamTest, AListHasAnElementALine) {
    EXPECT_EQ(written([](JsonStream& json) {
                  json.beginList();
                  for (int i = 0; i < 2; ++i) {
                      json.beginElement();
                      json.beginObject();
                      json.countField("n", 1);
                      json.endObject();
                  }
                  json.endList();
              }),
              "[\n{\"n\":1},\n{\"n\":1}\n]\n");
}

TEST(JsonStreamTest, AnEmptyListIsOne) {
    EXPECT_EQ(written([](JsonStream& json) {
                  json.beginList();
                  json.endList();
              }),
              "[\n]\n");
}

TEST(JsonStreamTest, JsonPassesThroughDigitForDigit) {
    EXPECT_EQ(
        passedOn(" {\"a\" : [1.10, 18446744073709551615, -0, 1e40, true, null, \"\\u00e4\"]}"),
        "{\"a\":[1.10,18446744073709551615,-0,1e40,true,null,\"ä\"]}");
}

TEST(JsonStreamTest, WhatIsNoJsonIsNull) {
    for (const std::string_view text : {"", "{", "{}x", "nul", "{\"a\":\"\xFF\"}", "\"\\ud800\""}) {
        EXPECT_EQ(passedOn(text), "null") << text;
    }
}

TEST(JsonStreamTest, DepthCostsNoStack) {
    const std::string deep = std::string(500'000, '[') + std::string(500'000, ']');
    EXPECT_EQ(passedOn(deep), deep);
}

TEST(JsonStreamTest, NothingThatATerminalActsUponIsInATextOrAKey) {
    EXPECT_EQ(passedOn("{\"\\u001b[2J\\u009b\":\"\\u202e\\n\\u007f\"}"),
              "{\"\\u001b[2J\\u009b\":\"\\u202e\\n\\u007f\"}");
    EXPECT_EQ(written([](JsonStream& json) { json.text("\x1b\"\\\u2066\U000E0001"); }),
              "\"\\u001b\\\"\\\\\\u2066\\udb40\\udc01\"");
    EXPECT_EQ(written([](JsonStream& json) { json.text("\xC3"); }), "\"\xEF\xBF\xBD\"");
}

TEST(JsonStreamTest, NoNumberIsNull) {
    EXPECT_EQ(written([](JsonStream& json) {
                  json.beginArray();
                  json.real(0.0 / 0.0);
                  json.real(1.0 / 0.0);
                  json.real(0.1);
                  json.endArray();
              }),
              "[null,null,0.1]");
}

} // namespace
} // namespace halyard::ctl
