#include "service/ServiceFixture.h"

#include <thread>

namespace halyard {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr const char* kUptimeEvent = "com.kestrel.halyard.hyreportingclientuptime";

class HYReportingServiceDelegateTest : public ServiceTest {
protected:
    HYReportingServiceDelegateTest() { platform_.analytics.usesAll = true; }

    std::vector<std::int64_t> activeIDs() const {
        std::vector<std::int64_t> ids;
        for (const auto& session : service_->getAllActiveReportingSessions()) {
            ids.push_back(session->reporterID());
        }
        return ids;
    }
};

TEST_F(HYReportingServiceDelegateTest, BeginsEnabledAndEmpty) {
    EXPECT_TRUE(service_->isReportingEnabled());
    EXPECT_EQ(service_->activeSessionCount(), 0);
    EXPECT_THAT(service_->getAllClients(), IsEmpty());
    const std::string_view queue = "com.kestrel.halyard.reporting.server";
    EXPECT_EQ(platform_.queues.queuesMade(queue), 1U);
    EXPECT_EQ(platform_.queues.priority(queue), platform::QueuePriority::UserInteractive);
}

TEST_F(HYReportingServiceDelegateTest, ListensForFeaturesBeforeItAsksTheDrivers) {
    platform_.log.clear();
    restartService();
    auto texts = platform_.log.texts();
    texts.resize(4);
    EXPECT_THAT(texts, ElementsAre(::testing::StartsWith("listening for features ("),
                                   "notify setup result 0 token 3", "notify setup result 0 token 4",
                                   "creating hwreporting driver utility"));
}

TEST_F(HYReportingServiceDelegateTest, ANewConnectionIsServedBeforeItIsResumed) {
    const Peer peer = connectOnly(100);
    EXPECT_EQ(peer.connection().resumed, 1);
    EXPECT_TRUE(peer.connection().exportedBeforeResume);
    EXPECT_TRUE(logged(LogLevel::Default, "newConnection: peer 100"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "new client with pid 100"));
}

TEST_F(HYReportingServiceDelegateTest, ClientsAreListedOnTheServiceQueue) {
    platform_.processTable.names[100] = "player";
    const Peer peer = connectOnly(100);
    EXPECT_THAT(service_->getAllClients(), IsEmpty());
    platform_.clock.advance(5s);
    run();
    ASSERT_THAT(service_->getAllClients(), SizeIs(1));
    const auto client = service_->getAllClients().front();
    EXPECT_EQ(client->processIdentifier(), 100);
    EXPECT_EQ(client->clientStartDate(), platform_.clock.wallTime());
    EXPECT_EQ(client->clientProcessName(), "player");
}

TEST_F(HYReportingServiceDelegateTest, ClientsStandInTheOrderOfTheirAcceptance) {
    const Peer first = connect(200);
    const Peer second = connect(100);
    EXPECT_EQ(service_->getAllClients().at(0)->processIdentifier(), 200);
    EXPECT_EQ(service_->getAllClients().at(1)->processIdentifier(), 100);
}

TEST_F(HYReportingServiceDelegateTest, ALookupOfZeroFindsNothingAndLogsNothing) {
    const Peer peer = connect(100);
    peer.create(0);
    platform_.log.clear();
    EXPECT_EQ(service_->findReportingSessionForID(0), nullptr);
    EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HYReportingServiceDelegateTest, WithReportingDisabledEveryLookupIsEmptyAndSilent) {
    const Peer peer = connect(100);
    peer.create(7);
    service_->setReportingEnabled(false);
    platform_.log.clear();
    EXPECT_EQ(service_->findReportingSessionForID(7), nullptr);
    EXPECT_EQ(service_->findReportingSessionForID(8), nullptr);
    EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(HYReportingServiceDelegateTest, OfTwoClientsWithOneIDTheFirstWins) {
    const Peer first = connect(200);
    const Peer second = connect(100);
    second.create(7);
    first.create(7);
    EXPECT_EQ(service_->findReportingSessionForID(7), session(7, 0));
    EXPECT_TRUE(logged(LogLevel::Info, "found reporting session 7 for client 200"));
}

TEST_F(HYReportingServiceDelegateTest, AFailedLookupIsAnError) {
    EXPECT_EQ(service_->findReportingSessionForID(-7), nullptr);
    EXPECT_TRUE(logged(LogLevel::Error, "failed to find reporting session -7"));
}

TEST_F(HYReportingServiceDelegateTest, LookupsOfOtherThreadsSeeWholeMaps) {
    const Peer peer = connect(100);
    std::thread reader([this] {
        for (int i = 0; i < 200; ++i) {
            const auto found = service_->findReportingSessionForID(7);
            EXPECT_TRUE(found == nullptr || found->reporterID() == 7);
        }
    });
    for (int i = 0; i < 50; ++i) {
        peer.create(7);
        connect(200).connection().invalidate();
        peer.destroy(7);
    }
    reader.join();
}

TEST_F(HYReportingServiceDelegateTest, ListsTheStartedSessionsOfAllClients) {
    const Peer first = connect(200);
    const Peer second = connect(100);
    second.createAndStart(1);
    first.createAndStart(3);
    first.create(2);
    platform_.log.clear();
    EXPECT_THAT(activeIDs(), ElementsAre(3, 1));
    EXPECT_THAT(platform_.log.texts(),
                ElementsAre("sessions for client 200 : (\n    \"" + session(2)->description() +
                                "\",\n    \"" + session(3)->description() + "\"\n)",
                            "sessions for client 100 : (\n    \"" + session(1, 1)->description() +
                                "\"\n)"));
}

TEST_F(HYReportingServiceDelegateTest, ALostConnectionReportsItsUptime) {
    const Peer peer = connect(100);
    platform_.clock.advance(90s + 750ms);
    peer.connection().invalidate();
    EXPECT_TRUE(logged(LogLevel::Default,
                       "invalidationHandler: connection exited process=player uptime_sec=90"));
    ASSERT_THAT(platform_.analytics.events, SizeIs(1));
    EXPECT_EQ(platform_.analytics.events[0].name, kUptimeEvent);
    EXPECT_EQ(platform_.analytics.events[0].builder(),
              (Dictionary{{"processName", "player"}, {"seconds", 90.75}}));
}

TEST_F(HYReportingServiceDelegateTest, AnUptimeThatNobodyWantsIsNotSent) {
    platform_.analytics.usesAll = false;
    const Peer peer = connect(100);
    peer.connection().invalidate();
    EXPECT_THAT(platform_.analytics.asked, ElementsAre(kUptimeEvent));
    EXPECT_THAT(platform_.analytics.events, IsEmpty());
}

TEST_F(HYReportingServiceDelegateTest, AStartDateInTheFutureStillGivesAPositiveUptime) {
    const Peer peer = connect(100);
    platform_.clock.setWallTime(platform_.clock.wallTime() - 10s);
    peer.connection().invalidate();
    EXPECT_TRUE(logged(LogLevel::Default, "clientStartDate is in the past. clientpid=100 "
                                          "clientprocessname=player"));
    EXPECT_EQ(platform_.analytics.events.at(0).builder()["seconds"], Value(10));
}

TEST_F(HYReportingServiceDelegateTest, AStartDateOfThisMomentLiesInNoFuture) {
    const Peer peer = connect(100);
    platform_.log.clear();
    peer.connection().invalidate();
    EXPECT_THAT(platform_.log.texts(),
                ElementsAre("invalidationHandler: connection exited process=player uptime_sec=0"));
    EXPECT_EQ(platform_.analytics.events.at(0).builder()["seconds"], Value(0));
}

TEST_F(HYReportingServiceDelegateTest, AConnectionLostAtOnceHasNoStartDate) {
    const Peer peer = connectOnly(100);
    peer.connection().invalidate();
    EXPECT_TRUE(logged(LogLevel::Default,
                       "clientStartDate is nil. clientpid=100 clientprocessname=unknown"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "invalidationHandler: connection exited process=unknown uptime_sec=-1"));
    EXPECT_THAT(platform_.analytics.events, IsEmpty());
    run();
    EXPECT_THAT(service_->getAllClients(), IsEmpty());
}

TEST_F(HYReportingServiceDelegateTest, AClientWithoutANameSendsNoUptime) {
    const Peer peer = connectOnly(100);
    run();
    peer.connection().invalidate();
    EXPECT_TRUE(logged(LogLevel::Default, "clientProcessName is nil. clientpid=100"));
    EXPECT_EQ(platform_.log.count("clientStartDate is nil. clientpid=100 "
                                  "clientprocessname=unknown"),
              0U);
    EXPECT_THAT(platform_.analytics.events, IsEmpty());
}

TEST_F(HYReportingServiceDelegateTest, TheUptimeOfAClientThatIsGoneIsUnknown) {
    const Peer peer = connect(100);
    peer.connection().interrupt();
    peer.connection().exported = nullptr;
    run();
    peer.connection().invalidate();
    EXPECT_TRUE(logged(LogLevel::Default,
                       "clientStartDate is nil. clientpid=100 clientprocessname=unknown"));
    EXPECT_TRUE(logged(LogLevel::Default, "clientProcessName is nil. clientpid=100"));
}

TEST_F(HYReportingServiceDelegateTest, ALostConnectionStopsItsSessionsAndLeavesTheList) {
    const Peer peer = connect(100);
    const Peer other = connect(200);
    peer.createAndStart(7);
    const auto lost = session(7);
    peer.connection().invalidate();
    EXPECT_TRUE(lost->started()) << "the service queue has not run";
    run();
    EXPECT_FALSE(lost->started());
    EXPECT_THAT(service_->getAllClients(), SizeIs(1));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "removing 100 from the server client list"));
    EXPECT_EQ(service_->activeSessionCount(), 1) << "only a stop request uncounts";
}

