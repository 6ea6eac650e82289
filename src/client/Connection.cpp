#include "client/Connection.h"

#include <pthread.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <vector>

namespace halyard::client {

namespace {
std::atomic<std::uint32_t> generation{0};
} // namespace

std::uint32_t forkGeneration() noexcept {
    return generation.load(std::memory_order_relaxed);
}

// All connections of the process. Never destroyed: clients may outlive static
// objects.
struct ForkRegistry {
    std::mutex mutex; // A fork holds it from one callback to the next, which no analysis follows.
    std::vector<Connection*> connections;

    static ForkRegistry& instance() {
        static ForkRegistry* const registry = [] {
            auto* made = new ForkRegistry;
            ::pthread_atfork([] { instance().mutex.lock(); }, [] { instance().mutex.unlock(); },
                             [] { instance().becomeChild(); });
            return made;
        }();
        return *registry;
    }

    void becomeChild() noexcept {
        for (Connection* connection : connections) {
            if (connection->isOpen()) {
                ::close(connection->descriptor_);
            }
        }
        connections.clear();
        generation.fetch_add(1, std::memory_order_relaxed);
        mutex.unlock();
    }
};

Connection::Connection() {
    ForkRegistry& registry = ForkRegistry::instance();
    const std::lock_guard lock(registry.mutex);
    registry.connections.push_back(this);
}

Connection::~Connection() {
    close();
    ForkRegistry& registry = ForkRegistry::instance();
    const std::lock_guard lock(registry.mutex);
    std::erase(registry.connections, this);
}

bool Connection::open(const std::string& path) noexcept {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof(address.sun_path)) {
        return false;
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    {
        const std::lock_guard lock(ForkRegistry::instance().mutex);
        descriptor_ = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    }
    if (!isOpen()) {
        return false;
    }
    if (::connect(descriptor_, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
        close();
    }
    return isOpen();
}

void Connection::close() noexcept {
    const std::lock_guard lock(ForkRegistry::instance().mutex);
    if (isOpen()) {
        ::close(descriptor_);
        descriptor_ = -1;
    }
}

namespace {

Connection::Outcome outcomeOf(ssize_t result, std::size_t& count) noexcept {
    count = result > 0 ? static_cast<std::size_t>(result) : 0;
    if (result > 0) {
        return Connection::Outcome::Done;
    }
    const bool later = result < 0 && (errno == EAGAIN || errno == EINTR);
    return later ? Connection::Outcome::WouldBlock : Connection::Outcome::Lost;
}

} // namespace

Connection::Outcome Connection::send(std::string_view bytes, std::size_t& count) noexcept {
    return outcomeOf(::send(descriptor_, bytes.data(), bytes.size(), MSG_NOSIGNAL), count);
}

Connection::Outcome Connection::receive(std::span<char> room, std::size_t& count) noexcept {
    return outcomeOf(::recv(descriptor_, room.data(), room.size(), 0), count);
}

} // namespace halyard::client
