// What tests of glitches against a real daemon share: the bridge without its
// connection to halyardd, in the test's own process, whose messages are kept.
#pragma once

#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "CycleCounter.h"
#include "GlitchTesting.h"
#include "GlitchWatch.h"
#include "PipeWireAdapter.h"
#include "PipeWireTesting.h"
#include "StreamTracker.h"

namespace halyard::pipewire {

// A message that tells of a glitch, and of whose.
struct ToldGlitch {
    std::string application;
    Contents contents;
    std::uint32_t category = 0;

    std::string cause() const { return contents.get<std::string>("issue_type"); }
    double start() const { return contents.get<double>("glitch_start"); }
    double silence() const { return contents.get<double>("any_channel_silence_seconds"); }
    double end() const { return start() + silence(); }
    std::int64_t cycles() const { return contents.get<std::int64_t>("glitch_cycles"); }
};

// Watches the daemon that the environment names, from the constructor on.
class WatchedGraph final : private SessionSink {
public:
    WatchedGraph();
    ~WatchedGraph();

    // Runs the loop until `done`; false when that takes longer than `patience`.
    bool until(const std::function<bool()>& done,
               std::chrono::milliseconds patience = std::chrono::seconds(30));
    // Runs the loop for this long.
    void pass(std::chrono::milliseconds time);
    // Runs the loop until records have told of everything up to this moment, and
    // what was to be told of it has been.
    bool untilSeen(Nanoseconds moment);
    bool untilSeenNow() { return untilSeen(monotonicNow()); }

    // Runs the loop while the player does as it is told.
    testing::Episode command(testing::GlitchPlayer& player, const std::string& text);
    // Returns when the stream plays, and the watch can tell what its program does.
    bool untilWatched(const std::string& application);

    bool playing(const std::string& application) const;
    std::string idOf(const std::string& node) const;
    std::string serialOf(const std::string& node) const;

    const std::vector<ToldGlitch>& glitches() const { return glitches_; }
    // What the watch decided, for people.
    const std::string& notes() const { return notes_; }
    // The tracker's and the watch's end, as when the bridge is told to end.
    void closeAll() { streams_.closeAll(); }
    // Of this session's last message of this kind.
    const Message* lastStop(const std::string& application) const;
    bool closed(const std::string& application) const;

private:
    struct Session {
        std::string application;
        bool playing = false;
        bool closed = false;
        std::optional<Message> stop;
    };

    void open(std::int64_t id, std::uint16_t service, const Contents& configuration) override;
    void send(std::int64_t id, const Message& message) override;
    void close(std::int64_t id) override { sessions_[id].closed = true; }

    void heard(const GraphEvent& event);
    void took(const Cycle& cycle);
    void watch();

    std::map<std::int64_t, Session> sessions_;
    std::vector<ToldGlitch> glitches_;
    std::map<std::string, NodeChanged> nodes_;
    std::string notes_;
    Nanoseconds seen_ = 0; // the latest cycle that was told
    bool watching_ = false;
    StreamTracker streams_;
    GlitchWatch glitchWatch_;
    PipeWireAdapter graph_; // last: it calls the rest
};

} // namespace halyard::pipewire
