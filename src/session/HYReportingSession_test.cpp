#include "session/SessionFixture.h"

#include <fmt/format.h>
#include <thread>

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

using HYReportingSessionTest = SessionTest;

TEST_F(HYReportingSessionTest, BeginsUnknownUnstartedAndUnrelayed) {
    const auto session = makeSession();
    EXPECT_EQ(session->serviceType(), kAudioServiceTypeUnknown);
    EXPECT_EQ(session->serviceName(), "unknown");
    EXPECT_FALSE(session->started());
    EXPECT_FALSE(session->relayReportingEnabled());
    EXPECT_FALSE(session->getRelayReportingStartedState());
    EXPECT_FALSE(session->shouldReportOrientation());
    EXPECT_TRUE(session->configuration().empty());
    EXPECT_THAT(session->processIdentifiers(), ElementsAre(kOwner));
    EXPECT_TRUE(logged(LogLevel::Info, "created reporting session for ID: 7"));
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044828));
}

TEST_F(HYReportingSessionTest, TheNamesThatClientsKnowStay) {
    EXPECT_STREQ(HYReportingSessionBlacklistFieldsKey, "_comparison_field_blacklist");
    EXPECT_STREQ(HYReportingSessionThrottleSecondsKey, "_throttle_seconds");
    EXPECT_STREQ(HYReportingRelayReportingTimeOut, "9.0");
    EXPECT_STREQ(HYReportingTraceType, "HYReportingTraceType");
    EXPECT_STREQ(HYReportingTraceTypeEvtap, "evtap");
    EXPECT_STREQ(HYReportingTraceTypeArtrace, "artrace");
    EXPECT_STREQ(HYReportingLoomisPlistFilePath, "HYReportingLoomisPlistFilePath");
    EXPECT_STREQ(HYReportingPerfProcesses, "HYReportingPerfProcesses");
    EXPECT_STREQ(HYReportingDelayPerfEndSnapShot, "HYReportingPerfEndDelay");
    EXPECT_STREQ(HYReportingTestName, "HYReportingTestName");
}

#ifndef NDEBUG
using HYReportingSessionDeathTest = SessionTest;

TEST_F(HYReportingSessionDeathTest, ItIsUsedWhereItWasMadeOnly) {
    const auto session = makeSession();
    const auto elsewhere = [this](const platform::Task& use) {
        const auto queue =
            platform_.queues.makeSerialQueue("elsewhere", platform::QueuePriority::Utility);
        queue->async([&use] { use(); });
        run();
    };
    EXPECT_DEATH(elsewhere([&] { session->start(); }), "madeOn_");
    EXPECT_DEATH(elsewhere([&] { session->stop(); }), "madeOn_");
    EXPECT_DEATH(elsewhere([&] { send(*session, {{"n", 1}}); }), "madeOn_");
}
#endif

TEST_F(HYReportingSessionTest, DescribesItself) {
    const auto session = HYReportingSession::initWithID(-9, {100, 200});
    session->setServiceType(kAudioServiceTypeAlarms);
    EXPECT_EQ(session->description(), "reporterID=-9,serviceName=alarms,ownerPid=100,"
                                      "HostApplicationDisplayID=Unknown,started=0");
    session->updateConfigurationWithContentsOfConfiguration(
        {{"HostApplicationDisplayID", "org.example.clock"}});
    session->start();
    EXPECT_EQ(session->description(), "reporterID=-9,serviceName=alarms,ownerPid=100,"
                                      "HostApplicationDisplayID=org.example.clock,started=1");
}

TEST_F(HYReportingSessionTest, DescribesWhatItHasBecomeSinceTheLastTime) {
    const auto session = HYReportingSession::initWithID(7, {100});
    const auto described = [&](const char* service, const char* name, int started) {
        return fmt::format("reporterID=7,serviceName={},ownerPid=100,HostApplicationDisplayID={},"
                           "started={}",
                           service, name, started);
    };
    EXPECT_EQ(session->description(), described("unknown", "Unknown", 0));
    session->setServiceType(kAudioServiceTypeAlarms);
    EXPECT_EQ(session->description(), described("alarms", "Unknown", 0));
    session->start();
    EXPECT_EQ(session->description(), described("alarms", "Unknown", 1));
    session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", 1e19}});
    EXPECT_EQ(session->description(), described("alarms", "1e+19", 1));
    session->updateConfigurationWithContentsOfConfiguration(
        {{"HostApplicationDisplayID", 10'000'000'000'000'000'000U}});
    EXPECT_EQ(session->description(), described("alarms", "10000000000000000000", 1));
    session->stop();
    EXPECT_EQ(session->description(), described("alarms", "10000000000000000000", 0));
}

