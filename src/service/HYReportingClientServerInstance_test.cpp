#include "service/HYReportingClientServerInstance.h"

#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class HYReportingClientServerInstanceTest : public ServiceTest {
protected:
    // Sessions with IDs from 101 on.
    void startSessions(int count) {
        for (int i = 1; i <= count; ++i) {
            client_.createAndStart(100 + i);
        }
    }
    void forgetLog() {
        platform_.log.clear();
        platform_.traceMarks.codes.clear();
    }

    const Peer client_ = connect(100);
    const Peer other_ = connect(200);
};

TEST_F(HYReportingClientServerInstanceTest, CreatesASessionOfItsOwnProcess) {
    forgetLog();
    EXPECT_TRUE(succeeded(client_.create(7)));
    EXPECT_THAT(session(7)->processIdentifiers(), ElementsAre(100));
    EXPECT_TRUE(session(7)->relayReportingEnabled());
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "creating session for reporter 7"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "session created for reporter 7"));
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044814, 0x21044828));
    EXPECT_TRUE(platform_.traceMarks.argumentsAllZero);
}

TEST_F(HYReportingClientServerInstanceTest, CreatingAnIDAgainReplacesTheSession) {
    client_.create(7);
    client_.setServiceType(kAudioServiceTypeAlarms, 7);
    client_.create(7);
    EXPECT_EQ(session(7)->serviceType(), kAudioServiceTypeUnknown);
    EXPECT_EQ(platform_.log.count("deallocing this session 7"), 1U);
}

TEST_F(HYReportingClientServerInstanceTest, ARunningSessionThatIsReplacedIsNotStopped) {
    client_.createAndStart(7);
    const auto replaced = session(7);
    client_.create(7);
    EXPECT_NE(session(7), replaced);
    EXPECT_FALSE(session(7)->started());
    EXPECT_TRUE(replaced->started());
    EXPECT_EQ(platform_.log.count("ending session 7"), 0U);
    EXPECT_EQ(service_->activeSessionCount(), 1);
}

TEST_F(HYReportingClientServerInstanceTest, CreatesNoUploadedSessionWhileSixAreActive) {
    startSessions(5);
    client_.create(1);
    EXPECT_TRUE(session(1)->relayReportingEnabled());
    client_.createAndStart(106);
    client_.create(2);
    EXPECT_EQ(service_->activeSessionCount(), 6);
    EXPECT_FALSE(session(2)->relayReportingEnabled());
}

TEST_F(HYReportingClientServerInstanceTest, TheSixthConcurrentSessionIsNotUploaded) {
    startSessions(6);
    EXPECT_TRUE(session(105)->relayReportingEnabled());
    EXPECT_FALSE(session(106)->relayReportingEnabled());
    EXPECT_EQ(platform_.relayReporting.uploads.size(), 5U);
}

TEST_F(HYReportingClientServerInstanceTest, AStopMakesRoomForAnUpload) {
    startSessions(6);
    client_.stop(101);
    client_.stop(106);
    client_.start(106);
    EXPECT_TRUE(session(106)->relayReportingEnabled());
}

TEST_F(HYReportingClientServerInstanceTest, SetsTheServiceType) {
    client_.create(7);
    EXPECT_TRUE(succeeded(client_.setServiceType(kAudioServiceTypeAlarms, 7)));
    EXPECT_EQ(session(7)->serviceType(), kAudioServiceTypeAlarms);
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "setting service type 4 for reporter 7"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "service type 4 set for reporter  7"));
}

TEST_F(HYReportingClientServerInstanceTest, SetsNothingOnAnotherClientsSession) {
    client_.create(7);
    EXPECT_TRUE(succeeded(other_.setServiceType(kAudioServiceTypeAlarms, 7)));
    EXPECT_TRUE(succeeded(other_.configure({{"n", 1}}, 7)));
    EXPECT_TRUE(succeeded(other_.start(7)));
    EXPECT_TRUE(succeeded(other_.destroy(7)));
    ASSERT_NE(session(7), nullptr);
    EXPECT_EQ(session(7)->serviceType(), kAudioServiceTypeUnknown);
    EXPECT_TRUE(session(7)->configuration().empty());
    EXPECT_FALSE(session(7)->started());
    EXPECT_EQ(platform_.log.count("service type 4 set for reporter  7"), 0U);
}

