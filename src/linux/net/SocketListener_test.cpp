#include "linux/net/SocketListener.h"

#include <filesystem>
#include <fstream>
#include <sys/socket.h>
#include <unistd.h>

#include "linux/net/ListenerFixture.h"

namespace halyard::linux_ {
namespace {

using protocol::Method;

class SocketListenerTest : public ListenerFixture {};

TEST_F(SocketListenerTest, HandsOverRequestsInTheirOrder) {
    const int client = connect();
    send(client,
         call(Method::GetAllReporters) + call(Method::CreateReportingSession) + notification());

    const auto& requests = delegate_.object->requests;
    ASSERT_EQ(requests.size(), 3u);
    EXPECT_EQ(requests[0].method, Method::GetAllReporters);
    EXPECT_EQ(requests[1].method, Method::CreateReportingSession);
    EXPECT_FALSE(requests[2].reply) << "a notification wants no answer";
}

TEST_F(SocketListenerTest, AnswersMayComeInAnyOrder) {
    const int client = connect();
    send(client, call(Method::GetAllReporters, {}, 1) + call(Method::GetAllReporters, {}, 2));

    delegate_.object->requests[1].reply(std::nullopt, 22);
    settle();
    EXPECT_EQ(answer(client).messageID, 2u);
    delegate_.object->requests[0].reply(std::nullopt, 11);
    settle();
    EXPECT_EQ(answer(client).result, Value(11));
}

TEST_F(SocketListenerTest, ARequestIsAnsweredOnce) {
    const int client = connect();
    send(client, call(Method::GetAllReporters));
    const auto reply = delegate_.object->requests[0].reply;
    reply(std::nullopt, true);
    settle();
    EXPECT_EQ(answer(client).result, Value(true));

    reply(std::nullopt, false);
    settle();
    EXPECT_EQ(receive(client), "");
}

TEST_F(SocketListenerTest, ADroppedReplyIsToldToThePeer) {
    const int client = connect();
    send(client, call(Method::StartReportingSessionForID));
    delegate_.object->requests.clear();
    settle();

    EXPECT_EQ(answer(client).error->code, static_cast<int>(IpcErrorCode::Unanswered));
}

TEST_F(SocketListenerTest, AFrameMayComeByteByByte) {
    const int client = connect();
    for (const char byte : call(Method::CreateReportingSession)) {
        send(client, std::string_view(&byte, 1));
    }
    EXPECT_EQ(delegate_.object->requests.size(), 1u);
}

TEST_F(SocketListenerTest, AnUnknownMethodIsAnsweredAndTheConnectionLivesOn) {
    const int client = connect();
    send(client, std::string("\x94\x00\x01\xa4nope\x90", 9));
    EXPECT_EQ(answer(client).error->code, static_cast<int>(IpcErrorCode::UnknownMethod));

    send(client, call(Method::GetAllReporters));
    EXPECT_EQ(delegate_.object->requests.size(), 1u);
}

TEST_F(SocketListenerTest, OrdinaryPeersMayNotAdminister) {
    rights_ = PeerRights::Client;
    const int client = connect();
    for (const Method method : {Method::KillService, Method::AdminFlush, Method::AdminStatus,
                                Method::AdminPostNotification, Method::AdminPurge}) {
        send(client, call(method));
        EXPECT_EQ(answer(client).error->code, static_cast<int>(IpcErrorCode::NotAllowed));
    }
    EXPECT_TRUE(delegate_.object->requests.empty());
}

TEST_F(SocketListenerTest, ARefusedPeerIsClosedAndLoggedOnceAnEpisode) {
    rights_ = PeerRights::None;
    EXPECT_EQ(receive(connect()), "closed");
    EXPECT_EQ(receive(connect()), "closed");

    EXPECT_EQ(listener_->counters().refused, 2u);
    EXPECT_EQ(log_.lines().size(), 1u);
}

TEST_F(SocketListenerTest, ASecondDaemonIsToldThatThereIsOne) {
    EXPECT_EQ(listenAt(path_), (Failure{{}, "another daemon listens at " + path_}));
}

TEST_F(SocketListenerTest, TheLeftoverOfADeadDaemonIsReplaced) {
    const std::string other = directory_ / "other.sock";
    ::close(listenAt(other).value());
    const auto again = listenAt(other);
    ASSERT_TRUE(again.ok()) << again.failure().message();
    ::close(again.value());
}

TEST_F(SocketListenerTest, AFileInTheWayIsLeftAlone) {
    const std::string other = directory_ / "file";
    std::ofstream(other) << "precious";
    EXPECT_EQ(listenAt(other), (Failure{{}, other + " is in the way: it is no socket"}));
    EXPECT_TRUE(std::filesystem::exists(other));
}

TEST(RightsOf, KnowsItsOwnUidAndRoot) {
    EXPECT_EQ(rightsOf({1, 1000, 1000, {}}, {}, 1000), PeerRights::Administrator);
    EXPECT_EQ(rightsOf({1, 0, 0, {}}, {}, 1000), PeerRights::Administrator);
    EXPECT_EQ(rightsOf({1, 1001, 1001, {}}, {}, 1000), PeerRights::None);
}

TEST(RightsOf, FollowsTheLists) {
    const Access lists{{"1001"}, {"29"}, {"1003"}};
    EXPECT_EQ(rightsOf({1, 1001, 1001, {}}, lists, 0), PeerRights::Client);
    EXPECT_EQ(rightsOf({1, 1002, 1002, {29}}, lists, 0), PeerRights::Client);
    EXPECT_EQ(rightsOf({1, 1002, 29, {}}, lists, 0), PeerRights::Client);
    EXPECT_EQ(rightsOf({1, 1003, 1003, {}}, lists, 0), PeerRights::Administrator);
    EXPECT_EQ(rightsOf({1, 1004, 1004, {30}}, lists, 0), PeerRights::None);
}

TEST(PeerOfSocket, TellsWhoConnected) {
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
    const Peer peer = peerOfSocket(ends[0]);
    EXPECT_EQ(peer.pid, ::getpid());
    EXPECT_EQ(peer.uid, ::getuid());
    ::close(ends[0]);
    ::close(ends[1]);
}

TEST_F(SocketListenerTest, TellsHowManyAreConnected) {
    std::vector<std::size_t> told;
    listener_->onConnectionsChanged([&](std::size_t connections) { told.push_back(connections); });
    const int first = connect();
    connect();
    leave(first);
    rights_ = PeerRights::None;
    connect();

    EXPECT_EQ(told, (std::vector<std::size_t>{1, 2, 1}));
    listener_->onConnectionsChanged(nullptr);
}

TEST_F(SocketListenerTest, LeavesNewcomersToOthersOnceItHasStopped) {
    std::optional<bool> stopped;
    listener_->stopAcceptingUnlessSomebodyComes([&](bool is) { stopped = is; });
    settle();
    const int client = connect();

    EXPECT_EQ(stopped, true);
    EXPECT_EQ(receive(client), "") << "it waits for whoever accepts next";
    EXPECT_EQ(listener_->counters().accepted.load(), 0u);
}

TEST_F(SocketListenerTest, WhoWasAcceptedInThatMomentIsServed) {
    std::optional<bool> stopped;
    // Of two that wait, the second is in hand once the first has been told of.
    listener_->onConnectionsChanged([&](std::size_t connections) {
        asio::post(context_, [&, connections] {
            if (connections == 1) {
                listener_->stopAcceptingUnlessSomebodyComes([&](bool is) { stopped = is; });
            }
        });
    });
    connectUnserved();
    connectUnserved();
    settle();
    listener_->onConnectionsChanged(nullptr);

    EXPECT_EQ(stopped, false);
    EXPECT_EQ(listener_->counters().accepted.load(), 2u);
    connect();
    EXPECT_EQ(listener_->counters().accepted.load(), 3u) << "it went on";
}

} // namespace
} // namespace halyard::linux_
