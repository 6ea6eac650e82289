#include "load/Connection.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <poll.h>
#include <stdexcept>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace halyard::load {
namespace {

constexpr int kSilenceMs = 1000; // then recv() is left to judge it

[[noreturn]] void fail(const char* what) {
    if (errno == EAGAIN) {
        throw std::runtime_error(std::string(what) + ": the daemon was silent too long");
    }
    throw std::system_error(errno, std::generic_category(), what);
}

void setTimeouts(int socket, std::chrono::seconds timeout) {
    const timeval time{.tv_sec = timeout.count(), .tv_usec = 0};
    ::setsockopt(socket, SOL_SOCKET, SO_RCVTIMEO, &time, sizeof(time));
    ::setsockopt(socket, SOL_SOCKET, SO_SNDTIMEO, &time, sizeof(time));
}

} // namespace

Connection::Connection(const std::string& socketPath, std::chrono::seconds timeout) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (socketPath.size() >= sizeof(address.sun_path)) {
        throw std::runtime_error(socketPath + ": too long for a socket");
    }
    std::memcpy(address.sun_path, socketPath.data(), socketPath.size());
    socket_ = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (socket_ < 0) {
        fail("socket");
    }
    setTimeouts(socket_, timeout);
    if (::connect(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
        const int error = errno;
        ::close(socket_);
        errno = error;
        fail("connect");
    }
}

Connection::~Connection() {
    if (socket_ >= 0) {
        ::close(socket_);
    }
}

Connection::Connection(Connection&& other) noexcept
    : socket_(std::exchange(other.socket_, -1)), received_(std::move(other.received_)),
      consumed_(other.consumed_), scanner_(other.scanner_), nextID_(other.nextID_) {}

void Connection::awaitAnswer() {
    awaitReadable();
    readAnswer();
}

Value Connection::call(protocol::Method method, const protocol::Arguments& arguments) {
    std::string frame;
    const std::uint32_t id = nextID_++;
    protocol::appendCall(frame, id, method, arguments);
    send(frame);
    const protocol::Answer answer = readAnswer();
    if (answer.messageID != id) {
        throw std::runtime_error("an answer to a question that was not asked");
    }
    return answer.result;
}

void Connection::notify(protocol::Method method, const protocol::Arguments& arguments) {
    std::string frame;
    protocol::appendCall(frame, std::nullopt, method, arguments);
    send(frame);
}

void Connection::send(std::string_view bytes) {
    while (!bytes.empty()) {
        const std::size_t block = std::min(bytes.size(), kBlockBytes);
        const ssize_t sent = ::send(socket_, bytes.data(), block, MSG_NOSIGNAL);
        if (sent < 0) {
            if (errno == EINTR) {
                continue;
            }
            fail("send");
        }
        bytes.remove_prefix(static_cast<std::size_t>(sent));
    }
}

void Connection::sendRequests(const Stream& stream, std::uint32_t inFlight) {
    const std::size_t total = stream.ends.size();
    std::size_t sent = 0;
    std::size_t answered = 0;
    protocol::Answer answer;
    while (answered < total) {
        const std::size_t upTo = std::min(total, answered + inFlight);
        if (upTo > sent) {
            const std::size_t begin = sent == 0 ? 0 : stream.ends[sent - 1];
            const std::size_t end = stream.ends[upTo - 1];
            send(std::string_view(stream.bytes).substr(begin, end - begin));
            sent = upTo;
        }
        // All answers that have come, so that the next write is as large as it can be.
        readAnswer();
        ++answered;
        while (takeAnswer(answer)) {
            ++answered;
        }
    }
}

protocol::Answer Connection::readAnswer() {
    protocol::Answer answer;
    while (!takeAnswer(answer)) {
        receive();
    }
    return answer;
}

bool Connection::takeAnswer(protocol::Answer& answer) {
    const std::string_view stream = std::string_view(received_).substr(consumed_);
    using Outcome = protocol::FrameScanner::Outcome;
    const Outcome outcome = scanner_.scan(stream);
    if (outcome == Outcome::Incomplete) {
        return false;
    }
    auto decoded = outcome == Outcome::Complete
                       ? protocol::decodeAnswer(stream.substr(0, scanner_.frameLength()))
                       : std::nullopt;
    if (!decoded) {
        throw std::runtime_error("the daemon sent what is no answer");
    }
    if (decoded->error) {
        throw std::runtime_error("the daemon refused: " + decoded->error->message);
    }
    consumed_ += scanner_.frameLength();
    scanner_.reset();
    answer = std::move(*decoded);
    return true;
}

// A thread that sleeps in recv() is also woken when the daemon has read what it sent.
void Connection::awaitReadable() const {
    pollfd readable{.fd = socket_, .events = POLLIN, .revents = 0};
    (void)::poll(&readable, 1, kSilenceMs);
}

void Connection::receive() {
    received_.erase(0, consumed_);
    consumed_ = 0;
    const std::size_t before = received_.size();
    received_.resize(before + 65536);
    const ssize_t count = ::recv(socket_, received_.data() + before, 65536, 0);
    const int error = errno;
    received_.resize(before + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    if (count == 0) {
        throw std::runtime_error("the daemon closed the connection");
    }
    if (count < 0 && error != EINTR) {
        errno = error;
        fail("recv");
    }
}

} // namespace halyard::load
