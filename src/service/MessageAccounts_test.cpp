// The sheet of messages: whatever clients do, it adds up.

#include <array>
#include <limits>
#include <random>

#include "common/Json.h"
#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;

class MessageAccountsTest : public ServiceTest {
protected:
    Dictionary sheet() {
        const auto& uploads = platform_.relayReporting.uploads;
        std::uint64_t delivered =
            platform_.relayReporting.singles.size() + platform_.relayReporting.failed;
        for (const auto& upload : uploads) {
            delivered += upload->messages.size();
        }
        return platform::current().messageAccounts.describe(delivered);
    }
    std::int64_t number(std::string_view key) { return sheet()[key].integerValue(); }
    std::int64_t rule(std::string_view key) {
        return sheet()["not_uploaded"].dictionary()[key].integerValue();
    }
    // What is queued, or waits for its second, as the queues know it.
    void expectNothingWaiting() {
        platform_.queues.advance(1s);
        run();
        EXPECT_EQ(number("waiting"), 0);
    }
};

TEST_F(MessageAccountsTest, TellsWhatBecameOfEachRequest) {
    const Peer peer = connect(10);
    peer.send({{"n", 0}}, std::nullopt); // a standalone
    EXPECT_EQ(number("waiting"), 1);
    expectNothingWaiting();
    peer.createAndStart(7);
    peer.send({{"n", 1}}, {{7, 7, 0, 8}}); // the second is a repeat
    peer.send({{"n", 2}}, {{0, 8}});
    peer.send({{"n", 3}}, protocol::ReporterIDs());
    peer.stop(7); // with a summary
    const Dictionary told = sheet();
    EXPECT_EQ(told["requests"], Value(4));
    EXPECT_EQ(told["unaddressed"], Value(2));
    EXPECT_EQ(told["offered"], Value(3));
    EXPECT_EQ(told["own"], Value(1));
    EXPECT_EQ(told["repeats"], Value(1));
    EXPECT_EQ(told["delivered"], Value(3));
    EXPECT_EQ(told["waiting"], Value(0));
    EXPECT_EQ(service_->status()["repeats_dropped"], Value(1));
}

TEST_F(MessageAccountsTest, CountsWhatIsRefused) {
    const Peer peer = connect(10);
    service_->setReportingEnabled(false);
    peer.send({{"n", 1}}, std::nullopt);
    EXPECT_EQ(number("refused"), 1);
    EXPECT_EQ(number("requests"), 0);
    EXPECT_EQ(number("offered"), 0);
}

TEST_F(MessageAccountsTest, NamesTheRuleThatKeptAMessage) {
    const Peer peer = connect(10);
    peer.create(1);
    peer.setServiceType(kAudioServiceTypeTest, 1);
    peer.start(1);
    peer.send({{"n", 1}}, {{1}});
    EXPECT_EQ(rule("test"), 1);
    platform_.relayReporting.backends = testing::FakeRelayReporting::Backends::AnswerNone;
    peer.createAndStart(2);
    peer.send({{"n", 1}}, {{2}});
    EXPECT_EQ(rule("no_backend"), 1);
    for (const std::int64_t id : {3, 4, 5, 6}) {
        peer.createAndStart(id);
    }
    peer.send({{"n", 1}}, {{6}});
    EXPECT_EQ(rule("limit"), 1);
    EXPECT_EQ(number("waiting"), 0);
}

TEST_F(MessageAccountsTest, ASingleMessageWithoutABackEndIsNotDelivered) {
    const Peer peer = connect(10);
    platform_.relayReporting.failure =
        Error{"store", platform::kRelayReportingNoBackend, "there is no store"};
    peer.send({{"n", 1}}, std::nullopt);
    platform_.queues.advance(1s);
    run();
    EXPECT_EQ(rule("no_backend"), 1);
}

TEST_F(MessageAccountsTest, AddsUpWhatClientsSayThatTheyLost) {
    const Peer peer = connect(10);
    const auto tell = [&](Dictionary counts) {
        peer.connection().send(protocol::Method::ClientDropped, {.dictionary = std::move(counts)});
    };
    tell({{"queue_full", 3}, {"invalid", 1}});
    tell({{"queue_full", 2}, {"discarded", 1}, {"too_large", 4}});
    EXPECT_EQ(toJson(sheet()["lost_in_clients"]),
              R"({"queue_full":5,"discarded":1,"too_large":4,"invalid":1,"other":0})");
}

