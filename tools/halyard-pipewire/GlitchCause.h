// Why cycles were missed, out of what was measured meanwhile. Pure.
#pragma once

#include <cstdint>
#include <optional>

#include "Cycle.h"
#include "History.h"
#include "Samples.h"

namespace halyard::pipewire {

enum class GlitchCause : std::uint8_t {
    ProcessStopped,
    ProcessFrozen,
    ProcessGone,
    MachinePaused,
    DriverLate,
    GraphOverloaded,
    ProcessorWait,
    ClientSlow,
    Memory,
    ClientBlocked,
    Unknown,
};

// As it stands in messages.
[[nodiscard]] const char* nameOf(GlitchCause cause);

// A figure that is known to lie between two.
struct Range {
    double least = 0;
    double most = 0;
};

// What a thread did beyond what it does at other times, in seconds. A stretch of a few
// cycles is short beside the time between two looks, so that only so much is certain.
struct ThreadExcess {
    std::optional<Range> cpu = std::nullopt;
    std::optional<Range> delay = std::nullopt;
    std::optional<Range> majorFaults = std::nullopt;
};

// What it usually does in a second, from the tenth to the ninetieth in a hundred looks
// of a while before: a glitch now and then does not move that.
struct UsualRates {
    Range cpu;
    Range delay;
    Range majorFaults;
};
[[nodiscard]] UsualRates usualRates(const History<ThreadSample>& history, Nanoseconds until);

[[nodiscard]] ThreadExcess excessOf(const UsualRates& usual, const ThreadSample& before,
                                    const ThreadSample& after);

struct CauseFacts {
    bool stopped = false; // seen so in the process table
    bool frozen = false;
    bool gone = false;
    double cycleSeconds = 0;
    double asleepSeconds = 0;     // the machine was
    double stoodStillSeconds = 0; // nothing ran, we included, though we were ready to
    double lateShare = 0;         // of the missed cycles, those of a late driver
    double latenessSeconds = 0;
    double heldSeconds = 0; // how long something held the stream up
    bool woke = false;      // it had begun work on a cycle that it missed
    ThreadExcess thread;
    double ownCycles = 0;    // longest own work over the cycle's length, waiting included
    double othersCycles = 0; // work of the other nodes in a missed cycle, added up
    double largestOther = 0; // of these
    // What the others' threads ran; unknown when not all are watched.
    std::optional<double> othersCpuSeconds = std::nullopt;
    double missingSeconds = 0;
};

// The first cause that holds, in the order of the enumeration.
[[nodiscard]] GlitchCause causeOf(const CauseFacts& facts);

} // namespace halyard::pipewire
