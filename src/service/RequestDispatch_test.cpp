#include "service/RequestDispatch.h"

#include "protocol/Wire.h"
#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using protocol::Method;
using ::testing::ElementsAre;
using ::testing::SizeIs;

// Takes down what it is asked and keeps the replies.
class RecordingClient final : public HYReportingServiceProtocol {
public:
    void createReportingSession(std::int64_t id, BoolReply reply) override {
        take({"create", id}, std::move(reply));
    }
    void setServiceType(AudioServiceType type, std::int64_t id, BoolReply reply) override {
        take({"type", type, id}, std::move(reply));
    }
    void getServiceNameForReporterID(std::int64_t id, ServiceTypeReply reply) override {
        asked = {"name", id};
        reply(std::nullopt, kAudioServiceTypeAlarms);
    }
    void setConfiguration(Dictionary configuration, std::int64_t id, BoolReply reply) override {
        take({"configure", configuration, id}, std::move(reply));
    }
    void startReportingSessionForID(std::int64_t id, BoolReply reply) override {
        take({"start", id}, std::move(reply));
    }
    void sendMessage(Dictionary message, AudioEventCategory category, std::uint16_t type,
                     std::optional<std::vector<std::int64_t>> ids, ErrorReply reply) override {
        asked = {"send", message, category, type, ids ? ids->at(0) : -1};
        reply(std::nullopt);
    }
    void stopReportingSessionForID(std::int64_t id, BoolReply reply) override {
        take({"stop", id}, std::move(reply));
    }
    void destroyReportingSession(std::int64_t id, BoolReply reply) override {
        take({"destroy", id}, std::move(reply));
    }
    void reporterID(std::int64_t id, DictionaryReply valid) override {
        asked = {"valid", id};
        valid(std::nullopt, {{"reporterID", id}});
    }
    void getAllReporters(ListReply reply) override {
        asked = {"all"};
        reply(std::nullopt, {Value(1), Value(2)});
    }
    void killService(BoolReply reply) override { take({"kill"}, std::move(reply)); }

    std::vector<Value> asked;
    BoolReply held;

private:
    void take(std::vector<Value> request, BoolReply reply) {
        asked = std::move(request);
        held = std::move(reply);
    }
};

class RequestDispatchTest : public ServiceTest {
protected:
    std::shared_ptr<testing::Answer> ask(Method method, protocol::Arguments arguments = {}) {
        connection_.exported =
            std::make_shared<RequestDispatch>(client_, service_, service_->serviceQueue());
        return connection_.send(method, std::move(arguments));
    }

    const std::shared_ptr<RecordingClient> client_ = std::make_shared<RecordingClient>();
    testing::FakeConnection connection_{100};
};

struct BoolRequest {
    Method method;
    std::vector<Value> asked;
};

void PrintTo(const BoolRequest& request, std::ostream* out) {
    *out << protocol::methodName(request.method);
}

class BoolRequestTest : public RequestDispatchTest,
                        public ::testing::WithParamInterface<BoolRequest> {};

TEST_P(BoolRequestTest, ReachesItsMethodAndAnswersWhatThatReplies) {
    const auto answer =
        ask(GetParam().method, {.reporterID = 7, .serviceType = 4, .dictionary = {{"n", 1}}});
    EXPECT_EQ(client_->asked, GetParam().asked);
    EXPECT_FALSE(answer->given());
    client_->held(std::nullopt, true);
    EXPECT_TRUE(succeeded(answer));
    client_->held(std::nullopt, false);
    EXPECT_TRUE(succeeded(answer)) << "one request is answered once";
}

INSTANTIATE_TEST_SUITE_P(
    All, BoolRequestTest,
    ::testing::Values(BoolRequest{Method::CreateReportingSession, {"create", 7}},
                      BoolRequest{Method::SetServiceType, {"type", 4, 7}},
                      BoolRequest{Method::SetConfiguration, {"configure", Dictionary{{"n", 1}}, 7}},
                      BoolRequest{Method::StartReportingSessionForID, {"start", 7}},
                      BoolRequest{Method::StopReportingSessionForID, {"stop", 7}},
                      BoolRequest{Method::DestroyReportingSession, {"destroy", 7}},
                      BoolRequest{Method::KillService, {"kill"}}),
    [](const auto& each) { return std::string(protocol::methodName(each.param.method)); });

TEST_F(RequestDispatchTest, AServiceTypeIsAnsweredAsItsNumber) {
    EXPECT_EQ(ask(Method::GetServiceNameForReporterID, {.reporterID = 7})->result, Value(4));
    EXPECT_THAT(client_->asked, ElementsAre(Value("name"), Value(7)));
}