TEST_F(MessageAccountsTest, TrustsNoClientWithItsLosses) {
    const Peer peer = connect(10);
    const auto tell = [&](Dictionary counts) {
        peer.connection().send(protocol::Method::ClientDropped, {.dictionary = std::move(counts)});
    };
    tell({{"made", 1}, {"up", 2}});
    tell({{"queue_full", -1}, {"invalid", "many"}, {"discarded", 1.5}, {"too_large", List()}});
    tell({{"invalid", std::numeric_limits<std::uint64_t>::max()}});
    tell({{"invalid", 5}});
    EXPECT_EQ(toJson(sheet()["lost_in_clients"]),
              R"({"queue_full":0,"discarded":0,"too_large":0,"invalid":9223372036854775807,)"
              R"("other":3})");
}

// One run of clients that do anything, in any order.
class AnythingTest : public MessageAccountsTest, public ::testing::WithParamInterface<unsigned> {
protected:
    int below(int bound) { return static_cast<int>(random_() % static_cast<unsigned>(bound)); }
    std::int64_t anyID() { return below(9); } // 0 among them, and some that are not there
    protocol::ReporterIDs anyIDs() {
        protocol::ReporterIDs ids;
        for (int i = below(4); i > 0; --i) {
            ids.push_back(anyID());
        }
        return ids;
    }
    void anyBackend() {
        using Backends = testing::FakeRelayReporting::Backends;
        platform_.relayReporting.backends =
            below(3) == 0 ? Backends::AnswerNone : Backends::AnswerAtOnce;
    }
    void disconnect(std::size_t which) {
        peers_[which]->connection().invalidate();
        peers_[which] = std::make_unique<Peer>(connect(100 + below(1000)));
    }
    // Leaves work undone: what it causes runs later, or in the midst of the next.
    void step() {
        const std::size_t which = static_cast<std::size_t>(below(3));
        testing::FakeConnection& client = peers_[which]->connection();
        using Method = protocol::Method;
        switch (below(12)) {
        case 0:
            client.send(Method::CreateReportingSession, {.reporterID = anyID()});
            break;
        case 1:
            client.send(Method::StartReportingSessionForID, {.reporterID = anyID()});
            break;
        case 2:
            client.send(Method::StopReportingSessionForID, {.reporterID = anyID()});
            break;
        case 3:
            client.send(Method::DestroyReportingSession, {.reporterID = anyID()});
            break;
        case 4:
            client.send(
                Method::SetServiceType,
                {.reporterID = anyID(),
                 .serviceType = below(2) == 0 ? kAudioServiceTypeTest : kAudioServiceTypeGeneric});
            break;
        case 5:
            below(8) == 0 ? disconnect(which) : anyBackend();
            break;
        case 6:
            platform_.queues.advance(300ms);
            break;
        default:
            client.send(Method::SendMessage,
                        {.dictionary = {{"n", below(3)}},
                         .category = kAudioEventCategoryPlayback,
                         .type = kAudioEventTypeStart,
                         .reporterIDs = below(5) == 0 ? std::nullopt : std::optional(anyIDs())});
        }
        for (int i = below(6); i > 0; --i) {
            platform_.queues.runOne();
        }
    }
    void expectSumsToClose() {
        const Dictionary told = sheet();
        std::int64_t kept = 0;
        for (const auto& [name, count] : told["not_uploaded"].dictionary()) {
            kept += count.integerValue();
        }
        const auto of = [&](std::string_view key) { return told[key].integerValue(); };
        EXPECT_GE(of("waiting"), 0);
        EXPECT_EQ(of("offered") + of("own"),
                  of("repeats") + kept + of("delivered") + of("waiting"));
    }

    std::mt19937 random_{GetParam()};
    std::array<std::unique_ptr<Peer>, 3> peers_{std::make_unique<Peer>(connect(1)),
                                                std::make_unique<Peer>(connect(2)),
                                                std::make_unique<Peer>(connect(3))};
};

TEST_P(AnythingTest, AddsUpAtEachStepAndLeavesNothingWaiting) {
    for (int i = 0; i < 2000; ++i) {
        step();
        expectSumsToClose();
    }
    run();
    expectNothingWaiting();
    EXPECT_GT(number("delivered"), 0);
    EXPECT_GT(number("repeats"), 0);
    EXPECT_GT(number("unaddressed"), 0);
}

INSTANTIATE_TEST_SUITE_P(Seeds, AnythingTest, ::testing::Range(1U, 21U));

} // namespace
} // namespace halyard