TEST_F(HYReportingServiceDelegateTest, AnInterruptionLeavesTheListWithoutAnUptimeEvent) {
    const Peer peer = connect(100);
    peer.createAndStart(7);
    const auto lost = session(7);
    peer.connection().interrupt();
    run();
    EXPECT_TRUE(logged(LogLevel::Default, "interruptionHandler: connection exited"));
    EXPECT_FALSE(lost->started());
    EXPECT_THAT(service_->getAllClients(), IsEmpty());
    EXPECT_THAT(platform_.analytics.events, IsEmpty());
}

TEST_F(HYReportingServiceDelegateTest, InterruptionAndInvalidationLeaveOnce) {
    const Peer peer = connect(100);
    peer.connection().interrupt();
    peer.connection().invalidate();
    run();
    EXPECT_EQ(platform_.log.count("removing 100 from the server client list"), 1U);
    EXPECT_THAT(platform_.analytics.events, SizeIs(1));
}

TEST_F(HYReportingServiceDelegateTest, AClientIsDestroyedWithItsConnection) {
    const Peer peer = connect(100);
    peer.create(7);
    peer.connection().invalidate();
    run();
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "dealloc 100 from the server client list"));
    EXPECT_EQ(platform_.log.count("deallocing this session 7"), 1U);
}

