#include "linux/net/SocketListener.h"

#include <cerrno>
#include <cstring>
#include <fmt/format.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

constexpr std::chrono::milliseconds kAcceptRetry{100};
constexpr int kBacklog = 4096;
constexpr mode_t kSocketMode = 0666; // Who may connect is decided by the peer.

// One descriptor a connection: take all that the administrator allows.
void raiseDescriptorLimit() {
    rlimit limit{};
    if (::getrlimit(RLIMIT_NOFILE, &limit) == 0) {
        limit.rlim_cur = limit.rlim_max;
        (void)::setrlimit(RLIMIT_NOFILE, &limit);
    }
}

bool makeAddress(const std::string& path, sockaddr_un& address) {
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) {
        return false;
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    return true;
}

bool somebodyListens(const sockaddr_un& address) {
    const int probe = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    const bool connected =
        ::connect(probe, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ||
        errno == EAGAIN;
    ::close(probe);
    return connected;
}

Failure inTheWay(std::string what) {
    return {{}, std::move(what)};
}

} // namespace

void ListenerShared::add(const std::shared_ptr<SocketConnection>& connection, std::int32_t pid) {
    connections.insert(connection);
    processes.add(pid);
    if (connectionsChanged) {
        connectionsChanged(connections.size());
    }
}

void ListenerShared::remove(const std::shared_ptr<SocketConnection>& connection, std::int32_t pid) {
    connections.erase(connection);
    processes.remove(pid);
    if (connectionsChanged) {
        connectionsChanged(connections.size());
    }
}

Result<int> listenAt(const std::string& path) {
    sockaddr_un address{};
    if (!makeAddress(path, address)) {
        return inTheWay(fmt::format("the path of the socket is too long: {}", path));
    }
    struct stat facts {};
    if (::lstat(path.c_str(), &facts) == 0) {
        if (!S_ISSOCK(facts.st_mode)) {
            return inTheWay(fmt::format("{} is in the way: it is no socket", path));
        }
        if (somebodyListens(address)) {
            return inTheWay(fmt::format("another daemon listens at {}", path));
        }
        (void)::unlink(path.c_str());
    }
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0 || ::bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        ::chmod(path.c_str(), kSocketMode) != 0 || ::listen(fd, kBacklog) != 0) {
        Failure failure = Failure::ofErrno("cannot listen at " + path);
        ::close(fd);
        return failure;
    }
    return fd;
}

std::optional<int> inheritedSocket(std::string_view name) {
    char** names = nullptr;
    const int count = ::sd_listen_fds_with_names(0, &names);
    std::optional<int> found;
    for (int i = 0; i < count; ++i) {
        const int fd = SD_LISTEN_FDS_START + i;
        const bool fits = ::sd_is_socket_unix(fd, SOCK_STREAM, 1, nullptr, 0) > 0;
        if (!found && fits && (count == 1 || name == names[i])) {
            found = fd;
        }
    }
    for (int i = 0; i < count; ++i) {
        std::free(names[i]);
    }
    std::free(names);
    return found;
}

SocketListener::SocketListener(asio::io_context& context, Pressure& pressure, int listeningSocket,
                               Authorizer authorizer)
    : context_(context), acceptor_(context, asio::local::stream_protocol(), listeningSocket),
      retry_(context), authorizer_(std::move(authorizer)), shared_(pressure, context) {
    raiseDescriptorLimit();
    onClientRelieved(nullptr);
    pressure.setReliefHandler([this] { asio::post(context_, [this] { resumeReading(); }); });
    shared_.connectionsChanged = [this](std::size_t connections) { tellConnections(connections); };
}

SocketListener::~SocketListener() = default;

void SocketListener::resume() {
    accept();
    context_.run();
}

void SocketListener::accept() {
    acceptor_.async_accept(
        [this](const asio::error_code& error, asio::local::stream_protocol::socket socket) {
            if (error == asio::error::operation_aborted || !acceptor_.is_open()) {
                answerLeaver(true);
                return;
            }
            if (error) {
                acceptFailed(error);
                return;
            }
            acceptFailureLogged_ = false;
            accepted(std::move(socket));
            accept();
            answerLeaver(false);
        });
}

