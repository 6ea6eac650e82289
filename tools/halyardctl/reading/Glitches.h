// The glitches that a store tells of, each once.
//
// A glitch that lasts is told while it does and again at its end, under the same
// start; the last message counts. So there are two passes over the messages: the
// first finds which those are, keeping 16 bytes of each, the second reads them.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "reading/Sessions.h"
#include "reading/StoreReader.h"

namespace halyard::reading {

struct Glitch {
    std::optional<std::int64_t> session; // its row; none for a single message
    std::optional<std::string> application;
    Direction direction = Direction::Unknown;
    std::optional<std::string> node;
    std::optional<std::string> device;
    std::optional<double> start;
    double told = 0; // the time of the message
    std::optional<double> seconds;
    std::optional<std::int64_t> cycles;
    std::optional<std::string> cause;
    const rapidjson::Value* evidence = nullptr; // an object, or null; borrowed
    bool inferred = false;

    double time() const { return start.value_or(told); }
};

// Those that began in `range`, in the order of their last messages. A glitch is valid
// during the call.
Outcome<void> forEachGlitch(StoreReader& reader, const TimeRange& range,
                            const std::function<bool(const Glitch&)>& take);

// Of one message of the kind IssueDetector. `fields` holds its payload, or nothing.
Glitch glitchIn(const JsonFields& fields, std::uint32_t category, const SessionNames& names);

} // namespace halyard::reading
