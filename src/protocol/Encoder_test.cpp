#include <gtest/gtest.h>
#include <limits>

#include "protocol/Wire.h"
#include "protocol/WireTestSupport.h"

namespace halyard::protocol {
namespace {

std::string encoded(const Value& value) {
    std::string out;
    appendValue(out, value);
    return out;
}

std::string head(const Value& value, std::size_t length) {
    return encoded(value).substr(0, length);
}

TEST(EncoderTest, WritesIntegersInTheirSmallestForm) {
    const std::vector<std::pair<Value, std::string>> cases = {
        {0, raw({0x00})},
        {127, raw({0x7F})},
        {128, raw({0xCC, 0x80})},
        {255, raw({0xCC, 0xFF})},
        {256, raw({0xCD, 1, 0})},
        {65535, raw({0xCD, 0xFF, 0xFF})},
        {65536, raw({0xCE, 0, 1, 0, 0})},
        {4294967295U, raw({0xCE, 0xFF, 0xFF, 0xFF, 0xFF})},
        {4294967296U, raw({0xCF, 0, 0, 0, 1, 0, 0, 0, 0})},
        {UINT64_MAX, raw({0xCF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF})},
        {-1, raw({0xFF})},
        {-32, raw({0xE0})},
        {-33, raw({0xD0, 0xDF})},
        {-128, raw({0xD0, 0x80})},
        {-129, raw({0xD1, 0xFF, 0x7F})},
        {-32768, raw({0xD1, 0x80, 0})},
        {-32769, raw({0xD2, 0xFF, 0xFF, 0x7F, 0xFF})},
        {std::int64_t{INT32_MIN}, raw({0xD2, 0x80, 0, 0, 0})},
        {std::int64_t{INT32_MIN} - 1, raw({0xD3, 0xFF, 0xFF, 0xFF, 0xFF, 0x7F, 0xFF, 0xFF, 0xFF})},
        {INT64_MIN, raw({0xD3, 0x80, 0, 0, 0, 0, 0, 0, 0})},
    };
    for (const auto& [value, bytes] : cases) {
        EXPECT_EQ(encoded(value), bytes) << value.integerValue();
    }
}

TEST(EncoderTest, KeepsTheKindOfReals) {
    EXPECT_EQ(encoded(1.0), raw({0xCB, 0x3F, 0xF0, 0, 0, 0, 0, 0, 0}));
    EXPECT_EQ(encoded(48000.0), raw({0xCB, 0x40, 0xE7, 0x70, 0, 0, 0, 0, 0}));
    EXPECT_EQ(encoded(1.0F), raw({0xCA, 0x3F, 0x80, 0, 0}));
    EXPECT_EQ(encoded(std::numeric_limits<double>::infinity()),
              raw({0xCB, 0x7F, 0xF0, 0, 0, 0, 0, 0, 0}));
}

TEST(EncoderTest, WritesTheOneByteValues) {
    EXPECT_EQ(encoded(Value()), raw({0xC0}));
    EXPECT_EQ(encoded(false), raw({0xC2}));
    EXPECT_EQ(encoded(true), raw({0xC3}));
    EXPECT_EQ(encoded(List()), raw({0x90}));
    EXPECT_EQ(encoded(Dictionary()), raw({0x80}));
    EXPECT_EQ(encoded(""), raw({0xA0}));
}

TEST(EncoderTest, WritesTextInItsSmallestForm) {
    const auto text = [](std::size_t size) { return Value(std::string(size, 'x')); };
    EXPECT_EQ(head(text(31), 2), raw({0xBF, 'x'}));
    EXPECT_EQ(head(text(32), 3), raw({0xD9, 32, 'x'}));
    EXPECT_EQ(head(text(255), 3), raw({0xD9, 255, 'x'}));
    EXPECT_EQ(head(text(256), 4), raw({0xDA, 1, 0, 'x'}));
    EXPECT_EQ(head(text(65535), 4), raw({0xDA, 0xFF, 0xFF, 'x'}));
    EXPECT_EQ(head(text(65536), 6), raw({0xDB, 0, 1, 0, 0, 'x'}));
    EXPECT_EQ(encoded(text(65536)).size(), 65541U);
}

TEST(EncoderTest, WritesIllFormedTextAsTextToo) {
    EXPECT_EQ(encoded(std::string_view("\xFF\0", 2)), raw({0xA2, 0xFF, 0}));
}

TEST(EncoderTest, WritesListsInTheirSmallestForm) {
    const auto list = [](std::size_t size) {
        return Value(List(std::vector<Value>(size, Value())));
    };
    EXPECT_EQ(head(list(15), 2), raw({0x9F, 0xC0}));
    EXPECT_EQ(head(list(16), 4), raw({0xDC, 0, 16, 0xC0}));
    EXPECT_EQ(head(list(65535), 4), raw({0xDC, 0xFF, 0xFF, 0xC0}));
    EXPECT_EQ(head(list(65536), 6), raw({0xDD, 0, 1, 0, 0, 0xC0}));
}

TEST(EncoderTest, WritesDictionariesInTheirSmallestFormAndOrder) {
    EXPECT_EQ(encoded(Dictionary{{"b", 1}, {"a", true}}),
              raw({0x82, 0xA1, 'b', 1, 0xA1, 'a', 0xC3}));
    const auto dictionary = [](int size) {
        std::vector<Dictionary::Entry> entries;
        for (int i = 0; i < size; ++i) {
            entries.push_back({std::to_string(i), 0});
        }
        return Value(Dictionary(std::move(entries)));
    };
    EXPECT_EQ(head(dictionary(15), 2), raw({0x8F, 0xA1}));
    EXPECT_EQ(head(dictionary(16), 4), raw({0xDE, 0, 16, 0xA1}));
    EXPECT_EQ(head(dictionary(65535), 4), raw({0xDE, 0xFF, 0xFF, 0xA1}));
    EXPECT_EQ(head(dictionary(65536), 6), raw({0xDF, 0, 1, 0, 0, 0xA1}));
}

TEST(EncoderTest, WritesTheSmallestTimestampThatHoldsADate) {
    EXPECT_EQ(encoded(Date{0, 0}), raw({0xD6, 0xFF, 0, 0, 0, 0}));
    EXPECT_EQ(encoded(Date{4294967295, 0}), raw({0xD6, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}));
    EXPECT_EQ(encoded(Date{4294967296, 0}), raw({0xD7, 0xFF, 0, 0, 0, 1, 0, 0, 0, 0}));
    EXPECT_EQ(encoded(Date{1, 1}), raw({0xD7, 0xFF, 0, 0, 0, 4, 0, 0, 0, 1}));
    EXPECT_EQ(encoded(Date{17179869183, 999999999}),
              raw({0xD7, 0xFF, 0xEE, 0x6B, 0x27, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}));
    EXPECT_EQ(encoded(Date{17179869184, 0}),
              raw({0xC7, 12, 0xFF, 0, 0, 0, 0, 0, 0, 0, 4, 0, 0, 0, 0}));
    EXPECT_EQ(encoded(Date{-1, 2}),
              raw({0xC7, 12, 0xFF, 0, 0, 0, 2, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}));
}

// Answers

std::string answer(std::uint32_t messageID, const MaybeError& error, const Value& result) {
    std::string out;
    appendAnswer(out, messageID, error, result);
    return out;
}

TEST(AnswerTest, HasTheShapeOfTheProtocol) {
    EXPECT_EQ(answer(7, std::nullopt, true), raw({0x94, 1, 7, 0xC0, 0xC3}));
    const std::string error = packedMap({packed("domain"), packed("d"), packed("code"), packed(-3),
                                         packed("message"), packed("what")});
    EXPECT_EQ(answer(4294967295U, Error{"d", -3, "what"}, Value()),
              packedArray({packed(1), packed(4294967295U), error, packedNil()}));
}

TEST(AnswerTest, AppendsToWhatIsThere) {
    std::string out = "x";
    appendAnswer(out, 1, std::nullopt, Value());
    EXPECT_EQ(out, "x" + answer(1, std::nullopt, Value()));
}

TEST(AnswerTest, ComesBackAsItWas) {
    const Value result(Dictionary{{"reporterID", 5}, {"when", Date{1, 2}}, {"x", List{1.5, "y"}}});
    const auto decoded = decodeAnswer(answer(300, std::nullopt, result));
    ASSERT_TRUE(decoded.has_value());
    EXPECT_EQ(decoded->messageID, 300U);
    EXPECT_EQ(decoded->error, std::nullopt);
    EXPECT_EQ(decoded->result, result);

    const Error error{std::string(kIpcErrorDomain), 2, "what"};
    EXPECT_EQ(decodeAnswer(answer(1, error, Value()))->error, error);
}

TEST(AnswerTest, KeepsTheErrorsOfOtherServersAsText) {
    const auto error = [](const std::string& object) {
        return decodeAnswer(packedArray({packed(1), packed(1), object, packedNil()}))->error;
    };
    EXPECT_EQ(error(packed("no such method")), (Error{"", 0, "no such method"}));
    EXPECT_EQ(error(packed(5)), (Error{"", 0, "5"}));
    EXPECT_EQ(error(packedMap({packed("code"), packed(9)})), (Error{"", 9, ""}));
}

TEST(AnswerTest, IsNothingElse) {
    const std::string nil = packedNil();
    const std::vector<std::string> frames = {
        packed(1),
        packedRequest("killService", {}),
        packedArray({packed(2), packed("killService"), packedArray({})}),
        packedArray({packed(1), packed(1), nil}),
        packedArray({packed(1), packed(1), nil, nil, nil}),
        packedArray({packed(1), packed(-1), nil, nil}),
        packedArray({packed(1), packed(4294967296U), nil, nil}),
        packedArray({packed(1), nil, nil, nil}),
        packedArray({nil, packed(1), nil, nil}),
        packedArray({packed(1), packed(1), nil, packedMap({packed(1), packed(1)})}),
        packedArray({packed(1), packed(1), nil, raw({0xD4, 5, 0})}),
        packedArray({packed(1), packed(1), nil, nil}) + "x",
    };
    for (const std::string& frame : frames) {
        EXPECT_FALSE(decodeAnswer(frame).has_value());
    }
}

TEST(AnswerTest, ThatIsCutOffIsNone) {
    const std::string whole = answer(300, Error{"domain", 2, "message"}, List{"text", 1.5});
    for (std::size_t length = 0; length < whole.size(); ++length) {
        const std::vector<char> cut(whole.begin(),
                                    whole.begin() + static_cast<std::ptrdiff_t>(length));
        EXPECT_FALSE(decodeAnswer({cut.data(), cut.size()}).has_value()) << length;
    }
}

// Calls

Arguments someArguments() {
    Arguments arguments;
    arguments.reporterID = -5;
    arguments.serviceType = 11;
    arguments.dictionary = Dictionary{{"a", 1}};
    arguments.category = 65550;
    arguments.type = 7;
    arguments.reporterIDs = ReporterIDs{5, -6};
    arguments.name = "n";
    return arguments;
}

std::string call(std::optional<std::uint32_t> messageID, Method method) {
    std::string out;
    appendCall(out, messageID, method, someArguments());
    return out;
}

TEST(AppendCallTest, WritesRequestsAndNotifications) {
    EXPECT_EQ(call(1, Method::KillService), packedRequest("killService", {}));
    EXPECT_EQ(call(std::nullopt, Method::KillService),
              packedArray({packed(2), packed("killService"), packedArray({})}));
}

TEST(AppendCallTest, WritesTheArgumentsOfTheMethodInOrder) {
    const std::string id = packed(-5);
    const std::string map = packedMap({packed("a"), packed(1)});
    EXPECT_EQ(call(1, Method::SetServiceType), packedRequest("setServiceType", {packed(11), id}));
    EXPECT_EQ(call(1, Method::SetConfiguration), packedRequest("setConfiguration", {map, id}));
    EXPECT_EQ(call(1, Method::SendMessage),
              packedRequest("sendMessage",
                            {map, packed(65550), packed(7), packedArray({packed(5), packed(-6)})}));
    EXPECT_EQ(call(1, Method::AdminPostNotification),
              packedRequest("admin.postNotification", {packed("n")}));
}

TEST(AppendCallTest, WritesNilForNoIDList) {
    std::string out;
    appendCall(out, 1, Method::SendMessage, Arguments{});
    EXPECT_EQ(out,
              packedRequest("sendMessage", {packedMap({}), packed(0), packed(0), packedNil()}));
}

TEST(AppendCallTest, IsWhatTheDecoderTakesForEveryMethod) {
    for (int i = 0; i <= static_cast<int>(Method::AdminPurge); ++i) {
        const auto method = static_cast<Method>(i);
        const auto decoded = CallDecoder().decode(call(9, method));
        ASSERT_TRUE(decoded.has_value());
        EXPECT_EQ(decoded->method, method);
        EXPECT_EQ(decoded->messageID, 9U);
    }
}

} // namespace
} // namespace halyard::protocol
