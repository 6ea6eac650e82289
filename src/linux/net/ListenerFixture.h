// A listener on a real socket, clients of it, and what it hands over.
#pragma once

#include <gtest/gtest.h>

#include <cerrno>
#include <deque>
#include <memory>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>
#include <vector>

#include "linux/net/SocketListener.h"
#include "platform/Platform.h"
#include "testing/RecordingLog.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {

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
        made->setExportedObject(object);
        made->setInterruptionHandler([this] { events.emplace_back("interrupted"); });
        made->setInvalidationHandler([this] { events.emplace_back("invalidated"); });
        made->resume();
        return true;
    }

    std::shared_ptr<RecordingObject> object = std::make_shared<RecordingObject>();
    std::vector<std::string> events;
};

class ListenerFixture : public ::testing::Test {
protected:
    ListenerFixture() {
        platform_.log = &log_;
        platform::install(&platform_);
        const auto listening = listenAt(path_);
        EXPECT_TRUE(listening.ok()) << listening.failure().message();
        listener_ = std::make_unique<SocketListener>(context_, pressure_, listening.value(),
                                                     [this](const Peer&) { return rights_; });
        listener_->setDelegate(&delegate_);
        asio::post(context_, [this] { context_.stop(); });
        listener_->resume(); // Arms the acceptor.
    }
    ~ListenerFixture() override {
        for (const int fd : clients_) {
            ::close(fd);
        }
        listener_->closeAllConnections();
        delegate_.object->charges.clear();
        settle();
        listener_.reset();
        platform::install(nullptr);
    }

    // Runs what is ready, until nothing is.
    void settle() {
        context_.restart();
        while (context_.poll() > 0) {
        }
    }
    int connect() {
        const int fd = connectUnserved();
        settle();
        return fd;
    }
    int connectUnserved() {
        const int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path_.copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        clients_.push_back(fd);
        return fd;
    }
    // As when the client's process ends.
    void leave(int fd) {
        std::erase(clients_, fd);
        ::close(fd);
        settle();
    }
    // As much as the socket takes.
    std::size_t sendSome(int fd, std::string_view bytes) {
        const ssize_t sent = ::send(fd, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
        settle();
        return sent > 0 ? static_cast<std::size_t>(sent) : 0;
    }
    void send(int fd, std::string_view bytes) {
        while (!bytes.empty()) {
            const std::size_t sent = sendSome(fd, bytes);
            ASSERT_GT(sent, 0u) << "the listener does not read";
            bytes.remove_prefix(sent);
        }
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
    static std::string call(protocol::Method method, const protocol::Arguments& arguments = {},
                            std::optional<std::uint32_t> messageID = 7) {
        std::string bytes;
        protocol::appendCall(bytes, messageID, method, arguments);
        return bytes;
    }
    static std::string notification(std::size_t payload = 10) {
        protocol::Arguments arguments;
        arguments.dictionary.set("text", std::string(payload, 'x'));
        return call(protocol::Method::SendMessage, arguments, std::nullopt);
    }

    testing::TempTree directory_;
    std::string path_ = directory_ / "reporting.sock";
    testing::RecordingLog log_;
    platform::Platform platform_;
    asio::io_context context_;
    Pressure pressure_;
    Delegate delegate_;
    PeerRights rights_ = PeerRights::Administrator;
    std::unique_ptr<SocketListener> listener_;
    std::vector<int> clients_;
};

} // namespace halyard::linux_
