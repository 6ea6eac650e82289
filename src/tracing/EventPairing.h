// Which start event belongs to which stop event.
#pragma once

#include <cstdint>
#include <vector>

#include "platform/EventTrace.h"

namespace halyard {

// Points into the events that were paired.
struct EventPairing {
    struct Pair {
        const trace_point* start;
        const trace_point* stop;
    };

    std::vector<Pair> pairs;                         // in the order of their stops
    std::vector<const trace_point*> discardedStarts; // a newer start came
    std::vector<const trace_point*> discardedStops;  // no start was open
    std::vector<const trace_point*> openStarts;      // no stop came
};

// One pass in the order given; the newest start wins. With equal codes there are
// only starts.

// A start at time stamp 0 counts as none.
EventPairing pairOverAllThreads(const std::vector<trace_point>& points, std::uint32_t startCode,
                                std::uint32_t stopCode);
// Each thread on its own.
EventPairing pairByThread(const std::vector<trace_point>& points, std::uint32_t startCode,
                          std::uint32_t stopCode);

} // namespace halyard
