// A glitch as a message of its stream's session. Pure.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "GlitchCause.h"
#include "GlitchFinder.h"
#include "SessionSink.h"
#include "StreamFacts.h"

namespace halyard::pipewire {

// What was measured around an episode.
struct GlitchEvidence {
    char state = 0;
    std::optional<ThreadSample> threadBefore = std::nullopt;
    std::optional<ThreadSample> threadAfter = std::nullopt;
    std::optional<MachineSample> machineBefore = std::nullopt;
    std::optional<MachineSample> machineAfter = std::nullopt;
    double busyCycles = 0;
    double driverLateSeconds = 0;
    bool waitedForOthers = false;
    Dictionaries busiest = {};
};

// Only what was measured, and no zeroes.
[[nodiscard]] Contents contentsOf(const GlitchEvidence& evidence);

struct GlitchMessage {
    GlitchCause cause = GlitchCause::Unknown;
    std::string application = {};
    std::string node = {};
    std::string device = {}; // may be empty
    Contents evidence = {};
    std::uint64_t unreported = 0;
};

// `realTimeOffset`: what to add to monotonic time for the time since 1970.
[[nodiscard]] Message messageOf(const Episode& episode, const GlitchMessage& glitch,
                                Direction direction, Nanoseconds realTimeOffset);

[[nodiscard]] double seconds(Nanoseconds time);

} // namespace halyard::pipewire
