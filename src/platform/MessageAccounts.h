// The sheet of messages: how many came and what became of each, since the start.
//
// A message is offered to a session, to none (a standalone), or made by the daemon
// itself. It then is a repeat, is kept from the upload by a rule, or goes to the store.
// Each of these is counted where it is decided, so that what does not add up shows: it
// stays "waiting" for good.
//
// What clients lost before it came here is told by themselves and stands beside the sheet.
//
// Kept with the platform (see Platform), because who counts has nothing else in common.
// Any thread; adding costs one atomic operation.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>

#include "common/Value.h"
#include "protocol/ClientLosses.h"

namespace halyard::platform {

enum class MessageCount : std::uint8_t {
    Requests,    // sendMessage that was accepted
    Refused,     // ... while reporting is disabled
    Bounded,     // ... refused by a bound
    Unaddressed, // ... that reached no session
    Offered,     // once for each session that a request reached, and for a standalone
    Own,         // made by the daemon
    Repeats,
    // Kept from the upload; from here on by rule.
    Test,         // The session is one of tests.
    NoBackend,    // None was found, or there is none for a single message.
    Limit,        // More sessions are active than are uploaded.
    Transactions, // The device wants no upload sessions.
    Sampled,      // A single message that was left out by chance.
};
inline constexpr std::size_t kMessageCounts = 12;

class MessageAccounts {
public:
    // Const like the platform that it is kept with.
    void add(MessageCount what) const {
        counts_[static_cast<std::size_t>(what)].fetch_add(1, std::memory_order_release);
    }
    std::uint64_t of(MessageCount what) const {
        return counts_[static_cast<std::size_t>(what)].load(std::memory_order_acquire);
    }
    // What a client says that it lost, by reason. Clients are not trusted: other reasons are
    // taken together, and what is no count is left out.
    void addLostInClient(const Dictionary& counts) const;
    // As admin.status shows it. `delivered` is what the store is done with, read before:
    // it must not be ahead of what is read here.
    Dictionary describe(std::uint64_t delivered) const;

private:
    // And one for all other reasons.
    static constexpr std::size_t kClientLosses = protocol::kClientLossNames.size() + 1;

    // One processor writes the first seven, others the rest.
    alignas(64) mutable std::array<std::atomic<std::uint64_t>, kMessageCounts> counts_{};
    mutable std::array<std::atomic<std::uint64_t>, kClientLosses> lostInClients_{};
};

} // namespace halyard::platform
