// Gives memory back to the system that the allocator keeps for next time.
//
// The allocator keeps what a thread's messages took for that thread, and looks at it
// only when that thread allocates again. After a client that had much, threads that
// now have nothing to do would keep it for good. So a while after somebody has left,
// while the process is larger than it usually is, every thread that handles messages
// is asked to give back what it does not use; a few times, since what the client has
// left may still be on its way to the disk.
//
// All on one thread, that of `queue`; returnFreeMemory() on any, for its own.
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <utility>

#include "platform/WorkQueue.h"

namespace halyard::linux_ {

// What the calling thread does not use.
void returnFreeMemory();

// Of this process; 0 where the system does not tell.
std::size_t residentBytes();

class FreeMemory {
public:
    // A process below this is let alone.
    static constexpr std::size_t kUsualBytes = std::size_t{64} * 1024 * 1024;
    static constexpr std::chrono::seconds kFirstLook{1};
    static constexpr std::chrono::seconds kLastLook{16};

    struct Actions {
        std::function<std::size_t()> residentBytes;
        std::function<void()> returnFromAllThreads;
    };

    // Borrows `queue`.
    FreeMemory(platform::WorkQueue& queue, Actions actions)
        : queue_(queue), actions_(std::move(actions)) {}

    // Somebody has let go of what may be much.
    void released();

private:
    void lookIn(std::chrono::seconds delay);

    platform::WorkQueue& queue_;
    const Actions actions_;
    bool looking_ = false;
    bool again_ = false; // More was released since.
};

} // namespace halyard::linux_
