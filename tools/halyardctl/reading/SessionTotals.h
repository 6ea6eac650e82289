// What the messages of a group of sessions come to.
//
// Played time: a stretch begins with a message of playing state 1 and ends with the
// next of state 0. Devices: the lists of active devices. Direction, where the session
// does not say it: that of its playback or record messages, if only one kind came.
//
// Not thread-safe.
#pragma once

#include <optional>
#include <unordered_set>
#include <vector>

#include "reading/Sessions.h"

namespace halyard::reading {

class SessionTotals {
public:
    // Borrows the sessions, which stand by rising ids.
    SessionTotals(std::vector<Session>& sessions, const TimeRange& range);

    Outcome<void> read(StoreReader& reader, StoreReader::Ids ids);
    // Ends what has not ended: with the session; at `now` when it still runs; else with
    // its last message.
    void finish(std::optional<double> now);

private:
    struct Running {
        std::optional<double> playingSince;
        std::unordered_set<double> glitchStarts;
        bool played = false;
        bool captured = false;
    };

    void take(const Row& row);
    void takePayload(Session& session, Running& running, const Row& row);
    void takePlayingState(Session& session, Running& running, double time) const;
    static void takeGlitch(Session& session, Running& running, std::optional<double> start);
    void takeDevices(Session& session) const;

    void addStretch(Session& session, double from, double to) const;

    std::vector<Session>& sessions_;
    const TimeRange range_;
    std::vector<Running> running_;
    JsonFields fields_;
};

} // namespace halyard::reading
