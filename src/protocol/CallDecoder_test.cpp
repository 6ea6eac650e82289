#include <gtest/gtest.h>
#include <map>

#include "protocol/CallTestSupport.h"

namespace halyard::protocol {
namespace {

// Frames

TEST(CallDecoderTest, KeepsTheMessageIDOfARequest) {
    for (const std::uint32_t id : {0U, 127U, 128U, 65536U, 4294967295U}) {
        const auto call =
            decode(packedArray({packed(0), packed(id), packed("killService"), packedArray({})}));
        ASSERT_TRUE(call.has_value());
        EXPECT_EQ(call->messageID, id);
        EXPECT_EQ(call->method, Method::KillService);
    }
}

TEST(CallDecoderTest, GivesANotificationNoMessageID) {
    const auto call = decode(packedArray({packed(2), packed("killService"), packedArray({})}));
    ASSERT_TRUE(call.has_value());
    EXPECT_EQ(call->messageID, std::nullopt);
    EXPECT_EQ(call->method, Method::KillService);
}

TEST(CallDecoderTest, TakesIntegersOfAnyWidth) {
    const std::string wideZero = raw({0xD3, 0, 0, 0, 0, 0, 0, 0, 0});
    const std::string wideSeven = raw({0xCF, 0, 0, 0, 0, 0, 0, 0, 7});
    const auto call = decode(
        packedArray({wideZero, wideSeven, packed("reporterIDValid"), packedArray({wideSeven})}));
    ASSERT_TRUE(call.has_value());
    EXPECT_EQ(call->messageID, 7U);
    EXPECT_EQ(call->arguments.reporterID, 7);
}

TEST(CallDecoderTest, TakesBinaryAsTheMethodsName) {
    const auto call = decode(
        packedArray({packed(0), packed(1), raw({0xC4, 11}) + "killService", packedArray({})}));
    ASSERT_TRUE(call.has_value());
    EXPECT_EQ(call->method, Method::KillService);
}

TEST(CallDecoderTest, RefusesFramesThatAreNoCalls) {
    const std::string none = packedArray({});
    const std::string name = packed("killService");
    const std::map<std::string, std::string> frames = {
        {"an integer", packed(5)},
        {"nil", packedNil()},
        {"a map", packedMap({packed(0), packed(1), name, none})},
        {"an empty array", none},
        {"a request of three", packedArray({packed(0), packed(1), name})},
        {"a request of five", packedArray({packed(0), packed(1), name, none, none})},
        {"a notification of two", packedArray({packed(2), name})},
        {"a notification of four", packedArray({packed(2), packed(1), name, none})},
        {"a response", packedArray({packed(1), packed(1), packedNil(), packed(true)})},
        {"type 3", packedArray({packed(3), packed(1), name, none})},
        {"type -1", packedArray({packed(-1), packed(1), name, none})},
        {"type nil", packedArray({packedNil(), packed(1), name, none})},
        {"type 0.0", packedArray({raw({0xCA, 0, 0, 0, 0}), packed(1), name, none})},
        {"message ID -1", packedArray({packed(0), packed(-1), name, none})},
        {"message ID 2^32", packedArray({packed(0), packed(4294967296U), name, none})},
        {"message ID nil", packedArray({packed(0), packedNil(), name, none})},
        {"message ID text", packedArray({packed(0), packed("1"), name, none})},
        {"method nil", packedArray({packed(0), packed(1), packedNil(), none})},
        {"method a list", packedArray({packed(0), packed(1), none, none})},
        {"params nil", packedArray({packed(0), packed(1), name, packedNil()})},
        {"params a map", packedArray({packed(0), packed(1), name, kEmptyMap})},
        {"params nil, unknown method",
         packedArray({packed(0), packed(1), packed("x"), packedNil()})},
        {"params nil, notification", packedArray({packed(2), name, packedNil()})},
    };
    for (const auto& [what, frame] : frames) {
        EXPECT_EQ(decode(frame).has_value(), false) << what;
    }
}

// Methods

TEST(CallDecoderTest, KnowsEveryMethodAndItsArguments) {
    const std::string id = packed(5);
    const std::string map = kEmptyMap;
    const std::vector<std::pair<std::string, std::vector<std::string>>> methods = {
        {"createReportingSession", {id}},
        {"setServiceType", {packed(1), id}},
        {"getServiceNameForReporterID", {id}},
        {"setConfiguration", {map, id}},
        {"startReportingSessionForID", {id}},
        {"sendMessage", {map, packed(1), packed(1), packedNil()}},
        {"stopReportingSessionForID", {id}},
        {"destroyReportingSession", {id}},
        {"reporterIDValid", {id}},
        {"getAllReporters", {}},
        {"killService", {}},
        {"client.dropped", {map}},
        {"admin.postNotification", {packed("x")}},
        {"admin.flush", {}},
        {"admin.status", {}},
        {"admin.purge", {}},
    };
    std::size_t index = 0;
    for (const auto& [name, params] : methods) {
        const Call call = decodeRequest(name, params);
        EXPECT_EQ(call.error, std::nullopt) << name;
        EXPECT_EQ(call.method, static_cast<Method>(index++)) << name;
        EXPECT_EQ(methodName(call.method.value_or(Method::KillService)), name);
    }
}

TEST(CallDecoderTest, PutsEachArgumentInItsPlace) {
    const Call type = decodeRequest("setServiceType", {packed(11), packed(-7)});
    EXPECT_EQ(type.arguments.serviceType, 11);
    EXPECT_EQ(type.arguments.reporterID, -7);

    const Call message =
        decodeRequest("sendMessage", {packedMap({packed("a"), packed(1)}), packed(65550), packed(7),
                                      packedArray({packed(5), packed(-6)})});
    EXPECT_EQ(message.arguments.dictionary, (Dictionary{{"a", 1}}));
    EXPECT_EQ(message.arguments.category, 65550U);
    EXPECT_EQ(message.arguments.type, 7);
    EXPECT_EQ(message.arguments.reporterIDs, (ReporterIDs{5, -6}));

    EXPECT_EQ(decodeRequest("admin.postNotification", {packed("a.b")}).arguments.name, "a.b");
}

TEST(CallDecoderTest, TellsNoListFromTheEmptyList) {
    const auto ids = [](const std::string& list) {
        return decodeRequest("sendMessage", {kEmptyMap, packed(1), packed(1), list})
            .arguments.reporterIDs;
    };
    EXPECT_EQ(ids(packedNil()), std::nullopt);
    EXPECT_EQ(ids(packedArray({})), ReporterIDs{});
}

TEST(CallDecoderTest, NamesAnUnknownMethod) {
    const auto code = IpcErrorCode::UnknownMethod;
    expectRefused("sendMessages", {}, "unknown method \"sendMessages\"", code);
    expectRefused("", {packed(1)}, "unknown method \"\"", code);
    expectRefused("a\n\"\\\x7F\xFF", {}, "unknown method \"a\\x0a\\\"\\\\\\x7f\xEF\xBF\xBD\"",
                  code);
}

TEST(CallDecoderTest, ShortensALongMethodName) {
    const auto code = IpcErrorCode::UnknownMethod;
    expectRefused(std::string(64, 'm'), {}, "unknown method \"" + std::string(64, 'm') + "\"",
                  code);
    expectRefused(std::string(65, 'm'), {}, "unknown method \"" + std::string(64, 'm') + "...\"",
                  code);
}

// Arguments

TEST(CallDecoderTest, NamesAMissingArgument) {
    expectRefused("createReportingSession", {},
                  "argument 1 \"reporterID\" of createReportingSession is missing");
    expectRefused("sendMessage", {kEmptyMap, packed(1), packed(1)},
                  "argument 4 \"reporterIDs\" of sendMessage is missing");
    expectRefused("sendMessage", {packed(1)}, "argument 2 \"category\" of sendMessage is missing");
}

TEST(CallDecoderTest, CountsArgumentsThatAreTooMany) {
    expectRefused("getAllReporters", {packed(1)},
                  "argument 1 of getAllReporters is extra: it takes 0");
    expectRefused("setServiceType", {packed(1), packed(1), packed(1), packed(1)},
                  "argument 3 of setServiceType is extra: it takes 2");
}

TEST(CallDecoderTest, ChecksTheRangeOfAReporterID) {
    const auto id = [](auto value) {
        return decodeRequest("reporterIDValid", {packed(value)}).arguments.reporterID;
    };
    EXPECT_EQ(id(INT64_MAX), INT64_MAX);
    EXPECT_EQ(id(INT64_MIN), INT64_MIN);
    expectRefused(
        "reporterIDValid", {packed(std::uint64_t{1} << 63U)},
        "argument 1 \"reporterID\" of reporterIDValid is 9223372036854775808, out of range: "
        "not an integer from -9223372036854775808 to 9223372036854775807");
}

TEST(CallDecoderTest, ChecksTheRangeOfAServiceType) {
    const auto type = [](int value) {
        return decodeRequest("setServiceType", {packed(value), packed(1)}).arguments.serviceType;
    };
    EXPECT_EQ(type(0), 0);
    EXPECT_EQ(type(65535), 65535);
    const std::string text = "argument 1 \"serviceType\" of setServiceType is ";
    const std::string range = ", out of range: not an integer from 0 to 65535";
    expectRefused("setServiceType", {packed(65536), packed(1)}, text + "65536" + range);
    expectRefused("setServiceType", {packed(-1), packed(1)}, text + "-1" + range);
}

TEST(CallDecoderTest, ChecksTheRangesOfCategoryAndType) {
    const Call call =
        decodeRequest("sendMessage", {kEmptyMap, packed(4294967295U), packed(65535), packedNil()});
    EXPECT_EQ(call.arguments.category, 4294967295U);
    EXPECT_EQ(call.arguments.type, 65535);
    const std::string category = "argument 2 \"category\" of sendMessage is ";
    const std::string range = ", out of range: not an integer from 0 to 4294967295";
    expectRefused("sendMessage", {kEmptyMap, packed(4294967296U), packed(0), packedNil()},
                  category + "4294967296" + range);
    expectRefused("sendMessage", {kEmptyMap, packed(-1), packed(0), packedNil()},
                  category + "-1" + range);
    expectRefused("sendMessage", {kEmptyMap, packed(0), packed(65536), packedNil()},
                  "argument 3 \"type\" of sendMessage is 65536, out of range: "
                  "not an integer from 0 to 65535");
}

TEST(CallDecoderTest, TakesNoOtherKindForAnInteger) {
    const std::map<std::string, std::string> kinds = {
        {"nil", packedNil()},
        {"a boolean", packed(true)},
        {"a real", raw({0xCB, 0x3F, 0xF0, 0, 0, 0, 0, 0, 0})}, // 1.0
        {"a string", packed("1")},
        {"a list", packedArray({packed(1)})},
        {"a dictionary", kEmptyMap},
        {"an extension", raw({0xD4, 0xFF, 0})},
    };
    for (const auto& [kind, object] : kinds) {
        expectRefused("setServiceType", {object, packed(1)},
                      "argument 1 \"serviceType\" of setServiceType is " + kind +
                          ", not an integer from 0 to 65535");
    }
}

TEST(CallDecoderTest, TakesNoOtherKindForTheRest) {
    expectRefused("setConfiguration", {packedNil(), packed(1)},
                  "argument 1 \"dictionary\" of setConfiguration is nil, not a dictionary");
    expectRefused("setConfiguration", {packedArray({}), packed(1)},
                  "argument 1 \"dictionary\" of setConfiguration is a list, not a dictionary");
    expectRefused("admin.postNotification", {packedNil()},
                  "argument 1 \"name\" of admin.postNotification is nil, not a string");
    expectRefused("sendMessage", {kEmptyMap, packed(1), packed(1), packed(5)},
                  "argument 4 \"reporterIDs\" of sendMessage is an integer, "
                  "not nil or a list of integers");
}

TEST(CallDecoderTest, ChecksEachElementOfTheIDList) {
    const auto refused = [](const std::string& element, const std::string& what) {
        expectRefused("sendMessage",
                      {kEmptyMap, packed(1), packed(1), packedArray({packed(5), element})},
                      "argument 4 \"reporterIDs\" of sendMessage holds " + what +
                          " at index 1, not an integer from -9223372036854775808 to "
                          "9223372036854775807");
    };
    refused(packed("5"), "a string");
    refused(packedNil(), "nil");
    refused(packed(UINT64_MAX), "18446744073709551615");
}

TEST(CallDecoderTest, LeavesNoArgumentsBesideAnError) {
    const Call call = decodeRequest(
        "sendMessage", {packedMap({packed("a"), packed(1)}), packed(1), packed(-1), packedNil()});
    EXPECT_TRUE(call.arguments.dictionary.empty());
    EXPECT_EQ(call.arguments.category, 0U);
}

TEST(CallDecoderTest, DecodesTheNextCallAfterARefusedOne) {
    CallDecoder decoder;
    EXPECT_TRUE(decoder.decode(packedRequest("reporterIDValid", {packed("x")}))->error);
    EXPECT_EQ(decoder.decode(packedRequest("reporterIDValid", {packed(4)}))->arguments.reporterID,
              4);
}

} // namespace
} // namespace halyard::protocol