TEST_F(RequestDispatchTest, AMessageIsAnsweredWithoutAResult) {
    const auto answer = ask(Method::SendMessage, {.dictionary = {{"n", 1}},
                                                  .category = 0x80000004,
                                                  .type = 65535,
                                                  .reporterIDs = protocol::ReporterIDs{9}});
    EXPECT_THAT(client_->asked, ElementsAre(Value("send"), Value(Dictionary{{"n", 1}}),
                                            Value(0x80000004U), Value(65535), Value(9)));
    EXPECT_TRUE(answer->succeeded());
    EXPECT_TRUE(answer->result.isNone());
}

TEST_F(RequestDispatchTest, NoListStaysNoList) {
    ask(Method::SendMessage);
    EXPECT_EQ(client_->asked.back(), Value(-1));
}

TEST_F(RequestDispatchTest, AValidityIsAnsweredAsADictionary) {
    EXPECT_EQ(ask(Method::ReporterIDValid, {.reporterID = 7})->result,
              Value(Dictionary{{"reporterID", 7}}));
}

TEST_F(RequestDispatchTest, AllReportersAreAnsweredAsAList) {
    EXPECT_EQ(ask(Method::GetAllReporters)->result, Value(List{Value(1), Value(2)}));
}

TEST_F(RequestDispatchTest, AReplyThatIsDroppedIsAnsweredAsUnanswered) {
    const auto answer = ask(Method::StartReportingSessionForID, {.reporterID = 7});
    client_->held = nullptr;
    ASSERT_EQ(answer->count, 1);
    EXPECT_EQ(answer->error->domain, kIpcErrorDomain);
    EXPECT_EQ(answer->error->code, 4);
}

TEST_F(RequestDispatchTest, ANotificationIsDoneWithoutAnAnswer) {
    ask(Method::GetAllReporters);
    connection_.notify(Method::CreateReportingSession, {.reporterID = 7});
    EXPECT_THAT(client_->asked, ElementsAre(Value("create"), Value(7)));
    client_->held(std::nullopt, true);
}

TEST_F(RequestDispatchTest, OperatorsPostNotifications) {
    EXPECT_TRUE(succeeded(ask(Method::AdminPostNotification, {.name = "com.example.changed"})));
    EXPECT_THAT(platform_.notifications.posted, ElementsAre("com.example.changed"));
}

TEST_F(RequestDispatchTest, AFlushIsAnsweredWhenItIsDone) {
    const auto answer = ask(Method::AdminFlush);
    EXPECT_FALSE(answer->given());
    ASSERT_THAT(platform_.operations.flushes, SizeIs(1));
    platform_.operations.flushes[0]();
    EXPECT_TRUE(succeeded(answer));
}

TEST_F(RequestDispatchTest, APurgeIsAnsweredWithTheRowsThatWent) {
    const auto answer = ask(Method::AdminPurge);
    EXPECT_FALSE(answer->given());
    ASSERT_THAT(platform_.operations.purges, SizeIs(1));
    platform_.operations.purges[0](std::nullopt, 12);
    EXPECT_TRUE(answer->given());
    EXPECT_EQ(answer->result, Value(12));
}

TEST_F(RequestDispatchTest, APurgeThatFailedSaysSo) {
    const auto answer = ask(Method::AdminPurge);
    ASSERT_THAT(platform_.operations.purges, SizeIs(1));
    platform_.operations.purges[0](Error{"posix", 5, "cannot purge"}, 0);
    EXPECT_EQ(answer->error->message, "cannot purge");
}

TEST_F(RequestDispatchTest, TheStatusJoinsTheAdaptersCountersAndTheServices) {
    platform_.operations.counters = {{"uptime_sec", 12}};
    const Peer peer = connect(100);
    peer.create(7);
    peer.createAndStart(8);
    peer.send({{"n", 1}}, protocol::ReporterIDs{8});
    peer.send({{"n", 1}}, protocol::ReporterIDs{8});
    const auto answer = peer.ask(Method::AdminStatus);
    EXPECT_EQ(answer->result, Value(Dictionary{{"uptime_sec", 12},
                                               {"connections", 1},
                                               {"sessions", 2},
                                               {"sessions_started", 1},
                                               {"active_session_count", 1},
                                               {"sessions_not_uploaded", 0},
                                               {"upload_limit", 5},
                                               {"stops_waiting", List()},
                                               {"repeats_dropped", 1}}));
}