TEST_F(HYReportingServiceDelegateTest, WhatAClientAskedBeforeItWentIsStillDone) {
    const Peer peer = connectOnly(100);
    peer.connection().notify(
        protocol::Method::SendMessage,
        {.dictionary = {{"n", 1}}, .category = kAudioEventCategoryPlayback, .type = 1});
    peer.connection().interrupt();
    peer.connection().invalidate();
    platform_.queues.advance(1s);
    EXPECT_THAT(platform_.relayReporting.singles, SizeIs(1));
    EXPECT_THAT(service_->getAllClients(), IsEmpty());
}

TEST_F(HYReportingServiceDelegateTest, RemovingAStrangerIsNoError) {
    const Peer peer = connect(100);
    const auto stranger = HYReportingClientServerInstance::initWithPID(
        100, service_, service_->serviceQueue(), nullptr);
    onServiceQueue([&] { service_->removeClient(*stranger); });
    EXPECT_THAT(service_->getAllClients(), SizeIs(1));
}

#ifndef NDEBUG
using HYReportingServiceDelegateDeathTest = HYReportingServiceDelegateTest;

TEST_F(HYReportingServiceDelegateDeathTest, TheClientListChangesOnTheServiceQueueOnly) {
    const Peer peer = connect(100);
    EXPECT_DEATH(service_->removeClient(*service_->getAllClients().front()), "isCurrent");
}

TEST_F(HYReportingServiceDelegateDeathTest, SessionsStopOnTheServiceQueueOnly) {
    connect(100).createAndStart(7);
    EXPECT_DEATH(session(7)->stop(), "madeOn_");
}
#endif

} // namespace
} // namespace halyard
