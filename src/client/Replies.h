// Who waits for which answer.
//
// A start is answered only when its session is stopped: such a reply is held,
// does not count as in flight, and survives the connection (see takeHeld()).
//
// Belongs to the client's thread, on which it runs the callbacks.
#pragma once

#include <cstdint>
#include <unordered_map>
#include <utility>
#include <vector>

#include "client/Record.h"
#include "protocol/Wire.h"

namespace halyard::client {

// Calls `callback`, if there is one, with an error of the library's own domain.
void fail(const Callback& callback, std::int64_t code) noexcept;

class Replies {
public:
    void add(std::uint32_t messageID, const Callback& callback);
    // Requires that nothing is held for `reporterID`.
    void hold(std::uint32_t messageID, const Callback& callback, std::int64_t reporterID);
    // The session stops: its start will be answered soon, like any request.
    void letGo(std::int64_t reporterID);

    // An answer that nobody waits for is ignored.
    void deliver(const protocol::Answer& answer);
    // What is held, with its session; no longer known afterwards.
    std::vector<std::pair<std::int64_t, Callback>> takeHeld();
    // Fails all.
    void failAll(std::int64_t code);

    std::size_t inFlight() const { return waiting_.size() - held_.size(); }
    bool empty() const { return waiting_.empty(); }

private:
    struct Waiting {
        Callback callback;
        std::int64_t heldFor = 0;
    };
    std::unordered_map<std::uint32_t, Waiting> waiting_;
    std::unordered_map<std::int64_t, std::uint32_t> held_; // by session
};

} // namespace halyard::client
