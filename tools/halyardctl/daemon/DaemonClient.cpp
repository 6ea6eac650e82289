#include "daemon/DaemonClient.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

namespace halyard::ctl {
namespace {

using protocol::Answer;
using reading::Exit;
using reading::Outcome;
using reading::Trouble;

Trouble troubleOfConnect(const std::filesystem::path& socket, int code) {
    if (code == EACCES || code == EPERM) {
        return {Exit::NotAllowed, fmt::format("not allowed to connect to {}", socket.native())};
    }
    if (code == ENOENT || code == ECONNREFUSED || code == ENOTDIR) {
        return {Exit::NothingThere,
                fmt::format("no daemon at {}: start it with systemctl start halyardd.socket, or "
                            "name its socket with --socket",
                            socket.native())};
    }
    return {Exit::Failed,
            fmt::format("cannot connect to {}: {}", socket.native(), std::strerror(code))};
}

Trouble troubleOf(const Error& error) {
    const bool refused = error.domain == kIpcErrorDomain &&
                         error.code == static_cast<std::int64_t>(IpcErrorCode::NotAllowed);
    return {refused ? Exit::NotAllowed : Exit::Failed,
            fmt::format("the daemon refused: {}{}", error.message,
                        refused ? "; [access] admin_users in halyard.toml names who may" : "")};
}

} // namespace

DaemonClient::DaemonClient(int descriptor, std::filesystem::path socket)
    : descriptor_(descriptor), socket_(std::move(socket)) {}

DaemonClient::DaemonClient(DaemonClient&& other) noexcept
    : descriptor_(std::exchange(other.descriptor_, -1)), socket_(std::move(other.socket_)),
      lastID_(other.lastID_), answered_(other.answered_), lost_(other.lost_),
      received_(std::move(other.received_)) {}

DaemonClient::~DaemonClient() {
    if (descriptor_ >= 0) {
        ::close(descriptor_);
    }
}

Outcome<DaemonClient> DaemonClient::connect(const std::filesystem::path& socket,
                                            std::chrono::seconds patience) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (socket.native().size() >= sizeof address.sun_path) {
        return Trouble(Exit::WrongUse, fmt::format("{} is too long for a socket", socket.native()));
    }
    std::memcpy(address.sun_path, socket.c_str(), socket.native().size());
    DaemonClient client(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0), socket);
    // What connect() takes for any kind of address.
    const auto* const any = reinterpret_cast<const sockaddr*>(&address);
    if (client.descriptor_ < 0 || ::connect(client.descriptor_, any, sizeof address) != 0) {
        return troubleOfConnect(socket, errno);
    }
    const timeval limit{patience.count(), 0};
    (void)::setsockopt(client.descriptor_, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    return client;
}

Trouble DaemonClient::lost() {
    lost_ = true;
    if (!answered_) {
        return {Exit::NotAllowed,
                fmt::format("the daemon at {} closed the connection without an answer: [access] in "
                            "halyard.toml says who may connect",
                            socket_.native())};
    }
    return {Exit::Failed, fmt::format("the daemon at {} closed the connection", socket_.native())};
}

Outcome<void> DaemonClient::send(std::string_view frame) {
    while (!frame.empty()) {
        const ssize_t count = ::send(descriptor_, frame.data(), frame.size(), MSG_NOSIGNAL);
        if (count < 0 && errno != EINTR) {
            return lost();
        }
        frame.remove_prefix(count < 0 ? 0 : static_cast<std::size_t>(count));
    }
    return {};
}

Outcome<Answer> DaemonClient::receive() {
    using Scan = protocol::FrameScanner::Outcome;
    std::array<char, 65536> buffer{};
    Scan scanned = scanner_.scan(received_);
    for (; scanned == Scan::Incomplete; scanned = scanner_.scan(received_)) {
        const ssize_t count = ::recv(descriptor_, buffer.data(), buffer.size(), 0);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0 && errno == EAGAIN) {
            lost_ = true;
            return Trouble(Exit::Failed,
                           fmt::format("the daemon at {} does not answer", socket_.native()));
        }
        if (count <= 0) {
            return lost();
        }
        received_.append(buffer.data(), static_cast<std::size_t>(count));
    }
    const Trouble stranger(Exit::Failed,
                           fmt::format("what answers at {} is no halyardd", socket_.native()));
    if (scanned != Scan::Complete) {
        lost_ = true;
        return stranger;
    }
    const std::size_t length = scanner_.frameLength();
    auto answer = protocol::decodeAnswer(std::string_view(received_).substr(0, length));
    scanner_.reset();
    received_.erase(0, length);
    if (!answer) {
        lost_ = true;
        return stranger;
    }
    answered_ = true;
    return *std::move(answer);
}

Outcome<void> DaemonClient::start(protocol::Method method, const protocol::Arguments& arguments) {
    std::string frame;
    protocol::appendCall(frame, ++lastID_, method, arguments);
    // The daemon closes the connection on what is beyond its bounds.
    protocol::FrameScanner scanner;
    if (scanner.scan(frame) != protocol::FrameScanner::Outcome::Complete) {
        return Trouble(Exit::Failed, "larger or deeper than the daemon takes");
    }
    return send(frame);
}

Outcome<Value> DaemonClient::call(protocol::Method method, const protocol::Arguments& arguments) {
    if (const auto sent = start(method, arguments); !sent.ok()) {
        return sent.failure();
    }
    for (const std::uint32_t id = lastID_;;) {
        auto answer = receive();
        if (!answer.ok()) {
            return answer.failure();
        }
        if (answer.value().messageID == id) {
            if (answer.value().error) {
                return troubleOf(*answer.value().error);
            }
            return std::move(answer.value().result);
        }
    }
}

} // namespace halyard::ctl
