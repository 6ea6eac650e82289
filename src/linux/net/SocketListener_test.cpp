#include "linux/net/SocketListener.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <deque>
#include <filesystem>
#include <fstream>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include "common/Json.h"
#include "platform/Platform.h"
#include "testing/RecordingLog.h"

namespace halyard::linux_ {
namespace {

using protocol::Arguments;
using protocol::Method;

// Keeps the requests, answers when told, and may hold the charge of their work.
class RecordingObject final : public platform::ExportedObject {
public:
    void handle(protocol::Request request) override {
        requests.push_back(std::move(request));
        if (holdCharges) {
            charges.push_back(currentCharge());
        }
    }

    std::deque<protocol::Request> requests;
    std::vector<ChargePtr> charges;
    bool holdCharges = false;
};

class Delegate final : public platform::ListenerDelegate {
public:
    bool shouldAcceptNewConnection(const std::shared_ptr<platform::Connection>& made) override {
        connection = made;
        made->setExportedObject(object);
        made->setInterruptionHandler([this] { events.emplace_back("interrupted"); });
        made->setInvalidationHandler([this] { events.emplace_back("invalidated"); });
        made->resume();
        return true;
    }

    std::shared_ptr<RecordingObject> object = std::make_shared<RecordingObject>();
    std::weak_ptr<platform::Connection> connection;
    std::vector<std::string> events;
};

class SocketListenerTest : public ::testing::Test {
protected:
    SocketListenerTest() {
        platform_.log = &log_;
        platform::install(&platform_);
        const auto listening = listenAt(path_);
        EXPECT_EQ(listening.error, "");
        listener_ = std::make_unique<SocketListener>(context_, pressure_, listening.fd,
                                                     [this](const Peer&) { return rights_; });
        listener_->setDelegate(&delegate_);
        asio::post(context_, [this] { context_.stop(); });
        listener_->resume(); // Arms the acceptor.
    }
    ~SocketListenerTest() override {
        for (const int fd : clients_) {
            ::close(fd);
        }
        listener_->closeAllConnections();
        delegate_.object->charges.clear();
        settle();
        listener_.reset();
        platform::install(nullptr);
        std::filesystem::remove_all(directory_);
    }

