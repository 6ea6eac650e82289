#include "session/SessionEvents.h"
#include "session/SessionFixture.h"

namespace halyard {
namespace {

using namespace platform; // The many kRelayReporting... names.
using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Backends = testing::FakeRelayReporting::Backends;

class SessionRelayTest : public SessionTest {
protected:
    // A started session whose upload session waits for its back ends.
    std::shared_ptr<HYReportingSession> startWaitingSession() {
        platform_.relayReporting.backends = Backends::AnswerWhenTold;
        auto session = makeRelayedSession();
        session->start();
        run();
        return session;
    }
    std::shared_ptr<HYReportingSession> startConnectedSession() {
        auto session = makeRelayedSession();
        session->start();
        run();
        return session;
    }
    void sendNumber(HYReportingSession& session, int number) { send(session, {{"n", number}}); }
    std::size_t singles() const { return platform_.relayReporting.singles.size(); }
};

TEST_F(SessionRelayTest, OpensAnUploadSessionWithSixEntriesOfInformation) {
    startConnectedSession();
    EXPECT_EQ(upload().sessionInfo,
              (Dictionary{{kRelayReportingSessionInfoClientType, 19},
                          {kRelayReportingSessionInfoClientVersion, 2.1F},
                          {kRelayReportingSessionInfoSessionID, kReporterID},
                          {kRelayReportingSessionInfoBatchEvent, true},
                          {kRelayReportingSessionInfoHierarchyToken, "token-1"},
                          {kRelayReportingSessionInfoContainsRealtimeEvents, false}}));
    EXPECT_EQ(upload().userInfo,
              (Dictionary{{kRelayReportingUserInfoClientName, "com.kestrel.halyard"},
                          {kRelayReportingUserInfoServiceName, "longformaudio_session"}}));
    EXPECT_EQ(upload().sessionInfo[kRelayReportingSessionInfoClientVersion].kind(),
              Value::Kind::Float);
}

TEST_F(SessionRelayTest, ApiUsageIsNotBatchedButRealtime) {
    makeRelayedSession(kAudioServiceTypeAPIUsage)->start();
    run();
    EXPECT_EQ(upload().sessionInfo[kRelayReportingSessionInfoBatchEvent], Value(false));
    EXPECT_EQ(upload().sessionInfo[kRelayReportingSessionInfoContainsRealtimeEvents], Value(true));
}

TEST_F(SessionRelayTest, TheApplicationBecomesTheBundleOfTheUpload) {
    const auto session = makeRelayedSession();
    session->updateConfigurationWithContentsOfConfiguration(
        {{"VQHostApplicationDisplayID", "org.example.player"}});
    session->start();
    run();
    EXPECT_EQ(upload().sessionInfo[kRelayReportingSessionInfoClientBundleID],
              Value("org.example.player"));
    EXPECT_EQ(upload().userInfo["HostApplicationDisplayID"], Value("org.example.player"));
}

TEST_F(SessionRelayTest, ConfigurationOverridesTheUserInformation) {
    const auto session = makeRelayedSession();
    session->updateConfigurationWithContentsOfConfiguration(
        {{kRelayReportingUserInfoServiceName, "mine"}, {"extra", 1}});
    session->start();
    run();
    EXPECT_EQ(upload().userInfo,
              (Dictionary{{kRelayReportingUserInfoClientName, "com.kestrel.halyard"},
                          {kRelayReportingUserInfoServiceName, "mine"},
                          {"extra", 1}}));
}

TEST_F(SessionRelayTest, WhatIsSetAfterTheStartDoesNotReachTheOpening) {
    const auto session = makeRelayedSession();
    session->start();
    session->setServiceType(kAudioServiceTypeAPIUsage);
    session->updateConfigurationWithContentsOfConfiguration({{"late", 1}});
    run();
    EXPECT_EQ(upload().userInfo[kRelayReportingUserInfoServiceName],
              Value("longformaudio_session"));
    EXPECT_EQ(upload().sessionInfo[kRelayReportingSessionInfoBatchEvent], Value(true));
    EXPECT_FALSE(upload().userInfo.contains("late"));
}

TEST_F(SessionRelayTest, TestSessionsAndUnrelayedOnesOpenNoUploadSession) {
    const auto test = makeRelayedSession(kAudioServiceTypeTest);
    const auto unrelayed = makeSession();
    for (const auto& session : {test, unrelayed}) {
        session->start();
        sendNumber(*session, 1);
        session->stop();
    }
    platform_.queues.advance(60s);
    EXPECT_THAT(platform_.relayReporting.uploads, IsEmpty());
    EXPECT_EQ(singles(), 0U);
}

TEST_F(SessionRelayTest, AnOpeningThatFindsBackendsSaysSo) {
    const auto session = startWaitingSession();
    platform_.log.clear();
    upload().answer(List{Value("store"), Value("court")});
    run();
    EXPECT_TRUE(loggedByRelay(LogLevel::Default, "list of backends (\n    store,\n    court\n)"));
    EXPECT_TRUE(loggedByRelay(LogLevel::Default, "continuing with backends!"));
    EXPECT_TRUE(session->getRelayReportingStartedState());
    EXPECT_TRUE(session->hasRelayReportingSession());
}

TEST_F(SessionRelayTest, TheOpeningIsLoggedByTheRelayCategory) {
    startWaitingSession();
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "entering relayreporting openRelayReporting"));
    EXPECT_TRUE(loggedByRelay(LogLevel::Default, "waiting to find backends"));
}

