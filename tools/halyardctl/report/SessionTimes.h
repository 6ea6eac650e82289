// How long who played and captured, and when: what the messages about volume and route
// say, taken in their order.
//
// A stretch begins with a message of playing state 1, ends with the next one that tells
// of state or volume, and where the session ends. What lies outside of what was asked for
// is cut off.
//
// Not thread-safe.
#pragma once

#include <unordered_map>
#include <vector>

#include "report/Digest.h"

namespace halyard::ctl {

class SessionTimes {
public:
    // Borrows the digest.
    SessionTimes(Digest& digest, const Digest::Limits& limits) : digest_(digest), limits_(limits) {}

    // All sessions, by rising ids; then their messages; then finish().
    void addSession(const reading::Session& session);
    // `fields` holds the message's payload.
    void takeMessage(std::int64_t session, std::int64_t category, std::int64_t type, double time,
                     const reading::JsonFields& fields);
    void finish();

    bool knows(std::int64_t session) const { return find(session) != nullptr; }

private:
    // What there is of every session, however many there are.
    struct Known {
        std::int64_t row = 0;
        double end = 0;
        std::uint32_t application = 0; // index
        reading::Direction direction = reading::Direction::Unknown;
    };
    struct Playing {
        double since = 0;
        std::optional<double> volume;
    };

    std::uint32_t applicationOf(const std::optional<std::string>& name);
    const Known* find(std::int64_t session) const;
    void takeVolume(const Known& known, double time, const reading::JsonFields& fields);
    void end(const Known& known, const Playing& playing, double time);

    Digest& digest_;
    const Digest::Limits limits_;
    std::vector<Known> known_;
    std::unordered_map<std::int64_t, Playing> playing_;
    std::unordered_map<std::string, std::uint32_t> applications_;
};

} // namespace halyard::ctl
