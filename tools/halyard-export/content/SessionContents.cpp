#include "content/SessionContents.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

#include "common/HYReportingUtility.h"

namespace halyard::exporting {
namespace {

using reading::Outcome;
using reading::Row;

enum Column : int { kID, kSession, kCategory, kType, kTime, kPayload };

// Of one session. A day of sound has some hundred; what goes on changing its volume has
// more than anybody looks at.
constexpr std::size_t kMostChanges = 512;
constexpr std::size_t kMostGlitches = 4096;
constexpr std::size_t kMostStatistics = 64;
// Of all sessions of a group, so that a group of the worst stays within bounds: of what
// traces tell, and of statistics.
constexpr std::size_t kMostBytes = 8 * 1024 * 1024;
constexpr std::size_t kMostStatisticsBytes = 4 * 1024 * 1024;
// A session's last messages are written moments after it was closed, and its first may
// have been taken before.
constexpr double kMargin = 10;

class Gatherer {
public:
    Gatherer(const std::vector<BookedSession>& sessions, const ConsentHistory& consent)
        : consent_(consent) {
        for (const BookedSession& session : sessions) {
            contents_.try_emplace(session.row);
        }
    }

    void take(const Row& row) {
        const auto found = contents_.find(row.integer(kSession));
        if (found == contents_.end() || !consent_.isGivenAt(row.real(kTime))) {
            return;
        }
        SessionContents& contents = found->second;
        const auto category = static_cast<std::uint32_t>(row.integer(kCategory));
        const auto type = static_cast<std::uint16_t>(row.integer(kType));
        if (type == kAudioEventTypeIssueDetector) {
            takeGlitch(contents, row);
        } else if (category == kAudioEventCategoryHWReporting) {
            const bool fits = contents.statistics.size() < kMostStatistics;
            keep(contents.statistics, fits, statisticsRoom_, row, contents.statisticsLeftOut);
        } else if (type == kAudioEventTypeActivate && (category == kAudioEventCategoryRouteChange ||
                                                       category == kAudioEventCategoryVolume)) {
            const bool fits = contents.changes.size() < kMostChanges;
            keep(contents.changes, fits, room_, row, contents.changesLeftOut);
        }
    }
    ContentsOf taken() { return std::move(contents_); }

private:
    static bool takeRoom(std::size_t& room, std::size_t bytes) {
        const bool fits = bytes <= room;
        room -= fits ? bytes : 0;
        return fits;
    }
    static void keep(std::vector<TimedPayload>& into, bool fits, std::size_t& room, const Row& row,
                     std::uint64_t& leftOut) {
        if (!fits || !takeRoom(room, row.text(kPayload).size())) {
            ++leftOut;
            return;
        }
        into.push_back({static_cast<std::uint32_t>(row.integer(kCategory)),
                        static_cast<std::uint16_t>(row.integer(kType)), row.real(kTime),
                        std::string(row.text(kPayload))});
    }
    void takeGlitch(SessionContents& contents, const Row& row) {
        auto glitch = glitchFactsIn(fields_, row.text(kPayload), row.real(kTime));
        if (!glitch) {
            return;
        }
        const auto key = std::pair(glitch->start, glitch->node);
        const bool isKnown = contents.glitches.contains(key);
        if (!isKnown && (contents.glitches.size() >= kMostGlitches ||
                         !takeRoom(room_, glitch->payload.size() + sizeof(GlitchFacts)))) {
            ++contents.glitchesLeftOut;
            return;
        }
        contents.glitches.insert_or_assign(key, *std::move(glitch));
    }

    const ConsentHistory& consent_;
    ContentsOf contents_;
    reading::JsonFields fields_;
    std::size_t room_ = kMostBytes;
    std::size_t statisticsRoom_ = kMostStatisticsBytes;
};

reading::TimeRange rangeOf(const std::vector<BookedSession>& sessions) {
    reading::TimeRange range;
    range.since = sessions.front().opened;
    range.until = sessions.front().closed.value_or(range.since);
    for (const BookedSession& session : sessions) {
        range.since = std::min(range.since, session.opened);
        range.until = std::max(range.until, session.closed.value_or(session.opened));
    }
    range.since -= kMargin;
    range.until += kMargin;
    return range;
}

std::string conditionFor(Wanted wanted) {
    std::string types = fmt::format("type = {}", kAudioEventTypeIssueDetector);
    if (wanted != Wanted::Statistics) {
        types += fmt::format(" OR (type = {} AND category IN ({}, {}))", kAudioEventTypeActivate,
                             kAudioEventCategoryRouteChange, kAudioEventCategoryVolume);
    }
    if (wanted != Wanted::Events) {
        types += fmt::format(" OR category = {}", kAudioEventCategoryHWReporting);
    }
    return "upload_session IS NOT NULL AND (" + types + ")";
}

} // namespace

std::optional<GlitchFacts> glitchFactsIn(reading::JsonFields& fields, std::string_view payload,
                                         double told) {
    if (!fields.parse(payload)) {
        return std::nullopt;
    }
    GlitchFacts glitch;
    glitch.start = fields.number("glitch_start").value_or(told);
    glitch.node = fields.text("node").value_or("");
    glitch.cause = fields.text(kGlitchCause).value_or("unknown");
    glitch.seconds = fields.number(kGlitchSeconds);
    glitch.told = told;
    glitch.payload = payload;
    return glitch;
}

Outcome<ContentsOf> gatherContents(reading::StoreReader& reader,
                                   const std::vector<BookedSession>& sessions,
                                   const ConsentHistory& consent, Wanted wanted) {
    if (sessions.empty()) {
        return ContentsOf();
    }
    const auto ids = reader.idsIn(rangeOf(sessions), "upload_message", "time");
    if (!ids.ok()) {
        return ids.failure();
    }
    Gatherer gatherer(sessions, consent);
    const auto done =
        reader.forEach({"upload_message", "upload_session, category, type, time, payload",
                        conditionFor(wanted), ids.value().after, ids.value().upTo},
                       [&gatherer](const Row& row) {
                           gatherer.take(row);
                           return true;
                       });
    return done.ok() ? Outcome<ContentsOf>(gatherer.taken()) : done.failure();
}

} // namespace halyard::exporting
