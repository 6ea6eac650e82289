// Reads what happens to the machine as a whole: time lost to pressure, time asleep.
//
// Files stay open. Not thread-safe.
#pragma once

#include <array>
#include <filesystem>
#include <functional>

#include "ProcessReader.h"
#include "Samples.h"

namespace halyard::pipewire {

// Boot time ahead of monotonic time.
[[nodiscard]] Nanoseconds timeAsleep();

class MachineReader final {
public:
    // `asleep`: how long the machine was, all in all.
    explicit MachineReader(const std::filesystem::path& processes = "/proc",
                           std::function<Nanoseconds()> asleep = timeAsleep);

    [[nodiscard]] MachineSample sample(Nanoseconds now) const;

private:
    std::function<Nanoseconds()> asleep_;
    std::array<Descriptor, 3> pressure_;
    Descriptor ownTimes_;
};

// CLOCK_MONOTONIC.
[[nodiscard]] Nanoseconds monotonicNow();
// What to add to it for the time since 1970.
[[nodiscard]] Nanoseconds realTimeOffset();

} // namespace halyard::pipewire