// It would hold up everybody on a thread that was lent.
TEST_F(HYReportingClientServerInstanceTest, WhatMayWaitForATraceIsLeftToTheQueuesOwnThread) {
    for (const auto type : {kAudioServiceTypeAlarms, kAudioServiceTypeTest}) {
        client_.create(7);
        client_.setServiceType(type, 7);
        client_.start(7);
        client_.connection().send(protocol::Method::StopReportingSessionForID, {.reporterID = 7});
        platform_.queues.runOne();
        EXPECT_EQ(session(7)->started(), type == kAudioServiceTypeTest);
        run();
        EXPECT_FALSE(session(7)->started());
    }
}

TEST_F(HYReportingClientServerInstanceTest, StopsNoOtherClientsSession) {
    client_.createAndStart(7);
    EXPECT_TRUE(succeeded(other_.stop(7)));
    EXPECT_TRUE(session(7)->started());
    EXPECT_EQ(service_->activeSessionCount(), 1);
}

TEST_F(HYReportingClientServerInstanceTest, AnswersTheServiceTypeOfAnotherClientsSession) {
    client_.create(7);
    client_.setServiceType(kAudioServiceTypeAlarms, 7);
    EXPECT_EQ(other_.serviceType(7)->result, Value(4));
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "fetching seviceType"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "returning service type 4 for reporter  7"));
}

TEST_F(HYReportingClientServerInstanceTest, PrefersItsOwnSessionInALookup) {
    client_.create(7);
    other_.create(7);
    other_.setServiceType(kAudioServiceTypeAlarms, 7);
    EXPECT_EQ(other_.serviceType(7)->result, Value(4));
    EXPECT_EQ(client_.serviceType(7)->result, Value(65535));
}

TEST_F(HYReportingClientServerInstanceTest, AnUnknownSessionsServiceTypeIsUnknown) {
    EXPECT_EQ(client_.serviceType(7)->result, Value(65535));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "returning service type 65535 for reporter  7"));
    forgetLog();
    EXPECT_EQ(client_.serviceType(0)->result, Value(65535));
    EXPECT_THAT(platform_.log.texts(), ElementsAre("fetching seviceType"));
}

TEST_F(HYReportingClientServerInstanceTest, MergesTheConfiguration) {
    client_.create(7);
    client_.configure({{"VQHostApplicationDisplayID", "player"}}, 7);
    EXPECT_TRUE(succeeded(client_.configure({{"n", 1}}, 7)));
    EXPECT_EQ(session(7)->configuration()["HostApplicationDisplayID"], Value("player"));
    EXPECT_EQ(session(7)->configuration()["n"], Value(1));
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "setting configuration"));
}

TEST_F(HYReportingClientServerInstanceTest, AStartIsAnsweredWhenTheSessionStops) {
    client_.create(7);
    const auto started = client_.start(7);
    platform_.queues.advance(1h);
    EXPECT_FALSE(started->given());
    EXPECT_TRUE(succeeded(client_.stop(7)));
    EXPECT_TRUE(succeeded(started));
}

TEST_F(HYReportingClientServerInstanceTest, TheHeldStartIsAnsweredBeforeTheStop) {
    client_.create(7);
    const auto started = client_.start(7);
    const auto stopped = client_.stop(7);
    EXPECT_TRUE(succeeded(started));
    EXPECT_TRUE(succeeded(stopped));
    const auto& answered = client_.connection().answered();
    ASSERT_EQ(answered.size(), 3U);
    EXPECT_EQ(answered[1], started);
    EXPECT_EQ(answered[2], stopped);
}

TEST_F(HYReportingClientServerInstanceTest, AStopTellsWhoIsLeft) {
    client_.createAndStart(7);
    forgetLog();
    client_.stop(7);
    EXPECT_THAT(
        platform_.log.texts(LogLevel::Default),
        ElementsAre("sessions for client 100 : (\n    \"" + session(7)->description() + "\"\n)",
                    "sessions for client 200 : (\n)", "0 active reporting session(s) (\n)",
                    "stopping 7"));
}

TEST_F(HYReportingClientServerInstanceTest, OfManySessionsALineNamesTheFirstSixteen) {
    for (std::int64_t id = 1; id <= 20; ++id) {
        client_.create(id);
    }
    client_.start(20);
    std::string named;
    for (std::int64_t id = 1; id <= 16; ++id) {
        named += "    \"" + session(id)->description() + "\",\n";
    }
    EXPECT_TRUE(logged(LogLevel::Default,
                       "sessions for client 100 : (\n" + named + "    \"and 4 more\"\n)"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "1 active reporting session(s) (\n    \"" +
                                                      session(20)->description() + "\"\n)"));
}

