// The messages that a client sends, encoded before the clock starts: what is
// measured is the daemon, not its load.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "protocol/Request.h"

namespace halyard::load {

struct StreamPlan {
    std::uint32_t client = 0; // each has a category of its own and other contents
    std::uint32_t messages = 0;
    std::uint32_t repeats = 0; // percent
    bool requests = false;     // with an ID each, to be answered
    std::optional<protocol::ReporterIDs> reporterIDs;
};

struct Stream {
    std::string bytes;
    std::vector<std::size_t> ends; // of each message in `bytes`
    std::uint32_t distinct = 0;    // messages that do not repeat their predecessor
};

// About 300 bytes each, eight keys: strings, integers, reals, a list, a nested
// dictionary. Repeats are spread evenly; like real ones they differ from their
// predecessor in the time stamp.
Stream makeStream(const StreamPlan& plan);

} // namespace halyard::load