TEST_F(RequestDispatchTest, TheStatusKeepsTheRepeatsOfSessionsThatAreGone) {
    const Peer peer = connect(100);
    const Peer lost = connect(200);
    const auto repeat = [](const Peer& sender, std::int64_t id) {
        sender.createAndStart(id);
        sender.send({{"n", 1}}, protocol::ReporterIDs{id});
        sender.send({{"n", 1}}, protocol::ReporterIDs{id});
    };
    const auto repeats = [&] {
        return peer.ask(Method::AdminStatus)->result.dictionary()["repeats_dropped"];
    };
    repeat(peer, 7);
    peer.create(7);
    EXPECT_EQ(repeats(), Value(1)) << "replaced";
    repeat(peer, 8);
    peer.destroy(8);
    EXPECT_EQ(repeats(), Value(2)) << "destroyed";
    repeat(lost, 9);
    lost.connection().invalidate();
    run();
    EXPECT_EQ(repeats(), Value(3)) << "lost with its client";
}

TEST_F(RequestDispatchTest, TheStatusShowsAStopThatWaitsForItsTraceWhileAllElseWaits) {
    platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = true;
    platform_.performanceTraces.completes = false;
    const Peer other = connect(200, "mixer");
    std::shared_ptr<testing::Answer> status;
    std::shared_ptr<testing::Answer> create;
    platform_.conditions.onWait = [&] {
        status = other.ask(Method::AdminStatus);
        create = other.create(9);
        EXPECT_FALSE(status->given());
        platform_.queues.advance(std::chrono::seconds(1) - std::chrono::nanoseconds(1));
        EXPECT_FALSE(status->given());
        platform_.queues.advance(std::chrono::nanoseconds(1));
        EXPECT_TRUE(status->given());
        EXPECT_FALSE(create->given());
        platform_.performanceTraces.sessions[0]->delegate.lock()->performanceTraceDidComplete(
            "/traces/one.dat", "one", std::nullopt);
        return true;
    };
    const Peer tester = connect(100);
    tester.create(7);
    tester.setServiceType(kAudioServiceTypeTest, 7);
    tester.start(7);
    EXPECT_TRUE(succeeded(tester.stop(7)));
    ASSERT_NE(status, nullptr);
    EXPECT_EQ(status->result.dictionary()["stops_waiting"],
              Value(List{Value(Dictionary{{"pid", 100}, {"session", 7}, {"seconds", 1.0}})}));
    EXPECT_TRUE(create->given());
    EXPECT_EQ(tester.ask(Method::AdminStatus)->result.dictionary()["stops_waiting"], Value(List()));
}

TEST_F(RequestDispatchTest, AStatusThatWaitsLooksAgainEverySecond) {
    platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = true;
    platform_.performanceTraces.completes = false;
    std::shared_ptr<testing::Answer> answer;
    platform_.conditions.onWait = [&] {
        platform_.queues.advance(std::chrono::seconds(1));
        EXPECT_TRUE(answer->given());
        platform_.performanceTraces.sessions[0]->delegate.lock()->performanceTraceDidComplete(
            "/traces/one.dat", "one", std::nullopt);
        return true;
    };
    const Peer tester = connect(100);
    tester.create(7);
    tester.setServiceType(kAudioServiceTypeTest, 7);
    tester.start(7);
    service_->serviceQueue()->suspend(std::chrono::minutes(1), [] {});
    answer = tester.ask(Method::AdminStatus);
    platform_.queues.advance(std::chrono::seconds(3));
    EXPECT_FALSE(answer->given()) << "no stop waits yet";
    ASSERT_TRUE(service_->serviceQueue()->resume([&] { session(7)->stop(); }));
    run();
    EXPECT_EQ(answer->count, 1);
    EXPECT_EQ(platform_.queues.queuesMade("com.kestrel.halyard.status"), 1U);
}

TEST_F(RequestDispatchTest, AStatusKeepsItsPlaceHoweverLongTheRequestsBeforeItTake) {
    const auto answer = ask(Method::AdminStatus);
    service_->serviceQueue()->suspend(std::chrono::minutes(1), [] {});
    platform_.queues.advance(std::chrono::seconds(59));
    EXPECT_FALSE(answer->given());
    platform_.queues.advance(std::chrono::seconds(2));
    EXPECT_EQ(answer->count, 1);
}

TEST_F(RequestDispatchTest, TheStatusOfAGoneServiceIsThatOfTheAdapters) {
    platform_.operations.counters = {{"uptime_sec", 12}};
    const auto answer = ask(Method::AdminStatus);
    service_ = nullptr;
    run();
    EXPECT_EQ(answer->result, Value(Dictionary{{"uptime_sec", 12}}));
}

} // namespace
} // namespace halyard
