// What the sinks see of the messages that are routed.

#include "service/ServiceFixture.h"

#include <algorithm>

namespace halyard {
namespace {

using namespace std::chrono_literals;
using protocol::ReporterIDs;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class MessageFanOutSinksTest : public ServiceTest {
protected:
    explicit MessageFanOutSinksTest(bool internalBuild = false) : ServiceTest(internalBuild) {
        platform_.analytics.usesAll = true;
    }

    static Peer::Answer send(const Peer& peer, std::uint16_t type, Dictionary message,
                             std::optional<ReporterIDs> ids) {
        return peer.ask(protocol::Method::SendMessage, {.dictionary = std::move(message),
                                                        .category = kAudioEventCategoryPlayback,
                                                        .type = type,
                                                        .reporterIDs = std::move(ids)});
    }
    // Analytics and the metric service see it.
    Peer::Answer sendIssue(std::optional<ReporterIDs> ids) {
        return send(client_, kAudioEventTypeIssueDetector, {}, std::move(ids));
    }
    // Analytics and the ledger see it and, of internal builds, issue capture.
    Peer::Answer sendLeak(const Peer& peer, int seconds) {
        return send(peer, kAudioEventTypeEnergyLedger,
                    {{"Haptic_Active_Hardware_Time_Seconds", seconds}}, ReporterIDs{7});
    }
    void expectNoSinkSawAnything() {
        EXPECT_THAT(platform_.analytics.asked, IsEmpty());
        EXPECT_THAT(platform_.energyLedger.events, IsEmpty());
        EXPECT_THAT(platform_.metrics.metrics, IsEmpty());
        EXPECT_THAT(platform_.incidentReporter.requests, IsEmpty());
    }
    // The place of a line in the log.
    std::ptrdiff_t lineOf(const std::string& text) const {
        const auto texts = platform_.log.texts();
        const auto at = std::find(texts.begin(), texts.end(), text);
        EXPECT_NE(at, texts.end()) << text;
        return at - texts.begin();
    }

    static constexpr const char* kSinkLine = "Failed to get issue_type for AudioIssueDetected";
    static constexpr const char* kSessionLine = "sending message for session owned by 7";
    const Peer client_ = connect(100);
};

TEST_F(MessageFanOutSinksTest, AnAddressedMessageReachesTheSinksBeforeTheSession) {
    client_.createAndStart(7);
    sendIssue(ReporterIDs{7});
    EXPECT_LT(lineOf(kSinkLine), lineOf(kSessionLine));
}

TEST_F(MessageFanOutSinksTest, ABroadcastReachesTheSessionBeforeTheSinks) {
    client_.createAndStart(7);
    sendIssue(std::nullopt);
    EXPECT_LT(lineOf(kSessionLine), lineOf(kSinkLine));
}

TEST_F(MessageFanOutSinksTest, WithThreeStartedSessionsEachSinkSeesThreeMessages) {
    for (const std::int64_t id : {7, 8, 9}) {
        client_.createAndStart(id);
    }
    sendIssue(std::nullopt);
    EXPECT_THAT(platform_.metrics.metrics, SizeIs(3));
    EXPECT_THAT(platform_.analytics.events, SizeIs(6)); // under two names each
    for (const std::int64_t id : {7, 8, 9}) {
        EXPECT_EQ(session(id)->messageIdentifierCount("Playback_IssueDetector"), 1U);
    }
}

TEST_F(MessageFanOutSinksTest, AnIDNamedTwiceIsOfferedTwice) {
    client_.createAndStart(7);
    sendIssue(ReporterIDs{7, 7});
    EXPECT_THAT(platform_.metrics.metrics, SizeIs(2));
    EXPECT_EQ(session(7)->messageIdentifierCount("Playback_IssueDetector"), 1U)
        << "the sinks see repeats, the batch does not";
}

TEST_F(MessageFanOutSinksTest, AStandaloneMessageReachesEachSinkOnce) {
    sendIssue(std::nullopt);
    EXPECT_THAT(platform_.metrics.metrics, SizeIs(1));
    ASSERT_THAT(platform_.analytics.events, SizeIs(2));
    EXPECT_EQ(platform_.analytics.events[0].name, "com.kestrel.halyard.Playback.IssueDetector");
    EXPECT_EQ(platform_.analytics.events[1].name, "com.kestrel.standalone.Playback.IssueDetector");
    EXPECT_EQ(platform_.analytics.events[0].builder(),
              (Dictionary{{"HostApplicationDisplayID", "Unknown"}}));
    platform_.queues.advance(1s);
    EXPECT_THAT(platform_.relayReporting.singles, SizeIs(1));
}

TEST_F(MessageFanOutSinksTest, TheStandaloneSessionIsATemporaryOfIDOne) {
    sendIssue(std::nullopt);
    EXPECT_TRUE(platform_.log.has(LogLevel::Info, HYReportingSessionCategory,
                                  "created reporting session for ID: 1"));
    EXPECT_LT(lineOf(kSinkLine),
              lineOf("no active reporting sessions found, sending as standalone"));
    platform_.analytics.events.clear(); // The last that held it.
    EXPECT_EQ(platform_.log.count("deallocing this session 1"), 1U);
    EXPECT_EQ(service_->activeSessionCount(), 0);
}

TEST_F(MessageFanOutSinksTest, WithReportingDisabledNoSinkSeesTheMessage) {
    client_.createAndStart(7);
    service_->setReportingEnabled(false);
    sendIssue(ReporterIDs{7});
    sendIssue(std::nullopt);
    expectNoSinkSawAnything();
}

TEST_F(MessageFanOutSinksTest, ZeroUnknownAndEmptyListsReachNoSink) {
    client_.createAndStart(7);
    EXPECT_TRUE(sendIssue(ReporterIDs{0, 99})->succeeded());
    EXPECT_TRUE(sendIssue(ReporterIDs{})->succeeded());
    expectNoSinkSawAnything();
}

TEST_F(MessageFanOutSinksTest, OtherBuildsThanInternalOnesCaptureNoIssues) {
    client_.createAndStart(7);
    for (const int seconds : {1, 2, 3, 4}) {
        sendLeak(client_, seconds);
    }
    EXPECT_THAT(platform_.energyLedger.events, SizeIs(4));
    EXPECT_THAT(platform_.incidentReporter.requests, IsEmpty());
}

class InternalFanOutTest : public MessageFanOutSinksTest {
protected:
    InternalFanOutTest() : MessageFanOutSinksTest(true) { client_.createAndStart(7); }
};

TEST_F(InternalFanOutTest, IssuesAreCapturedUnderTheSendersName) {
    const Peer sender = connect(200, "leaker");
    sendLeak(sender, 1);
    sendLeak(sender, 2);
    ASSERT_THAT(platform_.incidentReporter.requests, SizeIs(1));
    EXPECT_EQ(platform_.incidentReporter.requests[0].signature["detectedProcess"], Value("leaker"));
}

TEST_F(InternalFanOutTest, ASenderWithoutANameIsCapturedWithoutOne) {
    const Peer sender = connectOnly(300);
    sendLeak(sender, 1);
    sendLeak(sender, 2);
    ASSERT_THAT(platform_.incidentReporter.requests, SizeIs(1));
    EXPECT_FALSE(platform_.incidentReporter.requests[0].signature.contains("detectedProcess"));
}

} // namespace
} // namespace halyard
