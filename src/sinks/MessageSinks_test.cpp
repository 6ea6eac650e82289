#include "sinks/MessageSinks.h"

#include <gmock/gmock.h>
#include <string>
#include <vector>

#include "common/Description.h"
#include "sinks/SinkFixture.h"
#include "testing/FakeDevice.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;

// Notes which of the services behind the sinks is called, in one sequence.
struct Services final : platform::AnalyticsService,
                        platform::EnergyLedger,
                        platform::MetricService,
                        platform::IncidentReporter {
    bool isEventUsed(std::string_view name) const override {
        calls.emplace_back(name);
        return false;
    }
    void sendEventLazily(std::string_view, PayloadBuilder) override {}
    void registerEvent(std::uint32_t, std::string_view name, const Dictionary&) override {
        calls.emplace_back(name);
    }
    void postMetric(std::uint32_t, std::string) override { calls.emplace_back("metric"); }
    void snapshotWithSignature(const Dictionary& signature, double, const Value&, const Value&,
                               Reply) override {
        calls.push_back("incident of " + describe(signature["detectedProcess"]));
    }

    mutable std::vector<std::string> calls;
};

class MessageSinksTest : public SinkFixture {
protected:
    MessageSinksTest() {
        platform_.analytics = &services_;
        platform_.energyLedger = &services_;
        platform_.metrics = &services_;
        platform_.incidentReporter = &services_;
        platform_.deviceProperties = &device_;
        platform::install(&platform_); // Asks anew for the kind of the build.
    }
    MessageSinks sinksOf(bool internalBuild) {
        device_.booleans["InternalBuild"] = internalBuild;
        return {};
    }
    static Message leak(int seconds) {
        return {{{"Haptic_Active_Hardware_Time_Seconds", seconds}},
                kAudioEventCategoryPlayback,
                kAudioEventTypeEnergyLedger};
    }
    // The calls that the last of these causes.
    std::vector<std::string> handle(MessageSinks sinks, const std::vector<Message>& messages) {
        for (const Message& message : messages) {
            services_.calls.clear();
            sinks.handleEvent(message, session_, "player");
        }
        return services_.calls;
    }

    Services services_;
    testing::FakeDeviceProperties device_;
};

TEST_F(MessageSinksTest, AnIssueGoesToAnalyticsBeforeTheMetrics) {
    const Message issue{{}, kAudioEventCategoryPlayback, kAudioEventTypeIssueDetector};
    EXPECT_THAT(handle(sinksOf(true), {issue}),
                ElementsAre("com.kestrel.halyard.Playback.IssueDetector",
                            "com.kestrel.haptics.Playback.IssueDetector", "metric"));
}

TEST_F(MessageSinksTest, ALeakGoesToAnalyticsThenTheLedgerThenIssueCapture) {
    EXPECT_THAT(handle(sinksOf(true), {leak(1), leak(2)}),
                ElementsAre("com.kestrel.halyard.Playback.EnergyLedger",
                            "com.kestrel.haptics.Playback.EnergyLedger", "LeakedHapticsSessionInfo",
                            "incident of player"));
}

TEST_F(MessageSinksTest, OtherBuildsThanInternalOnesCaptureNoIssues) {
    EXPECT_THAT(handle(sinksOf(false), {leak(1), leak(2)}),
                ElementsAre("com.kestrel.halyard.Playback.EnergyLedger",
                            "com.kestrel.haptics.Playback.EnergyLedger",
                            "LeakedHapticsSessionInfo"));
}

TEST_F(MessageSinksTest, IssueCaptureAloneAsksNoOtherSink) {
    MessageSinks sinks = sinksOf(true);
    sinks.captureIssue(leak(1), session_, std::nullopt);
    sinks.captureIssue(leak(2), session_, std::nullopt);
    EXPECT_THAT(services_.calls, ElementsAre("incident of (null)"));
}

} // namespace
} // namespace halyard
