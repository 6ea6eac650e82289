// Reads what happens to the machine as a whole: time lost to pressure, time asleep.
//
// Files stay open. Not thread-safe.
#pragma once

#include <array>
#include <filesystem>

#include "ProcessReader.h"
#include "Samples.h"

namespace halyard::pipewire {

class MachineReader final {
public:
    explicit MachineReader(const std::filesystem::path& processes = "/proc");

    [[nodiscard]] MachineSample sample(Nanoseconds now) const;

private:
    std::array<Descriptor, 3> pressure_;
    Descriptor ownTimes_;
};

// CLOCK_MONOTONIC.
[[nodiscard]] Nanoseconds monotonicNow();
// What to add to it for the time since 1970.
[[nodiscard]] Nanoseconds realTimeOffset();

} // namespace halyard::pipewire
