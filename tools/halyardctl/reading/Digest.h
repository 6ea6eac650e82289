// What a stretch of time came to, in a few numbers: the short answer that everything
// longer begins with.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "reading/GlitchTally.h"
#include "reading/StoreReader.h"

namespace halyard::reading {

struct Digest {
    std::uint64_t sessions = 0;
    std::uint64_t openSessions = 0;
    // Within the stretch.
    double playedSeconds = 0;
    double capturedSeconds = 0;
    GlitchSum glitches;

    // Those with the most glitches; none where there are none, or nobody is named.
    struct Leader {
        std::string name;
        GlitchSum sum;
    };
    std::optional<Leader> worstApplication;
    std::optional<Leader> leadingCause;
};

Outcome<Digest> digestOf(StoreReader& reader, const TimeRange& range, double now);

} // namespace halyard::reading