TEST_F(HYReportingSessionTest, DescribesALongApplicationNameByItsBeginning) {
    const auto session = HYReportingSession::initWithID(-9, {100});
    session->updateConfigurationWithContentsOfConfiguration(
        {{"HostApplicationDisplayID", std::string(1'000'000, 'n')}});
    EXPECT_EQ(session->description(), "reporterID=-9,serviceName=unknown,ownerPid=100,"
                                      "HostApplicationDisplayID=" +
                                          std::string(256, 'n') +
                                          "... (999744 bytes more),started=0");
}

TEST_F(HYReportingSessionTest, WithoutAProcessItsOwnerIsZero) {
    EXPECT_EQ(HYReportingSession::initWithID(1, {})->description(),
              "reporterID=1,serviceName=unknown,ownerPid=0,"
              "HostApplicationDisplayID=Unknown,started=0");
}

TEST_F(HYReportingSessionTest, CountsTheRepeatsOfItsWholeLife) {
    const auto session = makeSession();
    EXPECT_EQ(session->redundantMessages(), 0U);
    for (int i = 0; i < 2; ++i) {
        session->start();
        send(*session, {{"n", 1}});
        send(*session, {{"n", 1}});
        session->stop();
    }
    EXPECT_EQ(session->redundantMessages(), 2U);
}

TEST_F(HYReportingSessionTest, NamesItsServiceType) {
    const auto session = makeSession();
    session->setServiceType(kAudioServiceTypeHaptics);
    EXPECT_EQ(session->serviceName(), "haptics");
    EXPECT_TRUE(logged(LogLevel::Info, "setting service type haptics"));
    session->setServiceType(4711);
    EXPECT_EQ(session->serviceType(), 4711);
    EXPECT_EQ(session->serviceName(), "telephony");
}

TEST_F(HYReportingSessionTest, ConfigurationIsMergedNeverReplaced) {
    const auto session = makeSession();
    const Dictionary first{{"kept", 1}, {"replaced", 2}};
    const Dictionary second{{"replaced", 3}};
    session->setConfiguration(&first);
    session->setConfiguration(&second);
    session->setConfiguration(nullptr);
    EXPECT_EQ(session->configuration(), (Dictionary{{"kept", 1}, {"replaced", 3}}));
}

TEST_F(HYReportingSessionTest, TheClientsApplicationNameServesAsTheHosts) {
    const auto session = makeSession();
    session->updateConfigurationWithContentsOfConfiguration(
        {{"VQHostApplicationDisplayID", "org.example.player"}});
    EXPECT_EQ(session->configuration(),
              (Dictionary{{"HostApplicationDisplayID", "org.example.player"},
                          {"VQHostApplicationDisplayID", "org.example.player"}}));
    EXPECT_THAT(session->description(),
                ::testing::HasSubstr("HostApplicationDisplayID=org.example.player,"));
}

TEST_F(HYReportingSessionTest, AnExplicitHostNameWinsOverTheClients) {
    const auto session = makeSession();
    session->updateConfigurationWithContentsOfConfiguration(
        {{"VQHostApplicationDisplayID", "client"}, {"HostApplicationDisplayID", "host"}});
    EXPECT_EQ(session->configuration()["HostApplicationDisplayID"], Value("host"));
}

TEST_F(HYReportingSessionTest, SetConfigurationKnowsNoClientsName) {
    const auto session = makeSession();
    const Dictionary configuration{{"VQHostApplicationDisplayID", "client"}};
    session->setConfiguration(&configuration);
    EXPECT_EQ(session->configuration(), configuration);
}

