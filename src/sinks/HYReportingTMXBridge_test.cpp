#include "sinks/HYReportingTMXBridge.h"

#include "sinks/SinkFixture.h"

namespace halyard {
namespace {

class HYReportingTMXBridgeTest : public SinkFixture {
protected:
    void handle(const Dictionary& message, AudioEventType type = kAudioEventTypeIssueDetector) {
        HYReportingTMXBridge::handleEvent(&message, kAudioEventCategoryPlayback, type, session_);
    }
};

const Dictionary kIssue{{"issue_type", "silence"},
                        {"rtaid_client", "mpv"},
                        {"node", 17},
                        {"any_channel_silence_seconds", 3.9}};

TEST_F(HYReportingTMXBridgeTest, PostsTheIssue) {
    handle(kIssue);
    ASSERT_EQ(metrics_.metrics.size(), 1U);
    EXPECT_EQ(metrics_.metrics[0].identifier, 5963779U);
    EXPECT_EQ(metrics_.metrics[0].message, "\x10\x03\x1A\x07silence\x22\x02"
                                           "17\x2A\x03mpv");
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(HYReportingTMXBridgeTest, MissingKeysAreLoggedAndTheIssueIsPostedStill) {
    handle({{"other", 1}});
    std::vector<testing::RecordingLog::Line> expected;
    for (const char* key : {"issue_type", "rtaid_client", "node", "any_channel_silence_seconds"}) {
        expected.push_back({LogLevel::Error, "hyra",
                            std::string("Failed to get ") + key + " for AudioIssueDetected"});
    }
    EXPECT_EQ(log_.lines(), expected);
    ASSERT_EQ(metrics_.metrics.size(), 1U);
    EXPECT_EQ(metrics_.metrics[0].message, std::string("\x10\x00\x1A\x00\x22\x00\x2A\x00", 8));
}

TEST_F(HYReportingTMXBridgeTest, OtherTypesPostNothing) {
    handle(kIssue, kAudioEventTypeEnergyLedger);
    handle(kIssue, 0x00010007);
    HYReportingTMXBridge::handleEvent(nullptr, 4, kAudioEventTypeIssueDetector, session_);
    EXPECT_TRUE(metrics_.metrics.empty());
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(HYReportingTMXBridgeTest, DurationsAreCutTo32Bits) {
    const auto durationOf = [](const Value& seconds) {
        return HYReportingTMXBridge::issueOf({{"any_channel_silence_seconds", seconds}}).duration;
    };
    EXPECT_EQ(durationOf(4294967297), 1);
    EXPECT_EQ(durationOf(4294967297.0), 1);
    EXPECT_EQ(durationOf(-1), -1);
    EXPECT_EQ(durationOf("12 s"), 12);
    EXPECT_EQ(durationOf(List()), 0);
}

TEST_F(HYReportingTMXBridgeTest, FieldsTakeTheTextFormOfAnyValue) {
    const auto issue = HYReportingTMXBridge::issueOf(
        {{"issue_type", 0.5}, {"rtaid_client", true}, {"node", List{Value("a b")}}});
    EXPECT_EQ(issue.issuetype, "0.5");
    EXPECT_EQ(issue.rtaidclient, "1");
    EXPECT_EQ(issue.node, "(\n    \"a b\"\n)");
    EXPECT_EQ(issue.timestamp, std::nullopt);
}

} // namespace
} // namespace halyard
