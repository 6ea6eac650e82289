// Ends the daemon when nobody has been connected for as long as the operator said.
//
// An end that nobody notices: it waits until everything that was accepted is on the disk,
// and then stops accepting only if nobody has come meanwhile. Who comes later stays in the
// queue of a socket that a service manager holds, which starts the daemon again.
//
// One timer at a time, looked at when it goes off: a client that comes and goes ten
// thousand times a second leaves one, not ten thousand.
//
// All on one thread, that of `queue`.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>

#include "platform/Clock.h"
#include "platform/WorkQueue.h"

namespace halyard::linux_ {

class IdleExit {
public:
    struct Actions {
        // Calls back, on any thread, once all that was accepted is written.
        std::function<void(std::function<void()> done)> drain;
        // Stops accepting and calls back with true, or with false when somebody came.
        std::function<void(std::function<void(bool stopped)> done)> stopAccepting;
        std::function<void()> end;
    };

    // Borrows `clock` and `queue`. Nobody is connected yet.
    IdleExit(const platform::Clock& clock, platform::WorkQueue& queue, Actions actions);

    // None: never.
    void setLimit(std::optional<std::chrono::seconds> limit);
    // So many are connected now.
    void connectionsChanged(std::size_t connections);

private:
    void arm();
    void look();
    void drained(std::uint64_t changes);
    bool isIdle() const;

    const platform::Clock& clock_;
    platform::WorkQueue& queue_;
    const Actions actions_;
    std::optional<std::chrono::seconds> limit_;
    std::size_t connections_ = 0;
    std::uint64_t changes_ = 0; // of the connections
    platform::SteadyTime idleSince_;
    std::optional<platform::SteadyTime> due_; // when the timer goes off
    bool leaving_ = false;                    // until draining and accepting have stopped
};

} // namespace halyard::linux_
