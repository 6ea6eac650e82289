#include "report/SessionTimes.h"

#include <algorithm>

#include "common/HYReportingUtility.h"

namespace halyard::ctl {
namespace {

using reading::Direction;
using reading::Session;

constexpr std::size_t kMostRouteDevices = 4;

double endOf(const Session& session, const Digest& digest) {
    if (session.closed) {
        return *session.closed;
    }
    return digest.isLive ? digest.scope.now : session.lastHeard;
}

} // namespace

void SessionTimes::addSession(const Session& session) {
    ++digest_.sessionCount;
    const std::uint32_t application = applicationOf(session.application);
    ++digest_.applications[application].sessions;
    known_.push_back({session.id, endOf(session, digest_), application, session.direction});
}

// What is beyond the first names counts as one; it stands first.
std::uint32_t SessionTimes::applicationOf(const std::optional<std::string>& name) {
    auto& all = digest_.applications;
    if (all.empty()) {
        all.push_back({std::nullopt, true, 0, 0, 0});
    }
    // A name begins with a letter, so that none is like no name.
    const std::string key = name ? "=" + *name : "";
    if (const auto found = applications_.find(key); found != applications_.end()) {
        return found->second;
    }
    if (applications_.size() >= limits_.applications) {
        return 0;
    }
    const auto index = static_cast<std::uint32_t>(all.size());
    all.push_back({name, false, 0, 0, 0});
    applications_.emplace(key, index);
    return index;
}

const SessionTimes::Known* SessionTimes::find(std::int64_t session) const {
    const auto found =
        std::lower_bound(known_.begin(), known_.end(), session,
                         [](const Known& known, std::int64_t row) { return known.row < row; });
    return found == known_.end() || found->row != session ? nullptr : &*found;
}

void SessionTimes::takeMessage(std::int64_t session, std::int64_t category, std::int64_t type,
                               double time, const reading::JsonFields& fields) {
    const Known* const known = find(session);
    if (known == nullptr || type == kAudioEventTypeSummary) {
        return;
    }
    const double moment = fields.number("hyreporting_timestamp").value_or(time);
    takeVolume(*known, moment, fields);
    if (category == kAudioEventCategoryRouteChange && digest_.scope.range.contains(moment)) {
        RouteChange route{session, moment, {}};
        fields.forEachText("active_devices", [&](std::string_view device) {
            if (route.devices.size() < kMostRouteDevices) {
                route.devices.push_back(shortName(device));
            }
        });
        digest_.routes.add(std::move(route));
    }
}

void SessionTimes::takeVolume(const Known& known, double time, const reading::JsonFields& fields) {
    const auto state = fields.integer("VQSessionVolumePlayingState");
    if (!state) {
        return;
    }
    const auto running = playing_.find(known.row);
    if (running != playing_.end()) {
        end(known, running->second, time);
        playing_.erase(running);
    }
    if (*state != 0) {
        playing_[known.row] = {time, fields.number("VQSessionVolume")};
    }
}

void SessionTimes::end(const Known& known, const Playing& playing, double time) {
    const double from = std::max(playing.since, digest_.scope.range.since);
    const double to = std::min(time, digest_.scope.range.until);
    if (!(to > from)) {
        return;
    }
    ApplicationTotals& totals = digest_.applications[known.application];
    const bool captured = known.direction == Direction::Capture;
    (captured ? totals.capturedSeconds : totals.playedSeconds) += to - from;
    (captured ? digest_.capturedSeconds : digest_.playedSeconds) += to - from;
    digest_.stretches.add({known.row, from, to, playing.volume});
}

void SessionTimes::finish() {
    for (const auto& [row, playing] : playing_) {
        const Known* const known = find(row);
        end(*known, playing, known->end);
    }
    playing_.clear();
    auto& all = digest_.applications;
    std::erase_if(all, [](const ApplicationTotals& of) { return of.sessions == 0; });
    std::stable_sort(all.begin(), all.end(), [](const auto& one, const auto& other) {
        return one.playedSeconds + one.capturedSeconds >
               other.playedSeconds + other.capturedSeconds;
    });
}

} // namespace halyard::ctl
