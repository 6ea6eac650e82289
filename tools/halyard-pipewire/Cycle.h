// One cycle of a graph as its driver saw it: when each node was told to work, when
// it began and when it was done.
//
// Times are CLOCK_MONOTONIC in nanoseconds, as PipeWire's profiler gives them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

#include "GraphEvents.h"

namespace halyard::pipewire {

using Nanoseconds = std::int64_t;

// How far a node got, in PipeWire's numbers.
enum class Progress : std::int32_t {
    NotTriggered = 0, // what it waits for has not finished
    Triggered = 1,    // told to work, and has not begun
    Awake = 2,        // began, and has not finished
    Finished = 3,
    Inactive = 4, // took no part
};

struct NodeCycle {
    ObjectId id = 0;
    Nanoseconds previousSignal = 0;
    Nanoseconds signal = 0; // told to work
    Nanoseconds awake = 0;  // began
    Nanoseconds finish = 0; // was done; of an earlier cycle while it is not
    Progress progress = Progress::Finished;
    // Cycles that it missed so far, by the server's own count; releases before 1.0
    // have none.
    std::optional<std::uint32_t> missedSoFar = std::nullopt;
};

struct Cycle {
    static constexpr std::size_t kMaxFollowers = 1024;

    NodeCycle driver;
    std::uint32_t driverMissedSoFar = 0;
    Nanoseconds clock = 0;     // when the device's clock said that it was time
    Nanoseconds nextClock = 0; // and will say so again; 0: not known
    std::int64_t frames = 0;
    std::uint32_t rateNumerator = 0; // seconds a frame
    std::uint32_t rateDenominator = 0;
    std::vector<NodeCycle> followers;

    // By the device's clock: while a new length is on its way, the old one still holds.
    // 0 when it says nothing of use.
    Nanoseconds length() const {
        if (frames <= 0 || frames > 1 << 24 || rateNumerator == 0 || rateDenominator == 0) {
            return 0;
        }
        const auto meant = static_cast<Nanoseconds>(static_cast<double>(frames) * rateNumerator *
                                                    1e9 / rateDenominator);
        const Nanoseconds next = nextClock - clock;
        return next > meant / 256 && next < meant * 256 ? next : meant;
    }
};

} // namespace halyard::pipewire
