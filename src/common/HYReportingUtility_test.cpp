#include "common/HYReportingUtility.h"

#include <gtest/gtest.h>

namespace halyard {
namespace {

TEST(ServiceTypeTest, EveryListedTypeHasItsName) {
    const char* names[] = {"generic",          "parlo",         "telephony",
                           "haptics",          "alarms",        "standalone",
                           "soundautoconfig",  "longformaudio", "nonlongformaudio",
                           "audiodeviceusage", "alerts",        "test",
                           "apiusage",         "systemsounds"};
    for (AudioServiceType type = 0; type < 14; ++type) {
        EXPECT_EQ(HYReportingUtilityGenerateServiceNameFromServiceType(type), names[type]);
        EXPECT_EQ(HYReportingUtilityGenerateServiceTypeFromServiceName(names[type]), type);
    }
}

TEST(ServiceTypeTest, UnlistedTypesAreTelephonyAndOnly65535IsUnknown) {
    EXPECT_EQ(HYReportingUtilityGenerateServiceNameFromServiceType(2), "telephony");
    EXPECT_EQ(HYReportingUtilityGenerateServiceNameFromServiceType(14), "telephony");
    EXPECT_EQ(HYReportingUtilityGenerateServiceNameFromServiceType(65534), "telephony");
    EXPECT_EQ(HYReportingUtilityGenerateServiceNameFromServiceType(65535), "unknown");
}

TEST(ServiceTypeTest, UnlistedNamesAreUnknown) {
    for (const char* name : {"unknown", "", "Telephony", "telephony ", "Unknown"}) {
        EXPECT_EQ(HYReportingUtilityGenerateServiceTypeFromServiceName(name), 65535);
    }
}

TEST(CategoryTest, EveryLowHalfHasItsName) {
    const char* names[] = {
        "Undefined",         "Generic",     "Record", "Input",         "Playback",    "Output",
        "PlaybackAndRecord", "IO",          "Setup",  "ClientRequest", "RouteChange", "Error",
        "HWReporting",       "Performance", "Volume", "HearingHealth"};
    for (AudioEventCategory category = 0; category < 16; ++category) {
        EXPECT_EQ(HYReportingUtilityCategoryString(category), names[category]);
    }
    EXPECT_EQ(HYReportingUtilityCategoryString(16), "Undefined");
}

TEST(CategoryTest, EveryGroupHasItsPrefix) {
    EXPECT_EQ(HYReportingUtilityCategoryString(0x04000001), "MIDI_Generic");
    EXPECT_EQ(HYReportingUtilityCategoryString(0x08000002), "Session_Record");
    EXPECT_EQ(HYReportingUtilityCategoryString(0x10000007), "DSP_IO");
    EXPECT_EQ(HYReportingUtilityCategoryString(0x2000000E), "HAL_Volume");
    EXPECT_EQ(HYReportingUtilityCategoryString(0x4000000A), "Routing_RouteChange");
    EXPECT_EQ(HYReportingUtilityCategoryString(0x80000000), "Toolbox_Undefined");
}

TEST(CategoryTest, UnknownGroupsKeepTheSeparatorAlone) {
    EXPECT_EQ(HYReportingUtilityCategoryString(0), "Undefined");
    EXPECT_EQ(HYReportingUtilityCategoryString(0x00030004), "_Playback");
    EXPECT_EQ(HYReportingUtilityCategoryString(0x14000004), "_Playback");
    EXPECT_EQ(HYReportingUtilityCategoryString(0xFFFF0000), "_Undefined");
    EXPECT_EQ(HYReportingUtilityCategoryString(0xFFFFFFFE), "_Undefined");
    EXPECT_EQ(HYReportingUtilityCategoryString(0xFFFFFFFF), "Undefined");
}

TEST(CategoryTest, AppendingGivesTheSameText) {
    std::string text = "tag ";
    appendCategoryString(text, 0x10000007);
    EXPECT_EQ(text, "tag DSP_IO");
}

TEST(CategoryTest, GroupedCategoriesMarkAnABTest) {
    EXPECT_FALSE(HYReportingUtilityIsABTestModeOn(0));
    EXPECT_FALSE(HYReportingUtilityIsABTestModeOn(0x0000FFFF));
    EXPECT_EQ(HYReportingUtilityCategoryString(0x0000FFFF), "Undefined");
    EXPECT_TRUE(HYReportingUtilityIsABTestModeOn(0x00010000));
    EXPECT_TRUE(HYReportingUtilityIsABTestModeOn(0xFFFFFFFE));
    EXPECT_FALSE(HYReportingUtilityIsABTestModeOn(0xFFFFFFFF));
}

TEST(CategoryTest, UploadsReceiveTheLowHalf) {
    EXPECT_EQ(HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(0x2000000E), 14);
    EXPECT_EQ(HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(0xFFFFFFFF), 65535);
}

TEST(TypeTest, EveryTypeHasItsName) {
    const char* names[] = {"Generic",
                           "Start",
                           "Stop",
                           "Activate",
                           "Deactivate",
                           "Setup",
                           "Error",
                           "IssueDetector",
                           "EnergyLedger",
                           "AudioUnitUsage",
                           "MIDIDriver",
                           "Summary",
                           "HeadphoneAudioExposure",
                           "AudioExposure",
                           "Listeningenhancement",
                           "Gaugewell",
                           "Simple",
                           "Histogram",
                           "State"};
    for (AudioEventType type = 0; type < 19; ++type) {
        EXPECT_EQ(HYReportingUtilityTypeString(type), names[type]);
    }
}

TEST(TypeTest, UnlistedTypesAreGenericAndOnly65535IsUnknown) {
    EXPECT_EQ(HYReportingUtilityTypeString(0), "Generic");
    EXPECT_EQ(HYReportingUtilityTypeString(19), "Generic");
    EXPECT_EQ(HYReportingUtilityTypeString(65534), "Generic");
    EXPECT_EQ(HYReportingUtilityTypeString(65535), "Unknown");
    EXPECT_EQ(HYReportingUtilityTypeString(65536), "Generic");
    EXPECT_EQ(HYReportingUtilityTypeString(0xFFFFFFFF), "Generic");
}

TEST(RulesTest, OnlyApiUsageIsNotBatched) {
    EXPECT_FALSE(HYReportingUtilityShouldBatchRelayReportingEventsForServiceType(12));
    EXPECT_TRUE(HYReportingUtilityShouldBatchRelayReportingEventsForServiceType(11));
    EXPECT_TRUE(HYReportingUtilityShouldBatchRelayReportingEventsForServiceType(65535));
}

TEST(RulesTest, FixedAnswers) {
    EXPECT_EQ(HYReportingUtilityVolumeMinimumPlayingTime(3), 0.5);
    EXPECT_EQ(HYReportingUtilityExtractSessionIDFromReporterID(-1234567890123), -1234567890123);
    EXPECT_TRUE(HYReportingUtilityShouldSendMessage());
    EXPECT_TRUE(HYReportingUtilityAllowSessionTransactions());
}

TEST(AppNameTest, IsTheDisplayIDOrUnknown) {
    EXPECT_EQ(HYReportingUtilityRetrieveAppName({{"HostApplicationDisplayID", "org.player"}}),
              Value("org.player"));
    EXPECT_EQ(HYReportingUtilityRetrieveAppName({{"VQHostApplicationDisplayID", "org.player"}}),
              Value("Unknown"));
    EXPECT_EQ(HYReportingUtilityRetrieveAppName({}), Value("Unknown"));
}

TEST(AudioMessageTagTest, JoinsCategoryAndTypeWithoutSeparator) {
    EXPECT_EQ(HYReportingUtilityAddAudioMessageTag({}, 4, 1)["audiotag"], Value("PlaybackStart"));
    EXPECT_EQ(HYReportingUtilityAddAudioMessageTag({}, 0x10000007, 6)["audiotag"],
              Value("DSP_IOError"));
    EXPECT_EQ(HYReportingUtilityAddAudioMessageTag({}, 0x80000006, 12)["audiotag"],
              Value("Toolbox_PlaybackAndRecordHeadphoneAudioExposure"));
}

TEST(AudioMessageTagTest, OverwritesAndLeavesTheOriginalAlone) {
    const Dictionary inner{{"x", 1}};
    const Dictionary message{{"audiotag", "mine"}, {"inner", inner}};
    const Dictionary tagged = HYReportingUtilityAddAudioMessageTag(message, 4, 1);
    EXPECT_EQ(tagged["audiotag"], Value("PlaybackStart"));
    EXPECT_EQ(message["audiotag"], Value("mine"));
    EXPECT_EQ(tagged["inner"].dictionary().begin(), inner.begin());
}

TEST(WhiteSpaceTest, BlanksInKeysBecomeUnderscores) {
    EXPECT_EQ(HYReportingUtilityRemoveWhiteSpaceFromKeys({{" a b ", "c d"}, {"e\tf\n", 2}}),
              (Dictionary{{"_a_b_", "c d"}, {"e\tf\n", 2}}));
}

TEST(WhiteSpaceTest, TheLaterOfKeysThatBecomeEqualWins) {
    EXPECT_EQ(HYReportingUtilityRemoveWhiteSpaceFromKeys({{"a b", 1}, {"a_b", 2}}),
              (Dictionary{{"a_b", 2}}));
    EXPECT_EQ(HYReportingUtilityRemoveWhiteSpaceFromKeys({{"a_b", 1}, {"a b", 2}}),
              (Dictionary{{"a_b", 2}}));
}

TEST(WhiteSpaceTest, NestedKeysStay) {
    const Dictionary inner{{"x y", 1}};
    EXPECT_EQ(HYReportingUtilityRemoveWhiteSpaceFromKeys({{"a b", inner}}),
              (Dictionary{{"a_b", inner}}));
}

TEST(WhiteSpaceTest, NothingIsCopiedWithoutABlank) {
    const Dictionary message{{"a", 1}, {"b", 2}};
    EXPECT_EQ(HYReportingUtilityRemoveWhiteSpaceFromKeys(message).begin(), message.begin());
    EXPECT_TRUE(HYReportingUtilityRemoveWhiteSpaceFromKeys({}).empty());
}

TEST(RoundTest, RoundsHalfAwayFromZero) {
    EXPECT_EQ(HYReportingUtilityRoundWithPlaces(2.345, 2), 2.35);
    EXPECT_EQ(HYReportingUtilityRoundWithPlaces(-2.5, 0), -3);
    EXPECT_EQ(HYReportingUtilityRoundWithPlaces(2.5, 0), 3);
    EXPECT_EQ(HYReportingUtilityRoundWithPlaces(1.0 / 3, 3), 0.333);
}

TEST(RoundTest, NegativePlacesRoundToTensAndHundreds) {
    EXPECT_EQ(HYReportingUtilityRoundWithPlaces(1250, -2), 1300);
    EXPECT_EQ(HYReportingUtilityRoundWithPlaces(-14, -1), -10);
}

std::optional<std::string> timeBucket(double value) {
    return HYReportingUtilityBucketNumberToString(value,
                                                  HYReportingUtilityBucketNumberToStringTimes, 0);
}

std::optional<std::string> volumeBucket(double value, std::uint32_t digits) {
    return HYReportingUtilityBucketNumberToString(
        value, HYReportingUtilityBucketNumberToStringVolumes, digits);
}

TEST(BucketTest, TheNearestBucketIsChosen) {
    EXPECT_EQ(timeBucket(-3), "0");
    EXPECT_EQ(timeBucket(0), "0");
    EXPECT_EQ(timeBucket(2.9), "1");
    EXPECT_EQ(timeBucket(20000), "18000");
    EXPECT_EQ(volumeBucket(0.5, 4), "0.5");
    EXPECT_EQ(volumeBucket(0.3, 4), "0.3125");
}

TEST(BucketTest, TheLargerBucketWinsATie) {
    EXPECT_EQ(timeBucket(3), "5");
    EXPECT_EQ(timeBucket(0.5), "1");
    EXPECT_EQ(volumeBucket(0.03125, 4), "0.0625");
}

TEST(BucketTest, DigitsAreCutHalfEvenAndOneIsKept) {
    EXPECT_EQ(volumeBucket(0.3, 2), "0.31");
    EXPECT_EQ(volumeBucket(0.125, 2), "0.12");
    EXPECT_EQ(volumeBucket(0.375, 2), "0.38");
    EXPECT_EQ(volumeBucket(1, 4), "1.0");
    EXPECT_EQ(volumeBucket(0, 1), "0.0");
    EXPECT_EQ(volumeBucket(0.0625, 0), "0");
}

TEST(BucketTest, AbsurdDigitsAndEmptyListsAreHarmless) {
    EXPECT_EQ(volumeBucket(0.0625, 0xFFFFFFFF), "0.0625");
    EXPECT_EQ(HYReportingUtilityBucketNumberToString(1, {}, 2), std::nullopt);
}

} // namespace
} // namespace halyard
