// One stream socket to the daemon, never blocking.
//
// Fork: the descriptor is registered, and a forked child closes its copy, so that
// the daemon sees the end of the parent also while a child lives on. Opening and
// closing cannot fall into the middle of a fork.
//
// Belongs to the client's thread; forkGeneration() may be called from any.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace halyard::client {

// Differs between a process and its forked children. Costs one load. Counts only
// once a Connection has been made.
std::uint32_t forkGeneration() noexcept;

class Connection {
public:
    enum class Outcome { Done, WouldBlock, Lost };

    Connection();
    ~Connection();
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;

    bool isOpen() const noexcept { return descriptor_ >= 0; }
    int descriptor() const noexcept { return descriptor_; }
    // Requires !isOpen(). False when nobody listens there.
    [[nodiscard]] bool open(const std::string& path) noexcept;
    void close() noexcept;

    // Both set `count` to the bytes that went through. Require isOpen().
    [[nodiscard]] Outcome send(std::string_view bytes, std::size_t& count) noexcept;
    [[nodiscard]] Outcome receive(std::span<char> room, std::size_t& count) noexcept;

private:
    friend struct ForkRegistry;
    int descriptor_ = -1;
};

} // namespace halyard::client
