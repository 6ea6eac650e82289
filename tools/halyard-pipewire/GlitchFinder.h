// Finds the stretches in which a running stream missed cycles of its graph, and
// groups them into episodes.
//
// The server tells of each cycle how far each node got. A node that was not done
// when the next cycle began has missed it; when the device's own timer came so late
// that somebody missed a cycle by it, everybody has, whatever else is said of them
// while the device catches up. What is missed before a stream's first good cycle on a device
// belongs to its start, and what is missed just before it stops to its end: neither is heard as a
// glitch.
//
// Knows neither PipeWire nor clocks: takes records and the time. Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <unordered_map>
#include <utility>

#include "Cycle.h"

namespace halyard::pipewire {

// Whose cycles: the ID of the stream's session. Unlike a node's it is not used again.
using StreamKey = std::int64_t;

// Missed cycles that belong together.
struct Episode {
    StreamKey stream = 0;
    ObjectId driver = 0;
    Nanoseconds start = 0; // of the first missed cycle
    Nanoseconds end = 0;   // of the last one
    Nanoseconds missing = 0;
    Nanoseconds cycleLength = 0; // of the last one
    // From the signal of a cycle that was missed to the end of the work that made
    // it so, added up: how long something held the stream up.
    Nanoseconds held = 0;
    std::uint64_t cycles = 0;
    std::uint64_t lateCycles = 0; // of these, those of a late driver
    Nanoseconds lateness = 0;     // of the driver, at most
    double busyCycles = 0;        // the longest own work over a cycle's length; 0: not known
    double othersCycles = 0;      // work of the other nodes in a missed cycle, at most
    double largestOther = 0;      // of one of them
    bool woke = false;            // it had begun work on a cycle that it missed
    bool waitedForOthers = false; // was not told to work, because others had not finished
    bool inferred = false;
};

class GlitchFinder final {
public:
    static constexpr std::size_t kMaxStreams = 1024;
    // Missed cycles that lie closer together, or closer than two cycles, are one episode.
    static constexpr Nanoseconds kGap = 200'000'000;
    // How long records are waited for: they come up to a second late.
    static constexpr Nanoseconds kPatience = 1'700'000'000;
    // An episode that lasts longer is told with what is known.
    static constexpr Nanoseconds kLong = 10'000'000'000;
    // Missed cycles this close to the end of a run, or two at the most, belong to it.
    static constexpr Nanoseconds kEnding = 100'000'000;

    // The stream of this node runs from `now` on. False when there are too many.
    bool begin(StreamKey stream, ObjectId node, Nanoseconds now);
    // It runs no longer; records of the time before may still come. `broken`: it was
    // not stopped but its program is gone, so that its end is no excuse.
    void end(StreamKey stream, Nanoseconds now, bool broken = false);
    // Forgets it and its episode.
    void forget(StreamKey stream);

    void take(const Cycle& cycle);
    // Something beside the server's records tells that a cycle was missed.
    void infer(StreamKey stream, Nanoseconds start, Nanoseconds length);

    // True until everything that is to be known of an ended stream is.
    bool pending(StreamKey stream, Nanoseconds now) const;
    // Records are waited for: a stream runs, or did so lately, or has an episode.
    bool waiting(Nanoseconds now) const;
    // The one that is open. Null when none is.
    const Episode* episode(StreamKey stream) const;
    // What is missed less than this after its end belongs to it.
    static Nanoseconds gapOf(const Episode& episode);
    // Of the stream's last cycle; 0 before the first.
    Nanoseconds cycleLength(StreamKey stream) const;

    // Tells the episodes that are over, and once one that lasts long.
    void due(Nanoseconds now);
    // Ends every episode now.
    void flush();

    // Hears of an episode as soon as it begins. To be set before the first record, as
    // is `tell`; neither may call back.
    std::function<void(const Episode&)> opened;
    // Hears of one that is over, or lasts long.
    std::function<void(const Episode&, bool over)> tell;

    std::uint64_t ignoredStreams() const { return ignored_; }

private:
    struct Stall {
        Nanoseconds begin = 0;
        Nanoseconds awake = 0; // 0: had not begun
    };
    struct Stream {
        ObjectId node = 0;
        Nanoseconds from = 0;
        std::optional<Nanoseconds> until;
        ObjectId driver = 0;
        bool warm = false; // has had a good cycle on this driver
        Nanoseconds lastStart = 0;
        std::optional<std::uint32_t> missedSoFar;
        std::optional<Stall> stall;
        std::optional<Episode> episode;
        bool broken = false;
        bool told = false;
    };
    struct Driver {
        Nanoseconds seen = 0; // the start of the latest cycle
        Nanoseconds signal = 0;
        Nanoseconds length = 0;
        Nanoseconds nextDue = 0;
        std::uint32_t missedSoFar = 0;
        bool late = false; // and its followers with it
    };
    // What a record says of its cycle as a whole.
    struct Moment {
        const Cycle* cycle = nullptr; // the record
        Nanoseconds start = 0;
        Nanoseconds length = 0;
        Nanoseconds lateness = 0;
        ObjectId driver = 0;
        bool late = false;
        bool incomplete = false; // somebody was not done
        Nanoseconds skipped = 0; // cycles before it that nobody told of, as time
    };

    std::optional<Moment> momentOf(const Cycle& cycle);
    std::pair<const StreamKey, Stream>* running(ObjectId node, Nanoseconds at);
    static bool countsMore(Stream& stream, const NodeCycle& node);
    static void weighOthers(Episode& episode, const NodeCycle& node, const Moment& moment);
    void look(StreamKey key, Stream& stream, const NodeCycle& node, const Moment& moment);
    void miss(StreamKey key, Stream& stream, const NodeCycle& node, const Moment& moment);
    static void recover(Stream& stream, const NodeCycle& node, const Moment& moment);
    Episode& episodeOf(StreamKey key, Stream& stream, Nanoseconds start);
    static Episode soFar(const Stream& stream);
    static void dropStall(Stream& stream);
    void close(Stream& stream);
    bool isOver(const Stream& stream, Nanoseconds now) const;
    static bool isEnding(const Stream& stream);

    std::map<StreamKey, Stream> streams_;
    std::unordered_multimap<ObjectId, StreamKey> byNode_;
    std::unordered_map<ObjectId, Driver> drivers_;
    std::uint64_t ignored_ = 0;
};

} // namespace halyard::pipewire
