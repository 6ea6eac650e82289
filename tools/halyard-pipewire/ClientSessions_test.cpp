// Against a daemon's side of the socket, played by the test.

#include "ClientSessions.h"

#include <gtest/gtest.h>
#include <optional>
#include <string>

#include "testing/FakeDaemon.h"
#include "testing/TempTree.h"

namespace halyard::pipewire {
namespace {

using Calls = halyard::testing::FakeDaemon::Calls;
using protocol::Call;
using protocol::Method;

class ClientSessionsTest : public ::testing::Test {
protected:
    ClientSessionsTest() {
        daemon_.start();
        client_.emplace(socket_.c_str());
        sessions_.emplace(*client_);
    }

    // The next `count` calls, in order.
    Calls take(std::size_t count) {
        EXPECT_TRUE(daemon_.waitForCalls(count));
        Calls calls = daemon_.calls();
        daemon_.forgetCalls();
        calls.resize(count);
        return calls;
    }
    // Opens session 77, and forgets how it is made.
    void openSession() {
        sessions_->open(77, HALYARD_SERVICE_ALERTS, {{"HostApplicationDisplayID", "bell"}});
        take(4);
    }

    halyard::testing::TempTree folder_;
    const std::string socket_ = folder_ / "s";
    halyard::testing::FakeDaemon daemon_{socket_};
    std::optional<reporting::Client> client_;
    std::optional<ClientSessions> sessions_;
};

TEST_F(ClientSessionsTest, ASessionIsMadeTypedConfiguredAndStarted) {
    sessions_->open(77, HALYARD_SERVICE_ALERTS, {{"HostApplicationDisplayID", "bell"}});

    const Calls calls = take(4);
    EXPECT_EQ(calls[0].method, Method::CreateReportingSession);
    EXPECT_EQ(calls[0].arguments.reporterID, 77);
    EXPECT_EQ(calls[1].method, Method::SetServiceType);
    EXPECT_EQ(calls[1].arguments.serviceType, HALYARD_SERVICE_ALERTS);
    EXPECT_EQ(calls[2].method, Method::SetConfiguration);
    EXPECT_EQ(calls[2].arguments.dictionary["HostApplicationDisplayID"], Value("bell"));
    EXPECT_EQ(calls[3].method, Method::StartReportingSessionForID);
}

TEST_F(ClientSessionsTest, AMessageArrivesAsItIs) {
    openSession();
    sessions_->send(77, {HALYARD_CATEGORY_VOLUME,
                         HALYARD_TYPE_ACTIVATE,
                         {{"VQSessionVolume", 1.0},
                          {"VQSessionVolumePlayingState", 1},
                          {"active_devices", Names{"a", "b"}}}});

    const Call send = take(1)[0];
    EXPECT_EQ(send.method, Method::SendMessage);
    EXPECT_EQ(send.arguments.category, std::uint32_t{HALYARD_CATEGORY_VOLUME});
    EXPECT_EQ(send.arguments.type, HALYARD_TYPE_ACTIVATE);
    EXPECT_EQ(send.arguments.reporterIDs, protocol::ReporterIDs{77});
    const Dictionary& message = send.arguments.dictionary;
    EXPECT_EQ(message["VQSessionVolume"].kind(), halyard::Value::Kind::Double);
    EXPECT_EQ(message["VQSessionVolumePlayingState"], Value(1));
    EXPECT_EQ(message["active_devices"], Value(List{"a", "b"}));
    EXPECT_TRUE(message.contains("hyreporting_timestamp"));
}

TEST_F(ClientSessionsTest, AClosedSessionIsStoppedWithAnAnswerThenDestroyed) {
    openSession();
    sessions_->close(77);

    const Calls calls = take(2);
    EXPECT_EQ(calls[0].method, Method::StopReportingSessionForID);
    EXPECT_TRUE(calls[0].messageID.has_value());
    EXPECT_EQ(calls[1].method, Method::DestroyReportingSession);
    EXPECT_EQ(sessions_->refused(), 0U);
}

TEST_F(ClientSessionsTest, AMessageForNoSessionIsCounted) {
    sessions_->send(5, {HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START, {}});
    sessions_->close(5);
    EXPECT_EQ(sessions_->refused(), 1U);
}

} // namespace
} // namespace halyard::pipewire
