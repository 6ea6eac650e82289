// The upload sessions of a store, each with what its messages tell of it.
//
// The messages of many sessions are read in one pass over the ids that they can
// have, because there is no index from sessions to messages: one would cost the
// daemon more at each message than these passes cost the few who look. Sessions
// come in groups, so that any number of them takes the memory of one group.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "reading/JsonFields.h"
#include "reading/StoreReader.h"

namespace halyard::reading {

enum class Direction : std::uint8_t { Unknown, Playback, Capture };
// Null for Unknown.
const char* nameOf(Direction direction);

// What its own row says of a session.
struct SessionRow {
    std::int64_t id = 0;
    std::optional<std::int64_t> sessionID;
    std::optional<std::string> application;
    std::optional<std::string> service; // without "_session"
    Direction direction = Direction::Unknown;
    std::optional<double> opened;
    std::optional<double> closed;
    std::optional<std::string> ended; // since schema 2
};

// The JSON texts of a session, or of a message without one.
struct SessionNames {
    std::optional<std::string> application;
    std::optional<std::string> service;
    Direction direction = Direction::Unknown;
};
SessionNames namesIn(JsonFields& fields, std::string_view sessionInfo, std::string_view userInfo);

// With what its messages add.
struct Session : SessionRow {
    std::uint64_t messages = 0;
    std::uint64_t glitches = 0;
    double playedSeconds = 0;
    double playedInRange = 0;         // of that, within the range that was asked for
    std::vector<std::string> devices; // in the order of their first use
    double lastHeard = 0;             // the time of its last message
};

// What a session is looked for by, beside the range.
using SessionFilter = std::function<bool(const SessionRow&)>;

// Sessions of which some part lies in `range`, by rising ids. `now` ends the stretches
// of those that still run, while the store is being written to.
Outcome<void> forEachSession(StoreReader& reader, const TimeRange& range, double now,
                             const SessionFilter& wanted,
                             const std::function<bool(const Session&)>& take);

// The names of sessions by their rows, for those who meet their messages.
class SessionDirectory {
public:
    explicit SessionDirectory(StoreReader& reader) : reader_(reader) {}

    // Without names when there is no such session. Valid until the next call.
    const SessionNames& namesOf(std::int64_t row);

private:
    static constexpr std::size_t kMostKnown = 4096;

    StoreReader& reader_;
    JsonFields fields_;
    std::unordered_map<std::int64_t, SessionNames> known_;
};

} // namespace halyard::reading
