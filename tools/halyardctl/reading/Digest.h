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

    struct Leader {
        std::string name;
        GlitchSum sum;
    };
    // The one with the most glitches, and of these the longest silent; none where there are
    // none, or nobody is named.
    std::optional<Leader> worstApplication;
    // The one of more glitches than any other; none where two share the first place.
    std::optional<Leader> leadingCause;
};

Outcome<Digest> digestOf(StoreReader& reader, const TimeRange& range, double now);

} // namespace halyard::reading