TEST_F(SessionRelayTest, BackendsThatNeverAnswerAreAwaitedForExactlyNineSeconds) {
    const auto session = startWaitingSession();
    platform_.queues.advance(9s - 1ns);
    EXPECT_TRUE(session->hasRelayReportingSession());
    EXPECT_EQ(platform_.log.count("timed out waiting for backends"), 0U);
    platform_.queues.advance(1ns);
    EXPECT_TRUE(loggedByRelay(LogLevel::Default, "timed out waiting for backends"));
    EXPECT_FALSE(session->hasRelayReportingSession());
    EXPECT_TRUE(upload().closed);
}

TEST_F(SessionRelayTest, AnAnswerInTheLastNanosecondIsInTime) {
    const auto session = startWaitingSession();
    platform_.queues.advance(9s - 1ns);
    upload().answer(List{Value("store")});
    platform_.queues.advance(1min);
    EXPECT_TRUE(session->hasRelayReportingSession());
    EXPECT_EQ(platform_.log.count("timed out waiting for backends"), 0U);
}

TEST_F(SessionRelayTest, NoBackendsDropTheUploadSession) {
    platform_.relayReporting.backends = Backends::AnswerNone;
    const auto session = startConnectedSession();
    EXPECT_TRUE(loggedByRelay(LogLevel::Error,
                              "no backends found, this session won't get sent to the server"));
    EXPECT_TRUE(loggedByRelay(LogLevel::Default, "failed to find backend"));
    EXPECT_FALSE(session->hasRelayReportingSession());
    EXPECT_FALSE(session->getRelayReportingStartedState());
    EXPECT_TRUE(session->started());
}

TEST_F(SessionRelayTest, ALateAnswerLeavesTheFlagTrueWithoutAnUploadSession) {
    const auto session = startWaitingSession();
    platform_.queues.advance(9s);
    upload().answer(List{Value("store")});
    EXPECT_TRUE(session->getRelayReportingStartedState());
    EXPECT_FALSE(session->hasRelayReportingSession());
    sendNumber(*session, 1);
    run();
    EXPECT_THAT(upload().messages, IsEmpty());
}

TEST_F(SessionRelayTest, ALateAnswersSignalEndsTheNextOpeningsWait) {
    const auto session = startWaitingSession();
    platform_.queues.advance(9s);
    upload().answer(List{Value("store")});
    session->stop();
    session->start();
    run();
    EXPECT_TRUE(loggedByRelay(LogLevel::Default, "failed to find backend"))
        << "the signal is there, the flag was cleared by the closing";
    EXPECT_FALSE(session->hasRelayReportingSession());
}