    // Runs what is ready, until nothing is.
    void settle() {
        context_.restart();
        while (context_.poll() > 0) {
        }
    }
    int connect() {
        const int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path_.copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        clients_.push_back(fd);
        settle();
        return fd;
    }
    void send(int fd, std::string_view bytes) {
        while (!bytes.empty()) {
            const ssize_t sent =
                ::send(fd, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
            if (sent > 0) {
                bytes.remove_prefix(static_cast<std::size_t>(sent));
            }
            settle();
            ASSERT_TRUE(sent > 0) << "the listener does not read";
        }
    }
    // As much as the socket takes.
    std::size_t sendSome(int fd, std::string_view bytes) {
        const ssize_t sent = ::send(fd, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
        settle();
        return sent > 0 ? static_cast<std::size_t>(sent) : 0;
    }
    // What has been answered; "closed" once the listener has closed.
    std::string receive(int fd) {
        std::string bytes(1 << 20, '\0');
        const ssize_t got = ::recv(fd, bytes.data(), bytes.size(), MSG_DONTWAIT);
        if (got == 0 || (got < 0 && errno == ECONNRESET)) {
            return "closed";
        }
        bytes.resize(got > 0 ? static_cast<std::size_t>(got) : 0);
        return bytes;
    }
    protocol::Answer answer(int fd) {
        const auto decoded = protocol::decodeAnswer(receive(fd));
        EXPECT_TRUE(decoded.has_value());
        return decoded.value_or(protocol::Answer{});
    }
    static std::string call(Method method, const Arguments& arguments = {},
                            std::optional<std::uint32_t> messageID = 7) {
        std::string bytes;
        protocol::appendCall(bytes, messageID, method, arguments);
        return bytes;
    }
    static std::string notification(std::size_t payload = 10) {
        Arguments arguments;
        arguments.dictionary.set("text", std::string(payload, 'x'));
        return call(Method::SendMessage, arguments, std::nullopt);
    }

    std::string directory_ = [] {
        char name[] = "/tmp/halyard-listener-XXXXXX";
        return std::string(::mkdtemp(name));
    }();
    std::string path_ = directory_ + "/reporting.sock";
    testing::RecordingLog log_;
    platform::Platform platform_;
    asio::io_context context_;
    Pressure pressure_;
    Delegate delegate_;
    PeerRights rights_ = PeerRights::Administrator;
    std::unique_ptr<SocketListener> listener_;
    std::vector<int> clients_;
};

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
                                Method::AdminPostNotification}) {
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

TEST_F(SocketListenerTest, ABrokenConnectionIsInterruptedThenInvalidated) {
    const int client = connect();
    const int other = connect();
    send(client, "\xc1");

    EXPECT_EQ(receive(client), "closed");
    EXPECT_EQ(delegate_.events, (std::vector<std::string>{"interrupted", "invalidated"}));
    EXPECT_EQ(receive(other), "") << "nobody else notices";
}

TEST_F(SocketListenerTest, AClientThatLeavesIsInvalidatedOnly) {
    const int client = connect();
    ::shutdown(client, SHUT_RDWR);
    settle();

    EXPECT_EQ(delegate_.events, std::vector<std::string>{"invalidated"});
}

TEST_F(SocketListenerTest, WhatWasSentBeforeLeavingIsStillTaken) {
    const int client = connect();
    ASSERT_EQ(::send(client, notification().data(), notification().size(), 0),
              static_cast<ssize_t>(notification().size()));
    ::shutdown(client, SHUT_WR);
    settle();

    EXPECT_EQ(delegate_.object->requests.size(), 1u);
    EXPECT_EQ(delegate_.events, std::vector<std::string>{"invalidated"});
}

TEST_F(SocketListenerTest, StopsReadingWhileTooManyRequestsAreUnprocessed) {
    delegate_.object->holdCharges = true;
    const int client = connect();
    std::string many;
    for (std::size_t i = 0; i < 2 * SocketConnection::kMaxUnprocessedRequests; ++i) {
        many += notification();
    }
    ASSERT_EQ(sendSome(client, many), many.size());
    EXPECT_EQ(delegate_.object->requests.size(), SocketConnection::kMaxUnprocessedRequests);

    delegate_.object->charges.clear();
    settle();
    EXPECT_EQ(delegate_.object->requests.size(), 2 * SocketConnection::kMaxUnprocessedRequests);
}

TEST_F(SocketListenerTest, StopsReadingWhileTooManyBytesAreUnprocessed) {
    delegate_.object->holdCharges = true;
    const int client = connect();
    const std::string large = notification(900'000);
    std::size_t sent = 0;
    for (std::size_t got = 1; got > 0; sent += got) {
        got = sendSome(client, std::string_view(large).substr(sent % large.size()));
    }
    EXPECT_GE(sent, SocketConnection::kMaxUnprocessedBytes);
    EXPECT_LT(sent, SocketConnection::kMaxUnprocessedBytes + 4 * large.size());
    const std::size_t before = delegate_.object->requests.size();

    delegate_.object->charges.clear();
    settle();
    send(client, std::string_view(large).substr(sent % large.size()));
    EXPECT_GT(delegate_.object->requests.size(), before);
}

// The work of these is done when they are handed over, so the connection may
// read again by the time that it looks why it stopped.
TEST_F(SocketListenerTest, ABurstThatPassesABoundForAMomentIsTakenWhole) {
    constexpr std::size_t kBurst = 2 * SocketConnection::kMaxUnprocessedRequests + 500;
    const int client = connect();
    std::string burst;
    for (std::size_t i = 0; i < kBurst; ++i) {
        burst += call(Method::GetAllReporters, {}, std::nullopt);
    }
    ASSERT_LT(burst.size(), ListenerShared::kReadSize) << "is to come in one read";
    ASSERT_EQ(sendSome(client, burst), burst.size());

    EXPECT_EQ(delegate_.object->requests.size(), kBurst);
}

TEST_F(SocketListenerTest, NobodyIsReadFromUnderPressure) {
    const int client = connect();
    pressure_.set(Pressure::Store, true);
    ASSERT_GT(sendSome(client, notification()), 0u);
    EXPECT_TRUE(delegate_.object->requests.empty());

    pressure_.set(Pressure::Store, false);
    settle();
    EXPECT_EQ(delegate_.object->requests.size(), 1u);
}

TEST_F(SocketListenerTest, APeerThatLeavesItsAnswersLyingIsClosed) {
    const int client = connect();
    send(client, call(Method::GetAllReporters) + call(Method::GetAllReporters));
    auto& requests = delegate_.object->requests;
    requests[0].reply(std::nullopt, std::string(SocketConnection::kMaxUnsentBytes / 2, 'x'));
    settle();
    ASSERT_GT(sendSome(client, notification()), 0u);
    EXPECT_EQ(requests.size(), 2u) << "it is not read from meanwhile";
    EXPECT_TRUE(delegate_.events.empty());

    requests[1].reply(std::nullopt, std::string(SocketConnection::kMaxUnsentBytes, 'x'));
    settle();
    EXPECT_EQ(delegate_.events, (std::vector<std::string>{"interrupted", "invalidated"}));
}

TEST_F(SocketListenerTest, ReadsOnOnceTheAnswersAreTaken) {
    const int client = connect();
    send(client, call(Method::GetAllReporters));
    delegate_.object->requests[0].reply(std::nullopt, std::string(1'000'000, 'x'));
    settle();
    ASSERT_GT(sendSome(client, notification()), 0u);
    while (!receive(client).empty()) {
        settle();
    }
    EXPECT_EQ(delegate_.object->requests.size(), 2u);
}

TEST_F(SocketListenerTest, ASecondDaemonIsToldThatThereIsOne) {
    EXPECT_EQ(listenAt(path_).error, "another daemon listens at " + path_);
}

TEST_F(SocketListenerTest, TheLeftoverOfADeadDaemonIsReplaced) {
    const std::string other = directory_ + "/other.sock";
    ::close(listenAt(other).fd);
    const auto again = listenAt(other);
    EXPECT_EQ(again.error, "");
    ::close(again.fd);
}

TEST_F(SocketListenerTest, AFileInTheWayIsLeftAlone) {
    const std::string other = directory_ + "/file";
    std::ofstream(other) << "precious";
    EXPECT_NE(listenAt(other).error, "");
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

} // namespace
} // namespace halyard::linux_
