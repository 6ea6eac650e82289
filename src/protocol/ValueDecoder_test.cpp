#include <gtest/gtest.h>

#include "protocol/CallTestSupport.h"

namespace halyard::protocol {
namespace {

// The value of the key "k" in a message that holds `object` there.
Value decodeValue(const std::string& object) {
    const Call call =
        decodeRequest("setConfiguration", {packedMap({packed("k"), object}), packed(1)});
    EXPECT_EQ(call.error, std::nullopt);
    return call.arguments.dictionary["k"];
}

TEST(ValueDecoderTest, KeepsTheKindOfEachValue) {
    EXPECT_EQ(decodeValue(packed(true)).kind(), Value::Kind::Bool);
    EXPECT_EQ(decodeValue(packed(false)).kind(), Value::Kind::Bool);
    EXPECT_EQ(decodeValue(packed(INT64_MAX)).kind(), Value::Kind::Int);
    EXPECT_EQ(decodeValue(packed(std::uint64_t{1} << 63U)).kind(), Value::Kind::UInt);
    EXPECT_EQ(decodeValue(raw({0xCA, 0x3F, 0x80, 0, 0})).kind(), Value::Kind::Float);
    EXPECT_EQ(decodeValue(raw({0xCB, 0x3F, 0xF0, 0, 0, 0, 0, 0, 0})).kind(), Value::Kind::Double);
    EXPECT_EQ(decodeValue(packed("")).kind(), Value::Kind::String);
    EXPECT_EQ(decodeValue(packedArray({})).kind(), Value::Kind::List);
    EXPECT_EQ(decodeValue(kEmptyMap).kind(), Value::Kind::Dictionary);
}

TEST(ValueDecoderTest, TakesBinaryAsText) {
    EXPECT_EQ(decodeValue(raw({0xC4, 2, 0xFF, 0})), Value(std::string_view("\xFF\0", 2)));
    const Call call = decodeRequest("setConfiguration",
                                    {packedMap({raw({0xC4, 1}) + "b", packed(1)}), packed(1)});
    EXPECT_EQ(call.arguments.dictionary, (Dictionary{{"b", 1}}));
}

TEST(ValueDecoderTest, LeavesOutEntriesOfNil) {
    const Call call = decodeRequest(
        "setConfiguration",
        {packedMap({packed("a"), packedNil(), packed("b"), packedMap({packed("c"), packedNil()})}),
         packed(1)});
    EXPECT_EQ(call.arguments.dictionary, (Dictionary{{"b", Dictionary()}}));
    EXPECT_EQ(call.arguments.dictionary.size(), 1U);
}

TEST(ValueDecoderTest, KeepsNilInsideAList) {
    const List list = decodeValue(packedArray({packed(1), packedNil(), packed(2)})).list();
    ASSERT_EQ(list.size(), 3U);
    EXPECT_TRUE(list[1].isNone());
}

TEST(ValueDecoderTest, LetsTheLastOfEqualKeysWin) {
    const auto map =
        packedMap({packed("a"), packed(1), packed("b"), packed(2), packed("a"), packed(3)});
    const Call call = decodeRequest("setConfiguration", {map, packed(1)});
    EXPECT_EQ(call.arguments.dictionary, (Dictionary{{"a", 3}, {"b", 2}}));
    EXPECT_EQ(call.arguments.dictionary.size(), 2U);
}

TEST(ValueDecoderTest, RemovesAKeyWhoseLastValueIsNil) {
    const auto map = packedMap({packed("a"), packed(1), packed("a"), packedNil()});
    EXPECT_TRUE(decodeRequest("setConfiguration", {map, packed(1)}).arguments.dictionary.empty());
}

TEST(ValueDecoderTest, RefusesKeysThatAreNoStrings) {
    const std::string text =
        "argument 1 \"dictionary\" of setConfiguration holds a dictionary key that is no string";
    expectRefused("setConfiguration", {packedMap({packed(1), packed(1)}), packed(1)}, text);
    expectRefused("setConfiguration", {packedMap({packedNil(), packed(1)}), packed(1)}, text);
    expectRefused(
        "setConfiguration",
        {packedMap({packed("a"), packedArray({packedMap({packed(1), packed(1)})})}), packed(1)},
        text);
}

TEST(ValueDecoderTest, DecodesTheThreeTimestamps) {
    EXPECT_EQ(decodeValue(raw({0xD6, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF})), Value(Date{4294967295, 0}));
    // 30 bits of nanoseconds, 34 of seconds.
    EXPECT_EQ(decodeValue(raw({0xD7, 0xFF, 0xEE, 0x6B, 0x27, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF})),
              Value(Date{17179869183, 999999999}));
    EXPECT_EQ(decodeValue(raw(
                  {0xC7, 12, 0xFF, 0, 0, 0, 5, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFE})),
              Value(Date{-2, 5}));
    // The same width in its longer spelling.
    EXPECT_EQ(decodeValue(raw({0xC7, 4, 0xFF, 0, 0, 0, 9})), Value(Date{9, 0}));
}

TEST(ValueDecoderTest, RefusesIllFormedTimestamps) {
    const auto refused = [](const std::string& object) {
        expectRefused(
            "setConfiguration", {packedMap({packed("k"), object}), packed(1)},
            "argument 1 \"dictionary\" of setConfiguration holds an ill-formed timestamp");
    };
    refused(raw({0xD4, 0xFF, 0}));                                               // one byte
    refused(raw({0xC7, 0, 0xFF}));                                               // none
    refused(raw({0xD7, 0xFF, 0xEE, 0x6B, 0x28, 0, 0, 0, 0, 0}));                 // 10^9 ns
    refused(raw({0xC7, 12, 0xFF, 0x3B, 0x9A, 0xCA, 0, 0, 0, 0, 0, 0, 0, 0, 0})); // 10^9 ns
}

TEST(ValueDecoderTest, RefusesOtherExtensions) {
    const auto refused = [](const std::string& object, const std::string& type) {
        expectRefused("setConfiguration", {packedMap({packed("k"), object}), packed(1)},
                      "argument 1 \"dictionary\" of setConfiguration holds an extension of type " +
                          type + " (only timestamps, -1, are known)");
    };
    refused(raw({0xD6, 0, 1, 2, 3, 4}), "0");
    refused(raw({0xD6, 0x7F, 1, 2, 3, 4}), "127");
    refused(raw({0xD6, 0xFE, 1, 2, 3, 4}), "-2");
}

TEST(ValueDecoderTest, DecodesTheDeepestMessageThatTheScannerLetsPass) {
    std::string object = packed(1);
    for (int depth = 3; depth < kMaxDepth; ++depth) { // Inside frame, params and dictionary.
        object = packedArray({object});
    }
    Value value = decodeValue(object);
    int levels = 0;
    for (; value.isList(); value = Value(value.list()[0])) {
        ++levels;
    }
    EXPECT_EQ(levels, kMaxDepth - 3);
    EXPECT_EQ(value, Value(1));
}

TEST(ValueDecoderTest, DecodesADictionaryOfManyKeys) {
    std::vector<std::string> pairs;
    for (int i = 0; i < 20000; ++i) {
        pairs.push_back(packed("a rather long key number " + std::to_string(i)));
        pairs.push_back(packed(i));
    }
    const Call call = decodeRequest("setConfiguration", {packedMap(pairs), packed(1)});
    EXPECT_EQ(call.arguments.dictionary.size(), 20000U);
    EXPECT_EQ(call.arguments.dictionary["a rather long key number 19999"], Value(19999));
}

TEST(ValueDecoderTest, BoundsItsOwnDepthWhereNoScannerDid) {
    const auto isRefused = [](std::size_t lists) {
        const auto call = CallDecoder().decode(raw({0x94, 0, 1}) + packed("setConfiguration") +
                                               raw({0x92, 0x81}) + packed("k") +
                                               std::string(lists, '\x91') + packed(5) + packed(1));
        return !call || call->error.has_value();
    };
    EXPECT_FALSE(isRefused(kMaxDepth - 3)); // Frame, params and dictionary are levels, too.
    EXPECT_TRUE(isRefused(kMaxDepth - 2));
}

TEST(ValueDecoderTest, StaysInsideBytesThatNoScannerSaw) {
    const std::string frame = packedRequest(
        "sendMessage", {packedMap({packed("k"), packedArray({packed(1000), packed("text")})}),
                        packed(1), packed(1), packedArray({packed(5)})});
    for (std::size_t length = 0; length < frame.size(); ++length) {
        const std::vector<char> cut(frame.begin(),
                                    frame.begin() + static_cast<std::ptrdiff_t>(length));
        const auto call = CallDecoder().decode({cut.data(), cut.size()});
        EXPECT_TRUE(!call || call->error) << length;
    }
    CallDecoder decoder;
    EXPECT_FALSE(decoder.decode(std::string(100000, '\x91')).has_value());
    const auto deep = decoder.decode(raw({0x94, 0, 1}) + packed("setConfiguration") +
                                     raw({0x92, 0x81}) + packed("k") + std::string(100000, '\x91'));
    ASSERT_TRUE(deep && deep->error);
    EXPECT_EQ(deep->error->message,
              "argument 1 \"dictionary\" of setConfiguration holds bytes that are no MessagePack");
}

} // namespace
} // namespace halyard::protocol