TEST_F(SessionRelayTest, AnAnswerForAGoneSessionDoesNothing) {
    auto session = startWaitingSession();
    platform_.queues.advance(9s);
    session = nullptr;
    platform_.log.clear();
    upload().answer(List{Value("store")});
    EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(SessionRelayTest, AnUploadSessionThatLosesItsBackendsGetsNothingMore) {
    const auto session = startWaitingSession();
    upload().answer(List{Value("store")});
    run();
    upload().answer(std::nullopt);
    sendNumber(*session, 1);
    run();
    EXPECT_TRUE(session->hasRelayReportingSession());
    EXPECT_THAT(upload().messages, IsEmpty());
}

TEST_F(SessionRelayTest, MessagesSentRightAfterTheStartWaitForTheOpeningInOrder) {
    const auto session = startWaitingSession();
    for (const int number : {1, 2, 3}) {
        sendNumber(*session, number);
    }
    platform_.queues.advance(8s);
    EXPECT_THAT(upload().messages, IsEmpty());
    upload().answer(List{Value("store")});
    run();
    EXPECT_THAT(uploaded(), ElementsAre(1, 2, 3));
}

TEST_F(SessionRelayTest, MessagesSentDuringAnOpeningThatFailsAreLost) {
    const auto session = startWaitingSession();
    sendNumber(*session, 1);
    platform_.queues.advance(60s);
    EXPECT_THAT(upload().messages, IsEmpty());
    EXPECT_EQ(singles(), 0U);
    EXPECT_THAT(platform_.log.texts(LogLevel::Error), IsEmpty());
}

TEST_F(SessionRelayTest, AWaitingSessionHoldsNoOtherBack) {
    const auto waiting = startWaitingSession();
    platform_.relayReporting.backends = Backends::AnswerAtOnce;
    const auto other = startConnectedSession();
    sendNumber(*other, 1);
    run();
    EXPECT_THAT(uploaded(), ElementsAre(1));
}

TEST_F(SessionRelayTest, EachOpeningHasItsOwnToken) {
    const auto session = startConnectedSession();
    session->stop();
    session->start();
    run();
    EXPECT_EQ(upload().sessionInfo[kRelayReportingSessionInfoHierarchyToken], Value("token-2"));
}

TEST_F(SessionRelayTest, DeliversTheTaggedMessageUnderTheLowHalfOfItsCategory) {
    const auto session = startConnectedSession();
    session->sendMessage({{"a key", 1}}, kAudioEventCategoryGroupDSP | kAudioEventCategoryIO,
                         kAudioEventTypeUnknown, nullptr);
    run();
    ASSERT_EQ(upload().messages.size(), 1U);
    EXPECT_EQ(upload().messages[0].category, kAudioEventCategoryIO);
    EXPECT_EQ(upload().messages[0].type, kAudioEventTypeUnknown);
    EXPECT_EQ(upload().messages[0].payload,
              (Dictionary{{"a_key", 1}, {"audiotag", "DSP_IOUnknown"}}));
}

TEST_F(SessionRelayTest, ADeliveryIsLoggedWithTheClientsOwnMessage) {
    const auto session = startConnectedSession();
    platform_.log.clear();
    session->sendMessage({{"n", 1}}, kAudioEventCategoryGroupDSP | kAudioEventCategoryIO,
                         kAudioEventTypeStart, nullptr);
    run();
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "entering relayreporting deliver"));
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "RelayReportingAgent upload : message {\n"
                                               "    n = 1;\n} : category 268435463 : type 1"));
}

TEST_F(SessionRelayTest, ADeliveryIsLoggedWithSignedNumbers) {
    const auto session = startConnectedSession();
    session->sendMessage({}, kAudioEventCategoryGroupToolbox | kAudioEventCategoryIO, 0xFFFFFFFE,
                         nullptr);
    run();
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "RelayReportingAgent upload : message {\n} : "
                                               "category -2147483641 : type -2"));
}

TEST_F(SessionRelayTest, ARedundantMessageIsNotDelivered) {
    const auto session = startConnectedSession();
    sendNumber(*session, 1);
    sendNumber(*session, 1);
    sendNumber(*session, 2);
    run();
    EXPECT_THAT(uploaded(), ElementsAre(1, 2));
}

TEST_F(SessionRelayTest, AFailedDeliveryIsLostInSilence) {
    const auto session = startConnectedSession();
    platform_.relayReporting.failure = Error{"framework", 5, "full"};
    platform_.log.clear();
    sendNumber(*session, 1);
    run();
    EXPECT_THAT(platform_.log.texts(), ElementsAre("sending message for session owned by 7",
                                                   "entering relayreporting deliver"));
}

TEST_F(SessionRelayTest, StopDeliversWhatWasSentThenFlushesAndCloses) {
    const auto session = startConnectedSession();
    sendNumber(*session, 1);
    session->stop();
    EXPECT_FALSE(upload().closed) << "closing waits for its turn on the relay queue";
    run();
    EXPECT_THAT(uploaded(), ElementsAre(1));
    EXPECT_EQ(upload().flushes, 1);
    EXPECT_TRUE(upload().closed);
    EXPECT_FALSE(session->getRelayReportingStartedState());
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "entering relayreporting closeRelayReporting"));
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "stopping and setting session to nil"));
}

