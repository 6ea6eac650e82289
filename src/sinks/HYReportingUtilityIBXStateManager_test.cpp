#include "sinks/HYReportingUtilityIBXStateManager.h"

#include "sinks/SinkFixture.h"

namespace halyard {
namespace {

class HYReportingUtilityIBXStateManagerTest : public SinkFixture {
protected:
    void handle(const Dictionary& message, AudioEventType type = kAudioEventTypeEnergyLedger) {
        manager_.handleEvent(&message, 0x10000007, type, session_, process_);
    }

    HYReportingUtilityIBXStateManager manager_;
    std::optional<std::string> process_ = "mpv";
};

Dictionary report(const char* name) {
    return {{"Haptic_Active_Hardware_Time_Seconds", 12}, {"report", name}};
}

TEST_F(HYReportingUtilityIBXStateManagerTest, TheFirstReportIsOnlyCounted) {
    handle(report("A"));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
    EXPECT_EQ(manager_.messageCache(), report("A"));
    EXPECT_TRUE(incidents_.requests.empty());
    EXPECT_TRUE(log_.has(LogLevel::Info, "hyrb", "Incrementing IBX counter. mpv"));
}

TEST_F(HYReportingUtilityIBXStateManagerTest, ARepeatedReportCountsOnce) {
    handle(report("A"));
    handle(report("A"));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
    EXPECT_TRUE(incidents_.requests.empty());
    EXPECT_EQ(log_.lines().size(), 1U);
}

TEST_F(HYReportingUtilityIBXStateManagerTest, EverySecondDistinctReportRequestsASnapshot) {
    handle(report("A"));
    handle(report("B"));
    EXPECT_EQ(incidents_.requests.size(), 1U);
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 0U);
    EXPECT_TRUE(manager_.messageCache().empty());
    handle(report("C"));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
    EXPECT_EQ(incidents_.requests.size(), 1U);
    handle(report("D"));
    EXPECT_EQ(incidents_.requests.size(), 2U);
}

TEST_F(HYReportingUtilityIBXStateManagerTest, AnOldReportBeginsANewPairAfterASnapshot) {
    handle(report("A"));
    handle(report("B"));
    handle(report("A"));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
    EXPECT_EQ(incidents_.requests.size(), 1U);
}

TEST_F(HYReportingUtilityIBXStateManagerTest, TheTriggeringReportIsNotCached) {
    handle(report("A"));
    handle(report("B"));
    handle(report("B"));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1U);
}

TEST_F(HYReportingUtilityIBXStateManagerTest, OtherMessagesChangeNothing) {
    handle(report("A"), kAudioEventTypeIssueDetector);
    handle(report("A"), 0x00010008);
    handle({{"EngineOnTime", 1}});
    manager_.handleEvent(nullptr, 4, kAudioEventTypeEnergyLedger, session_, process_);
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 0U);
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(HYReportingUtilityIBXStateManagerTest, TheSnapshotCarriesASignature) {
    handle(report("A"));
    handle(report("B"));
    const auto& request = incidents_.requests.at(0);
    EXPECT_EQ(request.signature, (Dictionary{{"domain", "AudioAnalytics"},
                                             {"type", "haptics"},
                                             {"subType", "DSP_IO"},
                                             {"subtypeContext", "EnergyLedger"},
                                             {"detectedProcess", "mpv"}}));
    EXPECT_EQ(request.duration, 0);
    EXPECT_TRUE(request.event.isNone());
    EXPECT_TRUE(request.payload.isNone());
    EXPECT_TRUE(log_.has(LogLevel::Info, "hyrb", "Getting snapshot with Incident Reporter"));
}

TEST_F(HYReportingUtilityIBXStateManagerTest, AnUnknownSenderIsLeftOutOfTheSignature) {
    process_.reset();
    session_->type = kAudioServiceTypeUnknown;
    handle(report("A"));
    handle(report("B"));
    EXPECT_TRUE(log_.has(LogLevel::Info, "hyrb", "Incrementing IBX counter. (null)"));
    EXPECT_FALSE(incidents_.requests.at(0).signature.contains("detectedProcess"));
    EXPECT_EQ(incidents_.requests.at(0).signature["type"], Value("unknown"));
}

TEST_F(HYReportingUtilityIBXStateManagerTest, TheResponseIsLogged) {
    handle(report("A"));
    handle(report("B"));
    incidents_.requests.at(0).reply({{"success", true}});
    EXPECT_TRUE(log_.has(LogLevel::Info, "hyrb",
                         "Response from incidentReporter : {\n    success = 1;\n}"));
}

} // namespace
} // namespace halyard
