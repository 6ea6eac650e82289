// What the messages of closed sessions tell of them: glitches, changes of route and
// volume, driver statistics.
//
// Sessions are looked at in groups, in one pass over the messages that they can have,
// because nothing leads from a session to its messages. What is kept of them is bounded;
// what is left out is counted. Not thread-safe.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "content/ConsentHistory.h"
#include "content/SessionBook.h"
#include "reading/StoreReader.h"

namespace halyard::exporting {

// Keys of a message that tells of a glitch.
inline constexpr const char* kGlitchCause = "issue_type";
inline constexpr const char* kGlitchSeconds = "any_channel_silence_seconds";

struct GlitchFacts {
    double start = 0;
    std::string node;
    std::string cause;
    std::optional<double> seconds;
    double told = 0;
    std::string payload; // of the last message that told it
};

struct TimedPayload {
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    double time = 0;
    std::string payload;
};

struct SessionContents {
    // By start and node, so that one told again replaces what was known.
    std::map<std::pair<double, std::string>, GlitchFacts> glitches;
    std::vector<TimedPayload> changes;    // of route and volume
    std::vector<TimedPayload> statistics; // of drivers
    std::uint64_t changesLeftOut = 0;
    std::uint64_t glitchesLeftOut = 0;
    std::uint64_t statisticsLeftOut = 0;
};

// Which of it is wanted, beside the glitches.
enum class Wanted : std::uint8_t { Events, Statistics, Both };

// By the session's row. Messages from a time without consent are not looked at.
using ContentsOf = std::unordered_map<std::int64_t, SessionContents>;
reading::Outcome<ContentsOf> gatherContents(reading::StoreReader& reader,
                                            const std::vector<BookedSession>& sessions,
                                            const ConsentHistory& consent, Wanted wanted);

// None when the payload tells of no glitch.
std::optional<GlitchFacts> glitchFactsIn(reading::JsonFields& fields, std::string_view payload,
                                         double told);

} // namespace halyard::exporting
