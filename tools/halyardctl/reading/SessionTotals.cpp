#include "reading/SessionTotals.h"

#include <algorithm>
#include <fmt/format.h>

#include "common/HYReportingUtility.h"

namespace halyard::reading {
namespace {

// Columns of the pass; the payload only where something may be in it.
enum Column : int { kSession = 1, kCategory, kType, kTime, kPayload };

// Nobody has more; a message that names thousands is not meant well.
constexpr std::size_t kMostDevices = 64;

std::string columns() {
    return fmt::format("upload_session, category, type, time, CASE WHEN category IN "
                       "({}, {}, {}, {}, {}) OR type = {} THEN payload END",
                       kAudioEventCategoryRecord, kAudioEventCategoryPlayback,
                       kAudioEventCategoryPlaybackAndRecord, kAudioEventCategoryRouteChange,
                       kAudioEventCategoryVolume, kAudioEventTypeIssueDetector);
}

} // namespace

SessionTotals::SessionTotals(std::vector<Session>& sessions, const TimeRange& range)
    : sessions_(sessions), range_(range), running_(sessions.size()) {}

Outcome<void> SessionTotals::read(StoreReader& reader, StoreReader::Ids ids) {
    if (sessions_.empty()) {
        return {};
    }
    const std::string ours =
        fmt::format("upload_session BETWEEN {} AND {}", sessions_.front().id, sessions_.back().id);
    return reader.forEach({"upload_message", columns(), ours, ids.after, ids.upTo},
                          [this](const Row& row) {
                              take(row);
                              return true;
                          });
}

void SessionTotals::take(const Row& row) {
    const std::int64_t id = row.integer(kSession);
    const auto found = std::lower_bound(
        sessions_.begin(), sessions_.end(), id,
        [](const Session& session, std::int64_t value) { return session.id < value; });
    if (found == sessions_.end() || found->id != id) {
        return;
    }
    Running& running = running_[static_cast<std::size_t>(found - sessions_.begin())];
    ++found->messages;
    found->lastHeard = row.real(kTime);
    running.played = running.played || row.integer(kCategory) == kAudioEventCategoryPlayback;
    running.captured = running.captured || row.integer(kCategory) == kAudioEventCategoryRecord;
    if (!row.isNull(kPayload)) {
        takePayload(*found, running, row);
    }
}

void SessionTotals::takePayload(Session& session, Running& running, const Row& row) {
    const bool readable = fields_.parse(row.text(kPayload));
    if (row.integer(kType) == kAudioEventTypeIssueDetector) {
        takeGlitch(session, running, readable ? fields_.number("glitch_start") : std::nullopt);
    }
    if (!readable || row.integer(kType) == kAudioEventTypeSummary) {
        return;
    }
    takeDevices(session);
    takePlayingState(session, running,
                     fields_.number("hyreporting_timestamp").value_or(row.real(kTime)));
}

void SessionTotals::takeDevices(Session& session) const {
    fields_.forEachText("active_devices", [&](std::string_view device) {
        auto& known = session.devices;
        if (device != "Unknown" && known.size() < kMostDevices &&
            std::find(known.begin(), known.end(), device) == known.end()) {
            known.emplace_back(device);
        }
    });
}

void SessionTotals::takePlayingState(Session& session, Running& running, double time) const {
    const auto state = fields_.integer("VQSessionVolumePlayingState");
    if (!state) {
        return;
    }
    if (*state != 0) {
        running.playingSince = running.playingSince.value_or(time);
    } else if (running.playingSince) {
        addStretch(session, *running.playingSince, time);
        running.playingSince.reset();
    }
}

// A glitch that lasts is told more than once, each time with the same start.
void SessionTotals::takeGlitch(Session& session, Running& running, std::optional<double> start) {
    // A glitch without one is told once.
    if (!start || running.glitchStarts.insert(*start).second) {
        ++session.glitches;
    }
}

void SessionTotals::addStretch(Session& session, double from, double to) const {
    session.playedSeconds += std::max(0.0, to - from);
    session.playedInRange +=
        std::max(0.0, std::min(to, range_.until) - std::max(from, range_.since));
}

void SessionTotals::finish(std::optional<double> now) {
    for (std::size_t i = 0; i < sessions_.size(); ++i) {
        Session& session = sessions_[i];
        const Running& running = running_[i];
        if (session.direction == Direction::Unknown && running.played != running.captured) {
            session.direction = running.played ? Direction::Playback : Direction::Capture;
        }
        if (running.playingSince) {
            const double end = session.closed ? *session.closed : now.value_or(session.lastHeard);
            addStretch(session, *running.playingSince, end);
        }
    }
}

} // namespace halyard::reading
