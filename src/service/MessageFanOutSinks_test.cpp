// What the sinks see of the messages that are routed.

#include "service/ServiceFixture.h"

#include <algorithm>
#include <limits>

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

TEST_F(MessageFanOutSinksTest, AnIDNamedTwiceIsOfferedTwice) {
    client_.createAndStart(7);
    sendIssue(ReporterIDs{7, 7});
    EXPECT_THAT(platform_.metrics.metrics, SizeIs(2));
    EXPECT_EQ(session(7)->messageIdentifierCount("Playback_IssueDetector"), 1U)
        << "the sinks see repeats, the batch does not";
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

TEST_F(MessageFanOutSinksTest, OtherBuildsThanInternalOnesCaptureNoIssues) {
    client_.createAndStart(7);
    for (const int seconds : {1, 2, 3, 4}) {
        sendLeak(client_, seconds);
    }
    EXPECT_THAT(platform_.energyLedger.events, SizeIs(4));
    EXPECT_THAT(platform_.incidentReporter.requests, IsEmpty());
}

// All four sinks are at work, and one leak is enough for a trace of it: not a number
// equals nothing, so no report is taken for a repeat.
class InternalFanOutTest : public MessageFanOutSinksTest {
protected:
    InternalFanOutTest() : MessageFanOutSinksTest(true) { client_.createAndStart(7); }

    // One message for analytics and metrics, one for analytics, ledger and capture.
    void sendForAllSinks(const std::optional<ReporterIDs>& ids) {
        EXPECT_EQ(sendIssue(ids)->count, 1);
        send(client_, kAudioEventTypeEnergyLedger,
             {{"Haptic_Active_Hardware_Time_Seconds", std::numeric_limits<double>::quiet_NaN()}},
             ids);
    }
    // Each second report is one of the requests.
    std::size_t captured() const {
        return platform_.log.count("Incrementing IBX counter. player") +
               platform_.incidentReporter.requests.size();
    }
    void expectEachSinkSaw(std::size_t times) {
        EXPECT_THAT(platform_.metrics.metrics, SizeIs(times));
        EXPECT_THAT(platform_.energyLedger.events, SizeIs(times));
        EXPECT_EQ(captured(), times);
        EXPECT_THAT(platform_.analytics.events, SizeIs(4 * times)); // two messages, two names
    }
};

TEST_F(InternalFanOutTest, WithThreeStartedSessionsEachSinkSeesThreeMessages) {
    client_.createAndStart(8);
    connect(200).createAndStart(9);
    client_.create(10);
    sendForAllSinks(std::nullopt);
    expectEachSinkSaw(3);
    EXPECT_EQ(session(7)->messageIdentifierCount("Playback_IssueDetector"), 1U);
    EXPECT_EQ(session(8)->messageIdentifierCount("Playback_IssueDetector"), 1U);
    EXPECT_EQ(session(9, 1)->messageIdentifierCount("Playback_IssueDetector"), 1U);
}

TEST_F(InternalFanOutTest, AnAddressedMessageReachesEachSinkOnce) {
    client_.createAndStart(8);
    sendForAllSinks(ReporterIDs{7});
    expectEachSinkSaw(1);
}

TEST_F(InternalFanOutTest, AStandaloneMessageReachesEachSinkOnce) {
    client_.stop(7);
    sendForAllSinks(std::nullopt);
    expectEachSinkSaw(1);
    EXPECT_EQ(platform_.analytics.events[0].name, "com.kestrel.halyard.Playback.IssueDetector");
    EXPECT_EQ(platform_.analytics.events[1].name, "com.kestrel.standalone.Playback.IssueDetector");
    EXPECT_EQ(platform_.analytics.events[0].builder(),
              (Dictionary{{"HostApplicationDisplayID", "Unknown"}}));
    platform_.queues.advance(1s);
    EXPECT_THAT(platform_.relayReporting.singles, SizeIs(2)) << "one for each of the two";
}

TEST_F(InternalFanOutTest, WithReportingDisabledNoSinkSeesTheMessage) {
    service_->setReportingEnabled(false);
    sendForAllSinks(ReporterIDs{7});
    sendForAllSinks(std::nullopt);
    expectEachSinkSaw(0);
    EXPECT_THAT(platform_.analytics.asked, IsEmpty());
}

TEST_F(InternalFanOutTest, ZeroUnknownAndEmptyListsReachNoSink) {
    sendForAllSinks(ReporterIDs{0, 99});
    sendForAllSinks(ReporterIDs{});
    expectEachSinkSaw(0);
    EXPECT_THAT(platform_.analytics.asked, IsEmpty());
}

TEST_F(InternalFanOutTest, IssuesAreCapturedUnderTheSendersName) {
    const Peer sender = connect(200, "leaker");
    sendLeak(sender, 1);
    sendLeak(sender, 2);
    ASSERT_THAT(platform_.incidentReporter.requests, SizeIs(1));
    EXPECT_EQ(platform_.incidentReporter.requests[0].signature["detectedProcess"], Value("leaker"));
}

TEST_F(InternalFanOutTest, TheSendersNameIsThatOfTheTimeOfSending) {
    const Peer sender = connect(200, "leaker");
    for (const int seconds : {1, 2}) {
        sender.connection().notify(
            protocol::Method::SendMessage,
            {.dictionary = {{"Haptic_Active_Hardware_Time_Seconds", seconds}},
             .category = kAudioEventCategoryPlayback,
             .type = kAudioEventTypeEnergyLedger,
             .reporterIDs = ReporterIDs{7}});
    }
    platform_.processTable.names[200] = "another";
    run();
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

TEST_F(InternalFanOutTest, TheServiceObjectOffersToIssueCaptureAlone) {
    for (const int seconds : {1, 2}) {
        onServiceQueue([&] {
            service_->handleEventForIBX({{"Haptic_Active_Hardware_Time_Seconds", seconds}},
                                        kAudioEventCategoryPlayback, kAudioEventTypeEnergyLedger,
                                        session(7), "leaker");
        });
    }
    EXPECT_THAT(platform_.incidentReporter.requests, SizeIs(1));
    EXPECT_THAT(platform_.energyLedger.events, IsEmpty());
}

} // namespace
} // namespace halyard