TEST_F(HYReportingClientServerInstanceTest, OfManyClientsALineTellsTheNumber) {
    for (std::int32_t pid = 1; pid <= 20; ++pid) {
        connect(pid).create(pid);
    }
    client_.create(99);
    forgetLog();
    client_.start(99);
    EXPECT_TRUE(logged(LogLevel::Default, "sessions for client 14 : (\n    \"" +
                                              session(14, 15)->description() + "\"\n)"));
    EXPECT_EQ(platform_.log.countOf("sessions for client ", LogLevel::Default), 16U);
    EXPECT_TRUE(logged(LogLevel::Default, "sessions for 6 more clients : 6"));
}

TEST_F(HYReportingClientServerInstanceTest, AStartAnswersTheEarlierStartThatIsStillHeld) {
    client_.create(7);
    const auto earlier = client_.start(7);
    // Not by a request, which would answer it.
    onServiceQueue([&] { session(7)->stop(); });
    const auto later = client_.start(7);
    EXPECT_TRUE(succeeded(earlier));
    EXPECT_FALSE(later->given());
}

TEST_F(HYReportingClientServerInstanceTest, AStartOfAStartedSessionIsAnsweredAtOnce) {
    client_.create(7);
    const auto first = client_.start(7);
    EXPECT_TRUE(succeeded(client_.start(7)));
    EXPECT_FALSE(first->given());
    EXPECT_EQ(service_->activeSessionCount(), 1);
}

TEST_F(HYReportingClientServerInstanceTest, StartsOfNoSessionAreAnsweredAtOnce) {
    EXPECT_TRUE(succeeded(client_.start(0)));
    EXPECT_TRUE(succeeded(client_.start(7)));
    EXPECT_EQ(service_->activeSessionCount(), 0);
}

TEST_F(HYReportingClientServerInstanceTest, AStartIsLoggedAndMarkedBeforeTheSession) {
    client_.create(7);
    forgetLog();
    client_.start(7);
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044818, 0x2104482C));
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "starting session for reporter 7"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "1 active reporting session(s) (\n    \"" +
                                                      session(7)->description() + "\"\n)"));
}

TEST_F(HYReportingClientServerInstanceTest, ATestSessionUnderTracingIsAnsweredAtOnceAndOnce) {
    platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = true;
    client_.create(7);
    client_.setServiceType(kAudioServiceTypeTest, 7);
    const auto started = client_.start(7);
    EXPECT_TRUE(succeeded(started));
    client_.stop(7);
    EXPECT_EQ(started->count, 1);
}

TEST_F(HYReportingClientServerInstanceTest, TestAloneOrTracingAloneHoldsTheAnswer) {
    client_.create(7);
    client_.setServiceType(kAudioServiceTypeTest, 7);
    EXPECT_FALSE(client_.start(7)->given());
    platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = true;
    client_.create(8);
    EXPECT_FALSE(client_.start(8)->given());
}

TEST_F(HYReportingClientServerInstanceTest, AStopUncountsAndIsMarked) {
    client_.createAndStart(7);
    forgetLog();
    EXPECT_TRUE(succeeded(client_.stop(7)));
    EXPECT_FALSE(session(7)->started());
    EXPECT_EQ(service_->activeSessionCount(), 0);
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x2104481C, 0x21044830));
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "stopping session for reporter 7"));
}

TEST_F(HYReportingClientServerInstanceTest, AStopOfNoStartedSessionOnlyLogs) {
    client_.create(7);
    forgetLog();
    EXPECT_TRUE(succeeded(client_.stop(7)));
    EXPECT_TRUE(succeeded(client_.stop(8)));
    EXPECT_TRUE(succeeded(client_.stop(0)));
    EXPECT_THAT(platform_.log.texts(LogLevel::Default), ElementsAre("stopping 7", "stopping 8"));
    EXPECT_EQ(service_->activeSessionCount(), 0);
}