TEST_F(HYReportingSessionTest, StartIsLoggedAndMarked) {
    const auto session = makeSession();
    platform_.log.clear();
    session->start();
    EXPECT_TRUE(session->started());
    EXPECT_THAT(platform_.log.texts(), ElementsAre("starting session owned by 7"));
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044828, 0x2104482C));
    EXPECT_TRUE(platform_.traceMarks.argumentsAllZero);
}

TEST_F(HYReportingSessionTest, ASecondStartChangesNothing) {
    const auto session = makeSession();
    session->start();
    send(*session, {{"n", 1}});
    platform_.traceMarks.codes.clear();
    session->setRelayReportingEnabled(true);
    session->start();
    EXPECT_TRUE(logged(LogLevel::Info, "7 is already started"));
    EXPECT_THAT(identifiers(*session), ElementsAre("Playback_Start_1"));
    EXPECT_THAT(platform_.traceMarks.codes, IsEmpty());
    EXPECT_FALSE(platform_.queues.runOne()) << "opens no upload session";
}

TEST_F(HYReportingSessionTest, StopOfASessionThatNeverStartedOnlyLogsOnce) {
    const auto session = makeRelayedSession();
    platform_.log.clear();
    platform_.traceMarks.codes.clear();
    session->stop();
    EXPECT_THAT(platform_.log.lines(),
                ElementsAre(testing::RecordingLog::Line{
                    LogLevel::Debug, std::string(HYReportingSessionCategory), "ending session 7"}));
    EXPECT_THAT(platform_.traceMarks.codes, IsEmpty());
    EXPECT_FALSE(platform_.queues.runOne()) << "closes no upload session";
}

TEST_F(HYReportingSessionTest, StopLogsTwiceAndMarks) {
    const auto session = makeSession();
    session->start();
    platform_.traceMarks.codes.clear();
    session->stop();
    EXPECT_FALSE(session->started());
    EXPECT_EQ(platform_.log.count("ending session 7"), 2U);
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044830));
}

TEST_F(HYReportingSessionTest, ARestartBeginsWithAnEmptyBatchAndEmptyCounts) {
    const auto session = makeSession();
    session->start();
    send(*session, {{"n", 1}});
    session->stop();
    EXPECT_THAT(identifiers(*session), IsEmpty());
    session->start();
    EXPECT_EQ(session->messageIdentifierCount("Playback_Start"), 0U);
    send(*session, {{"n", 1}});
    EXPECT_THAT(identifiers(*session), ElementsAre("Playback_Start_1"));
}

TEST_F(HYReportingSessionTest, EachMilestoneIsMarkedWhereItsTurnIs) {
    platform_.logMarksAndQuestions();
    auto session = makeSession();
    session->start();
    send(*session, {});
    send(*session, {});
    session->stop();
    session = nullptr;
    auto texts = platform_.log.texts();
    EXPECT_THAT(std::vector(texts.begin(), texts.begin() + 9),
                ElementsAre("created reporting session for ID: 7", "mark 21044828",
                            "starting session owned by 7", "mark 2104482c",
                            "sending message for session owned by 7", "mark 21044838",
                            "sending message for session owned by 7", "dropping redundant event",
                            "mark 21044838"));
    EXPECT_THAT(std::vector(texts.begin() + 9, texts.begin() + 12),
                ElementsAre("ending session 7", "ending session 7", "mark 21044830"));
    EXPECT_THAT(std::vector(texts.end() - 2, texts.end()),
                ElementsAre("mark 21044834", "deallocing this session 7"));
    EXPECT_TRUE(logged(LogLevel::Info, "deallocing this session 7"));
    EXPECT_TRUE(platform_.traceMarks.argumentsAllZero);
}

TEST_F(HYReportingSessionTest, MakesItsRelayQueueOnFirstUseAndOnce) {
    const std::string_view name = "com.kestrel.halyard.session.relayreporting";
    const auto session = makeRelayedSession();
    EXPECT_EQ(platform_.queues.queuesMade(name), 0U);
    session->start();
    send(*session, {});
    EXPECT_EQ(platform_.queues.queuesMade(name), 1U);
    EXPECT_EQ(platform_.queues.priority(name), platform::QueuePriority::Utility);
}