// Out of descriptors or memory: the others go on, new ones wait.
void SocketListener::acceptFailed(const asio::error_code& error) {
    if (!std::exchange(acceptFailureLogged_, true)) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "cannot accept a connection: {}",
                     error.message());
    }
    retry_.expires_after(kAcceptRetry);
    retry_.async_wait([this](const asio::error_code& aborted) {
        if (aborted) {
            answerLeaver(true);
        } else {
            accept();
        }
    });
}

// The one operation that waits for a connection, or for another try, says how it ended:
// cancelled, so nobody is in hand, or with a connection that came first.
void SocketListener::stopAcceptingUnlessSomebodyComes(std::function<void(bool)> done) {
    leaver_ = std::move(done);
    asio::error_code ignored;
    acceptor_.cancel(ignored);
    retry_.cancel();
}

void SocketListener::answerLeaver(bool stopped) {
    if (const auto leaver = std::exchange(leaver_, nullptr)) {
        leaver(stopped);
    }
}

void SocketListener::accepted(asio::local::stream_protocol::socket socket) {
    const Peer peer = peerOfSocket(socket.native_handle());
    const PeerRights rights = authorizer_(peer);
    if (rights == PeerRights::None) {
        refuse(peer);
        return;
    }
    refusedUid_.reset();
    auto budget = budgets_.of(peer);
    if (!budget->addConnection()) {
        refuseAnother(peer);
        return;
    }
    crowdedPid_.reset();
    ++shared_.counters.accepted;
    const ChargeScope scope(std::make_shared<Charge>(budget)); // Its first work comes first.
    auto connection = std::make_shared<SocketConnection>(std::move(socket), peer, rights,
                                                         std::move(budget), shared_);
    shared_.add(connection, peer.pid);
    if (delegate_ == nullptr || !delegate_->shouldAcceptNewConnection(connection)) {
        connection->close();
    }
}

void SocketListener::refuse(const Peer& peer) {
    ++shared_.counters.refused;
    if (refusedUid_ != peer.uid) {
        refusedUid_ = peer.uid;
        HY_LOG_ERROR(HYReportingPlatformCategory, "refusing connections of {}", peer.description());
    }
}

void SocketListener::refuseAnother(const Peer& peer) {
    ++shared_.counters.refused;
    if (crowdedPid_ != peer.pid) {
        crowdedPid_ = peer.pid;
        HY_LOG_ERROR(HYReportingPlatformCategory, "refusing more connections of {}: {}",
                     peer.description(),
                     platform::boundReached(platform::ClientBound::Connections).message);
    }
}

void SocketListener::onClientRelieved(std::function<void()> relieved) {
    budgets_.onRelief([this, relieved = std::move(relieved)] {
        asio::post(context_, [this] { resumeReading(); });
        if (relieved) {
            relieved();
        }
    });
}

void SocketListener::resumeReading() {
    const auto connections = shared_.connections; // Reading may end some.
    for (const auto& connection : connections) {
        connection->readIfAllowed();
    }
}

void SocketListener::stopAccepting() {
    asio::error_code ignored;
    acceptor_.close(ignored);
    retry_.cancel();
}

void SocketListener::tellConnections(std::size_t connections) {
    if (connectionsChanged_) {
        connectionsChanged_(connections);
    }
    if (connections == 0 && finished_) {
        asio::post(context_, std::exchange(finished_, nullptr)); // Behind what an end causes.
    }
}

void SocketListener::acceptTheLast() {
    (void)::shutdown(acceptor_.native_handle(), SHUT_RD);
    asio::error_code error;
    acceptor_.non_blocking(true, error);
    while (!error) {
        auto socket = acceptor_.accept(error);
        if (!error) {
            accepted(std::move(socket));
        }
    }
}

void SocketListener::finishReading(std::function<void()> done) {
    stopAccepting();
    finished_ = std::move(done);
    const auto connections = shared_.connections; // Reading may end some.
    for (const auto& connection : connections) {
        connection->finish();
    }
    tellConnections(shared_.connections.size());
}

std::size_t SocketListener::unreadBytes() {
    std::size_t bytes = 0;
    for (const auto& connection : shared_.connections) {
        bytes += connection->unreadBytes();
    }
    return bytes;
}

void SocketListener::closeAllConnections() {
    const auto connections = shared_.connections;
    for (const auto& connection : connections) {
        connection->close();
    }
}

} // namespace halyard::linux_
