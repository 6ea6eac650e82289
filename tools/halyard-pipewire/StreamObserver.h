// Who wants to know when streams run, beside their sessions.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "GlitchFinder.h"
#include "GraphEvents.h"
#include "StreamFacts.h"

namespace halyard::pipewire {

// A stream at the begin of a run.
struct StreamRun {
    StreamKey key = 0; // its session's ID
    ObjectId node = 0;
    Direction direction = Direction::Playback;
    std::string application = {};
    std::string nodeName = {};
    std::string device = {}; // that it plays on or records from, by its node's name
    std::optional<std::int64_t> process = std::nullopt; // the program's
    // A server's process does its work in the graph, out of a buffer of this length.
    bool viaServer = false;
    std::optional<double> bufferSeconds = std::nullopt;
};

// What there is to say of a stream's end.
struct StreamEnd {
    std::uint64_t unreported = 0; // glitches that were left out since the last message
    // What became of its program, as far as that is known: "lives", "ended", "died".
    const char* program = nullptr;
};

// Implementers must not call back into the tracker.
class StreamObserver {
public:
    virtual ~StreamObserver() = default;

    virtual void runs(const StreamRun& run) = 0;
    // It plays on, or records from, another device now.
    virtual void routed(StreamKey stream, const std::string& device) = 0;
    virtual void stopped(StreamKey stream) = 0;
    // Its node is gone, its session lasts until the observer has settled it: true
    // when there is something to wait for.
    virtual bool gone(StreamKey stream) = 0;
    // Tells what is to be told of all streams, now.
    virtual void settleAll() = 0;
    // The session is to be closed, and forgotten.
    virtual StreamEnd closing(StreamKey stream) = 0;
};

} // namespace halyard::pipewire
