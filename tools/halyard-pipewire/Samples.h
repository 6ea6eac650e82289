// What is looked at while streams run: a stream's process and its data thread, and
// the machine.
#pragma once

#include <cstdint>
#include <optional>

#include "Cycle.h"

namespace halyard::pipewire {

// Times and counts are totals since the thread began; what could not be read is
// unknown.
struct ThreadSample {
    Nanoseconds at = 0;
    std::optional<Nanoseconds> cpu = std::nullopt;   // on a processor
    std::optional<Nanoseconds> delay = std::nullopt; // ready, and waiting for one
    std::optional<std::uint64_t> majorFaults = std::nullopt;
    std::optional<Nanoseconds> ioDelay =
        std::nullopt;    // waiting for a disk, if the kernel counts that
    char state = 0;      // letter of the process table; 0: unknown
    bool frozen = false; // its control group is
};

// Totals since the machine started; unknown where the kernel does not count them.
struct MachineSample {
    Nanoseconds at = 0;
    std::optional<Nanoseconds> cpuPressure = std::nullopt;
    std::optional<Nanoseconds> memoryPressure = std::nullopt;
    std::optional<Nanoseconds> ioPressure = std::nullopt;
    Nanoseconds asleep = 0; // boot time ahead of monotonic time
    // Of the sampling thread: ready, and waiting for a processor.
    std::optional<Nanoseconds> ownDelay = std::nullopt;
};

// By a signal or a debugger.
inline bool isStopped(const ThreadSample& sample) {
    return sample.state == 'T' || sample.state == 't';
}

// The kernel counts a wait for a processor when it is over. A thread that is ready,
// and has neither run nor been counted since `last`, the first look at these totals,
// has waited until now; else `last` is this look.
inline void countWaiting(ThreadSample& sample, ThreadSample& last) {
    const bool known = sample.cpu && sample.delay && last.at != 0;
    if (known && sample.state == 'R' && sample.cpu == last.cpu && sample.delay == last.delay) {
        *sample.delay += sample.at - last.at;
    } else {
        last = sample;
    }
}

// How much a total grew; nothing when either is unknown, or it began anew.
template <class Number>
std::optional<Number> growth(const std::optional<Number>& from, const std::optional<Number>& to) {
    return from && to && *to >= *from ? std::optional<Number>(*to - *from) : std::nullopt;
}

} // namespace halyard::pipewire