TEST_F(HYReportingSessionTest, HandsBackTheTransactionItHeldBefore) {
    const auto session = makeSession();
    int calls = 0;
    EXPECT_FALSE(session->exchangeTransactionCompleteBlock([&](auto&, bool) { ++calls; }));
    session->exchangeTransactionCompleteBlock(nullptr)(std::nullopt, true);
    EXPECT_EQ(calls, 1);
    EXPECT_FALSE(session->exchangeTransactionCompleteBlock(nullptr));
}

TEST_F(HYReportingSessionTest, MessagesAreCleanedAndTaggedBeforeTheyAreBatched) {
    const auto session = makeSession();
    session->start();
    session->sendMessage({{"sample rate", 48000}},
                         kAudioEventCategoryGroupDSP | kAudioEventCategoryIO, kAudioEventTypeError,
                         nullptr);
    const auto batch = session->nestedAggregatedPayloadData();
    ASSERT_EQ(batch.size(), 1U);
    EXPECT_EQ(batch[0].identifier, "DSP_IO_Error_1");
    EXPECT_EQ(batch[0].message, (Dictionary{{"sample_rate", 48000}, {"audiotag", "DSP_IOError"}}));
}

TEST_F(HYReportingSessionTest, ASentMessageIsLoggedAndMarked) {
    const auto session = makeSession();
    session->start();
    platform_.log.clear();
    platform_.traceMarks.codes.clear();
    send(*session, {{"n", 1}});
    EXPECT_THAT(platform_.log.texts(), ElementsAre("sending message for session owned by 7"));
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044838));
}

TEST_F(HYReportingSessionTest, ARepeatIsDroppedFromTheBatch) {
    const auto session = makeSession();
    session->start();
    send(*session, {{"n", 1}, {"hyreporting_timestamp", 1.0}});
    EXPECT_EQ(platform_.log.count("dropping redundant event"), 0U);
    send(*session, {{"n", 1}, {"hyreporting_timestamp", 2.0}});
    EXPECT_TRUE(logged(LogLevel::Debug, "dropping redundant event"));
    EXPECT_EQ(session->messageIdentifierCount("Playback_Start"), 1U);
}

TEST_F(HYReportingSessionTest, NothingIsBatchedOrRepeatedBeforeStartAndAfterStop) {
    const auto session = makeSession();
    for (int i = 0; i < 2; ++i) {
        send(*session, {{"n", 1}});
        send(*session, {{"n", 1}});
        EXPECT_THAT(session->nestedAggregatedPayloadData(), IsEmpty());
        session->start();
        session->stop();
    }
    EXPECT_EQ(platform_.log.count("dropping redundant event"), 0U);
}

TEST_F(HYReportingSessionTest, RepliesAtOnceWithoutAnErrorWhateverBecomesOfTheMessage) {
    int replies = 0;
    const auto reply = [&](const MaybeError& error) { replies += error ? 100 : 1; };
    const auto session = makeSession(); // relay reporting is off
    session->sendMessage({}, kAudioEventCategoryPlayback, kAudioEventTypeStart, reply);
    EXPECT_EQ(replies, 1);
    session->start();
    session->sendMessage({}, kAudioEventCategoryPlayback, kAudioEventTypeStart, true, reply);
    EXPECT_EQ(replies, 2);
    session->sendMessage({}, kAudioEventCategoryPlayback, kAudioEventTypeStart, true, reply);
    EXPECT_EQ(replies, 3) << "the message was redundant";
}

TEST_F(HYReportingSessionTest, ReadersOnOtherThreadsSeeWholeValues) {
    const auto session = makeSession();
    session->start();
    std::thread reader([&] {
        for (int i = 0; i < 200; ++i) {
            const std::string name = session->serviceName();
            EXPECT_TRUE(name == "unknown" || name == "longformaudio" || name == "haptics") << name;
            (void)session->description();
            (void)session->configuration();
            (void)session->nestedAggregatedPayloadData();
        }
    });
    for (int i = 0; i < 200; ++i) {
        session->setServiceType(i % 2 == 0 ? kAudioServiceTypeLongFormAudio
                                           : kAudioServiceTypeHaptics);
        session->updateConfigurationWithContentsOfConfiguration({{"n", i}});
        send(*session, {{"n", i}});
    }
    reader.join();
    EXPECT_EQ(session->messageIdentifierCount("Playback_Start"), 200U);
}

} // namespace
} // namespace halyard
