// What the messages of a group of sessions come to.
//
// Played time: a stretch begins with a message of playing state 1 and ends with the
// next of state 0. Devices: the lists of active devices. Direction, where the session
// does not say it: that of its playback or record messages, if only one kind came.
//
// A session that lasts as long as the store reaches back makes this a pass over all
// messages. So rows do not come out of SQLite one by one: two functions that its
// statement calls look at them where they lie, and only those that may tell something
// are parsed. A statement takes some ten thousand rows, so that no transaction is long.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
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
    // Borrowed from the row.
    struct Message {
        std::int64_t category = 0;
        std::int64_t type = 0;
        double time = 0;
        std::string_view payload;
    };
    struct Running {
        std::optional<double> playingSince;
        std::unordered_set<double> glitchStarts;
        bool played = false;
        bool captured = false;
    };

    // What the statement calls: whether a message belongs to one of the sessions, and
    // then what it is.
    static void isOurs(sqlite3_context* answer, int count, sqlite3_value** values);
    static void takeRow(sqlite3_context* answer, int count, sqlite3_value** values);

    bool find(std::int64_t session);
    void take(const Message& message);
    void takePlayingState(double time);
    void takeGlitch(std::optional<double> start);
    void takeDevices();
    void addStretch(Session& session, double from, double to) const;

    std::vector<Session>& sessions_;
    const TimeRange range_;
    std::vector<Running> running_;
    JsonFields fields_;
    // Of the message at hand.
    Session* session_ = nullptr;
    Running* state_ = nullptr;
};

} // namespace halyard::reading