TEST_F(SessionRelayTest, StopSendsTheVolumesThenTheSummaryThenCloses) {
    const auto session = startConnectedSession();
    for (const bool playing : {true, false}) {
        send(*session, {{HYReportingMessageKeyVolume, 0.5},
                        {HYReportingMessageKeyPlayingState, playing},
                        {HYReportingMessageKeyHYTimestamp, playing ? 100 : 110}});
    }
    session->stop();
    run();
    ASSERT_EQ(upload().messages.size(), 4U);
    EXPECT_EQ(upload().messages[2].category, kAudioEventCategoryVolume);
    EXPECT_EQ(upload().messages[2].type, kAudioEventTypeSummary);
    EXPECT_EQ(upload().messages[3].category, 0xFFFF);
    EXPECT_EQ(upload().messages[3].type, kAudioEventTypeUnknown);
    EXPECT_EQ(upload().flushes, 1);
    EXPECT_TRUE(logged(LogLevel::Default, "sending volume event for reporter 7"));
    EXPECT_TRUE(logged(LogLevel::Default, "sending summary event for reporter 7"));
    EXPECT_THAT(platform_.analytics.asked, ElementsAre("com.kestrel.halyard.Volume.Summary",
                                                       "com.kestrel.longformaudio.Volume.Summary"));
}

TEST_F(SessionRelayTest, ASessionThatTookNothingHasNoSummary) {
    const auto session = startConnectedSession();
    session->stop();
    run();
    EXPECT_THAT(upload().messages, IsEmpty());
    EXPECT_EQ(upload().flushes, 1);
}

TEST_F(SessionRelayTest, AStopDuringTheOpeningClosesAfterIt) {
    const auto session = startWaitingSession();
    sendNumber(*session, 1);
    session->stop();
    run();
    EXPECT_FALSE(upload().closed);
    upload().answer(List{Value("store")});
    run();
    EXPECT_THAT(uploaded(), ElementsAre(1));
    EXPECT_EQ(upload().flushes, 1);
    EXPECT_TRUE(upload().closed);
}

TEST_F(SessionRelayTest, ClosingWithoutAnUploadSessionFlushesNothing) {
    platform_.relayReporting.backends = Backends::AnswerNone;
    const auto session = startConnectedSession();
    session->stop();
    run();
    EXPECT_EQ(upload().flushes, 0);
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "stopping and setting session to nil"));
}

TEST_F(SessionRelayTest, ASessionThatIsLetGoStillDeliversWhatItTook) {
    auto session = startWaitingSession();
    sendNumber(*session, 1);
    session = nullptr;
    upload().answer(List{Value("store")});
    run();
    EXPECT_THAT(uploaded(), ElementsAre(1));
}

TEST_F(SessionRelayTest, AMessageBeforeTheStartLeavesAloneAfterExactlyOneSecond) {
    const auto session = makeRelayedSession();
    sendNumber(*session, 1);
    run();
    EXPECT_TRUE(
        loggedByRelay(LogLevel::Debug, "session not started, will send as a single message"));
    platform_.queues.advance(1s - 1ns);
    EXPECT_EQ(singles(), 0U);
    platform_.queues.advance(1ns);
    ASSERT_EQ(singles(), 1U);
    const auto& single = platform_.relayReporting.singles[0];
    EXPECT_EQ(single.sessionInfo, (Dictionary{{kRelayReportingSessionInfoClientType, 19},
                                              {kRelayReportingSessionInfoClientVersion, 2.1F},
                                              {kRelayReportingSessionInfoSessionID, -1}}));
    EXPECT_EQ(single.userInfo,
              (Dictionary{{kRelayReportingUserInfoClientName, "com.kestrel.halyard"},
                          {kRelayReportingUserInfoServiceName, "longformaudio"}}));
    EXPECT_EQ(single.message.payload, (Dictionary{{"n", 1}, {"audiotag", "PlaybackStart"}}));
}

TEST_F(SessionRelayTest, MessagesAfterTheStopLeaveAloneToo) {
    const auto session = startConnectedSession();
    session->stop();
    sendNumber(*session, 1);
    sendNumber(*session, 1);
    platform_.queues.advance(1s);
    EXPECT_THAT(upload().messages, IsEmpty());
    EXPECT_EQ(singles(), 2U) << "without a batch nothing is a repeat";
}

TEST_F(SessionRelayTest, ASessionThatStartsMeanwhileStillSendsTheEarlierMessageAlone) {
    const auto session = makeRelayedSession();
    sendNumber(*session, 1);
    session->start();
    sendNumber(*session, 2);
    platform_.queues.advance(1s);
    EXPECT_THAT(uploaded(), ElementsAre(2));
    EXPECT_EQ(singles(), 1U);
}

} // namespace
} // namespace halyard
