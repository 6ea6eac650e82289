#include "sinks/HYReportingEnergyLedgerUtility.h"

#include "sinks/SinkFixture.h"

namespace halyard {
namespace {

class HYReportingEnergyLedgerUtilityTest : public SinkFixture {
protected:
    void handle(const Dictionary& message, AudioEventType type = kAudioEventTypeEnergyLedger) {
        HYReportingEnergyLedgerUtility::handleEvent(&message, kAudioEventCategoryPlayback, type,
                                                    session_);
    }
};

TEST_F(HYReportingEnergyLedgerUtilityTest, RegistersTheEnginesOnTime) {
    handle({{"EngineOnTime", 2.5}, {"hyreporting_timestamp", 1700000000.25}, {"other", 1}});
    ASSERT_EQ(ledger_.events.size(), 1U);
    EXPECT_EQ(ledger_.events[0].clientIdentifier, 28U);
    EXPECT_EQ(ledger_.events[0].name, "Flexmedia_Haptics");
    EXPECT_EQ(ledger_.events[0].payload, (Dictionary{{"EngineOnDuration", 2.5},
                                                     {"ApplicationName", "org.player"},
                                                     {"TimestampEnd", 1700000000.25}}));
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(HYReportingEnergyLedgerUtilityTest, PayloadsHaveTheirKeysInAFixedOrder) {
    handle({{"hyreporting_timestamp", 1.5}, {"EngineOnTime", 2.5}});
    handle({{"Active_Clients", 3}, {"Haptic_Active_Hardware_Time_Seconds", 12}});
    std::vector<std::vector<std::string>> keys;
    for (const auto& event : ledger_.events) {
        keys.emplace_back();
        for (const auto& [key, value] : event.payload) {
            keys.back().emplace_back(key.text());
        }
    }
    EXPECT_EQ(keys, (std::vector<std::vector<std::string>>{
                        {"EngineOnDuration", "ApplicationName", "TimestampEnd"},
                        {"Haptic_Active_Hardware_Time_Seconds", "Active_Clients"}}));
}

TEST_F(HYReportingEnergyLedgerUtilityTest, CopiesValuesAsTheyStand) {
    handle({{"EngineOnTime", "soon"}, {"hyreporting_timestamp", List{Value(1)}}});
    EXPECT_EQ(ledger_.events[0].payload["EngineOnDuration"], Value("soon"));
    EXPECT_EQ(ledger_.events[0].payload["TimestampEnd"], Value(List{Value(1)}));
}

TEST_F(HYReportingEnergyLedgerUtilityTest, AMissingTimeStampIsLoggedAndLeftOut) {
    session_->settings = {};
    handle({{"EngineOnTime", 1}});
    EXPECT_EQ(ledger_.events[0].payload,
              (Dictionary{{"EngineOnDuration", 1}, {"ApplicationName", "Unknown"}}));
    ASSERT_EQ(log_.lines().size(), 1U);
    EXPECT_TRUE(
        log_.has(LogLevel::Error, "hyrp", "failed to get HYReporting timestamp for energyledger"));
}

TEST_F(HYReportingEnergyLedgerUtilityTest, WithoutNameAndTimeStampTheDurationStandsAlone) {
    const Dictionary message{{"EngineOnTime", 1}};
    EXPECT_EQ(HYReportingEnergyLedgerUtility::engineOnPayload(message, Value()),
              (Dictionary{{"EngineOnDuration", 1}}));
    const std::vector<testing::RecordingLog::Line> expected = {
        {LogLevel::Error, "hyrp", "failed to get app name for energyledger"},
        {LogLevel::Error, "hyrp", "failed to get HYReporting timestamp for energyledger"}};
    EXPECT_EQ(log_.lines(), expected);
}

TEST_F(HYReportingEnergyLedgerUtilityTest, RegistersLeakedSessions) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", 12}, {"Active_Clients", 3}});
    ASSERT_EQ(ledger_.events.size(), 1U);
    EXPECT_EQ(ledger_.events[0].clientIdentifier, 28U);
    EXPECT_EQ(ledger_.events[0].name, "LeakedHapticsSessionInfo");
    EXPECT_EQ(ledger_.events[0].payload,
              (Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 12}, {"Active_Clients", 3}}));
}

TEST_F(HYReportingEnergyLedgerUtilityTest, LeakedSessionsWithoutClientsHaveOneKey) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", 12}});
    EXPECT_EQ(ledger_.events[0].payload, (Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 12}}));
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(HYReportingEnergyLedgerUtilityTest, TheEngineComesBeforeLeakedSessions) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", 12}, {"EngineOnTime", 1}});
    ASSERT_EQ(ledger_.events.size(), 1U);
    EXPECT_EQ(ledger_.events[0].name, "Flexmedia_Haptics");
}

TEST_F(HYReportingEnergyLedgerUtilityTest, OtherKeysCauseNothingNotEvenALogLine) {
    handle({{"hyreporting_timestamp", 1.0}, {"Active_Clients", 3}});
    HYReportingEnergyLedgerUtility::handleEvent(nullptr, 4, kAudioEventTypeEnergyLedger, session_);
    EXPECT_TRUE(ledger_.events.empty());
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(HYReportingEnergyLedgerUtilityTest, OtherTypesCauseNothing) {
    handle({{"EngineOnTime", 1}}, kAudioEventTypeIssueDetector);
    handle({{"EngineOnTime", 1}}, 0x00010008);
    EXPECT_TRUE(ledger_.events.empty());
    EXPECT_TRUE(log_.lines().empty());
}

} // namespace
} // namespace halyard