TEST_F(HYReportingClientServerInstanceTest, DestroysASession) {
    client_.create(7);
    forgetLog();
    EXPECT_TRUE(succeeded(client_.destroy(7)));
    EXPECT_EQ(session(7), nullptr);
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044820, 0x21044834));
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "destroying session for reporter 7"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "destroying 7"));
}

TEST_F(HYReportingClientServerInstanceTest, DestroyingNoSessionOnlyLogs) {
    forgetLog();
    EXPECT_TRUE(succeeded(client_.destroy(7)));
    EXPECT_TRUE(succeeded(client_.destroy(0)));
    EXPECT_THAT(platform_.log.texts(LogLevel::Default), ElementsAre("destroying 7"));
}

TEST_F(HYReportingClientServerInstanceTest, DestroyingAStartedSessionLeavesTheCountTooHigh) {
    client_.createAndStart(7);
    const auto destroyed = session(7);
    client_.destroy(7);
    EXPECT_FALSE(destroyed->started());
    EXPECT_EQ(service_->activeSessionCount(), 1);
}

TEST_F(HYReportingClientServerInstanceTest, ValidatesReportersOfAllClients) {
    client_.create(7);
    client_.setServiceType(kAudioServiceTypeAlarms, 7);
    forgetLog();
    EXPECT_EQ(other_.validate(7)->result, (Dictionary{{"reporterID", 7}, {"serviceType", 4}}));
    EXPECT_EQ(platform_.log.count("validating reporter 7"), 2U);
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "validating reporter 7"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "validating reporter 7"));
}

TEST_F(HYReportingClientServerInstanceTest, AnUnknownReporterIsNotValid) {
    const Dictionary invalid{{"reporterID", 0}, {"serviceType", 65535}};
    EXPECT_EQ(client_.validate(7)->result, invalid);
    client_.create(0);
    EXPECT_EQ(client_.validate(0)->result, invalid) << "ID 0 means no session";
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "validating reporter 7"));
}

TEST_F(HYReportingClientServerInstanceTest, ListsTheReportersOfAllClients) {
    EXPECT_EQ(client_.ask(protocol::Method::GetAllReporters)->result, List());
    other_.create(1);
    client_.create(3);
    client_.create(-2);
    client_.create(0);
    EXPECT_EQ(other_.ask(protocol::Method::GetAllReporters)->result,
              (List{Value(-2), Value(0), Value(3), Value(1)}));
}

TEST_F(HYReportingClientServerInstanceTest, NoLookupFindsTheSessionOfIDZero) {
    client_.create(0);
    client_.setServiceType(kAudioServiceTypeAlarms, 0);
    client_.configure({{"n", 1}}, 0);
    client_.start(0);
    client_.destroy(0);
    ASSERT_NE(session(0), nullptr);
    EXPECT_EQ(session(0)->serviceType(), kAudioServiceTypeUnknown);
    EXPECT_TRUE(session(0)->configuration().empty());
    EXPECT_FALSE(session(0)->started());
}

TEST_F(HYReportingClientServerInstanceTest, KillEndsTheProcessWithStatusTwo) {
    client_.ask(protocol::Method::KillService);
    EXPECT_THAT(platform_.ownProcess.terminations, ElementsAre(2));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "DESTROYING SERVICE"));
}

TEST_F(HYReportingClientServerInstanceTest, RequestsWaitForTheServiceQueueInTheirOrder) {
    const auto created =
        client_.connection().send(protocol::Method::CreateReportingSession, {.reporterID = 7});
    client_.connection().notify(protocol::Method::SetServiceType,
                                {.reporterID = 7, .serviceType = kAudioServiceTypeAlarms});
    EXPECT_FALSE(created->given());
    run();
    EXPECT_EQ(session(7)->serviceType(), kAudioServiceTypeAlarms);
}

TEST_F(HYReportingClientServerInstanceTest, TheRequestsOfAGoneClientAreDropped) {
    client_.connection().interrupt();
    run();
    const auto created =
        client_.connection().send(protocol::Method::CreateReportingSession, {.reporterID = 7});
    client_.connection().exported = nullptr;
    forgetLog();
    run();
    EXPECT_EQ(created->error->code, 4);
    EXPECT_THAT(platform_.log.texts(), IsEmpty());
}

TEST_F(HYReportingClientServerInstanceTest, TheRequestsOfAGoneServiceAreDropped) {
    service_ = nullptr;
    EXPECT_EQ(client_.create(7)->error->code, 4);
}

} // namespace
} // namespace halyard
