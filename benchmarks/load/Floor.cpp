#include <cerrno>
#include <chrono>
#include <cstring>
#include <fcntl.h>
#include <poll.h>
#include <stdexcept>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include "load/Throughput.h"
#include "load/Workers.h"
#include "testing/TempTree.h"

namespace halyard::load {
namespace {

constexpr std::size_t kReadBytes = 64 * 1024;
constexpr std::size_t kSyncBytes = 1024 * 1024;
constexpr int kBacklog = 16;

[[noreturn]] void fail(const char* what) {
    throw std::system_error(errno, std::generic_category(), what);
}

int listenAt(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof(address.sun_path)) {
        throw std::runtime_error(path + ": too long for a socket");
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (socket < 0 ||
        ::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0 ||
        ::listen(socket, kBacklog) != 0) {
        fail("listen");
    }
    return socket;
}

// Writes all of it; false on failure.
bool append(int file, const char* bytes, std::size_t count) {
    while (count > 0) {
        const ssize_t written = ::write(file, bytes, count);
        if (written < 0) {
            return false;
        }
        bytes += written;
        count -= static_cast<std::size_t>(written);
    }
    return true;
}

// The server: takes `clients` connections and appends what they send, until all
// have hung up. Returns the exit code.
int serve(int listener, int file, std::size_t clients) {
    std::vector<pollfd> sockets;
    while (sockets.size() < clients) {
        sockets.push_back(
            {.fd = ::accept(listener, nullptr, nullptr), .events = POLLIN, .revents = 0});
    }
    std::vector<char> buffer(kReadBytes);
    std::size_t unsynced = 0;
    while (!sockets.empty()) {
        ::poll(sockets.data(), sockets.size(), -1);
        for (pollfd& socket : sockets) {
            if (socket.revents == 0) {
                continue;
            }
            const ssize_t count = ::read(socket.fd, buffer.data(), buffer.size());
            if (count <= 0) {
                socket.fd = -1;
                continue;
            }
            if (!append(file, buffer.data(), static_cast<std::size_t>(count))) {
                return 1;
            }
            unsynced += static_cast<std::size_t>(count);
        }
        if (unsynced >= kSyncBytes) {
            unsynced = 0;
            ::fdatasync(file);
        }
        std::erase_if(sockets, [](const pollfd& socket) { return socket.fd < 0; });
    }
    return ::fdatasync(file) == 0 ? 0 : 1;
}

pid_t startServer(int listener, const std::string& path, std::size_t clients) {
    const pid_t pid = ::fork();
    if (pid < 0) {
        fail("fork");
    }
    if (pid == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        const int file = ::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
        ::_exit(file < 0 ? 1 : serve(listener, file, clients));
    }
    ::close(listener);
    return pid;
}

std::uint64_t nanoseconds(const timeval& time) {
    return static_cast<std::uint64_t>(time.tv_sec) * 1000000000U +
           static_cast<std::uint64_t>(time.tv_usec) * 1000U;
}

} // namespace

Measurement measureFloor(const Options& options) {
    const std::vector<Stream> streams = makeStreams(options, modes().front());
    const testing::TempTree directory(options.directory);
    const std::string socketPath = directory.path() / "socket";
    const std::string filePath = directory.path() / "file";
    const pid_t server = startServer(listenAt(socketPath), filePath, streams.size());

    Measurement result{.mode = "floor: read and append"};
    const auto begin = std::chrono::steady_clock::now();
    runWorkers(streams.size(), [&](std::size_t i) {
        Connection(socketPath, std::chrono::seconds(options.timeoutSeconds)).send(streams[i].bytes);
    });
    int status = 0;
    rusage usage{};
    if (::wait4(server, &status, 0, &usage) != server || status != 0) {
        throw std::runtime_error("the floor's server failed");
    }
    const std::chrono::duration<double> elapsed = std::chrono::steady_clock::now() - begin;
    result.seconds = elapsed.count();
    result.cpuNanoseconds = nanoseconds(usage.ru_utime) + nanoseconds(usage.ru_stime);
    for (const Stream& stream : streams) {
        result.messages += stream.ends.size();
        result.bytes += stream.bytes.size();
    }
    return result;
}

} // namespace halyard::load
