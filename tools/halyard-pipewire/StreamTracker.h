// Turns what happens in a PipeWire graph into reporting sessions: one for each
// playback or capture stream, from the first time it runs until it goes away.
//
// Events only update a picture of the graph; messages come of looking at that
// picture when a burst of events has settled. So a stream that moves between
// devices makes one route change however its links come and go meanwhile, and a
// dragged slider makes a message per look, not per step. What must not be lost
// in between, a stream that ran, is remembered until the next look.
//
// Not thread-safe: runs on the thread that delivers the graph's events.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>

#include "GraphEvents.h"
#include "SessionSink.h"
#include "StreamContents.h"
#include "StreamFacts.h"
#include "StreamObserver.h"
#include "StreamRoutes.h"

namespace halyard::pipewire {

class StreamTracker final {
public:
    // Objects of one kind that are kept; more are ignored and counted.
    static constexpr std::size_t kMaxObjects = 8192;

    // Borrows `sink`. Reporter IDs count up from `firstReporterID`, which is to
    // be positive and leave room above.
    StreamTracker(SessionSink& sink, std::int64_t firstReporterID);

    void handle(const GraphEvent& event);

    // Tells `observer`, which is borrowed, when streams run. A session whose node is
    // gone stays open until settle() when the observer waits for something.
    void observe(StreamObserver& observer) { observer_ = &observer; }
    void settle(StreamKey stream);

    // Says again what plays, for a daemon that has just begun to listen and was
    // told only that the sessions exist.
    void restate();
    // Closes every session, as if all streams had gone.
    void closeAll();

    std::uint64_t ignoredObjects() const { return ignoredObjects_; }

private:
    // What a volume message says, but for where.
    struct Loudness {
        double volume = 0;
        bool playing = false;
        bool streamMuted = false;
        bool devicesMuted = false;
        bool operator==(const Loudness&) const = default;
    };
    // What was told of a stream, and to whom.
    struct Session {
        std::int64_t reporterID = 0;
        StreamRun facts;
        std::string operationProcess;
        std::int64_t run = 0; // how many times it has started to run
        bool playing = false;
        Surroundings around;
        float deviceVolume = 1; // of the loudest device, as a factor of samples
        std::optional<Loudness> told;
    };
    struct Node {
        Properties properties;
        std::optional<Direction> direction; // set for streams that report
        bool passes = false;                // plays or captures by what it is linked to
        bool linked = true;                 // of those that pass: to a device
        bool running = false;
        bool ranSinceLook = false;
        float volume = 1; // 0 when muted
        bool muted = false;
        std::string format;
        std::optional<Session> session;
    };

    void on(const ClientChanged& event);
    void on(const NodeChanged& event);
    void on(const NodeStateChanged& event);
    void on(const NodeVolumeChanged& event);
    void on(const NodeFormatChanged& event);
    void on(const LinkAdded& event);
    void on(const ObjectRemoved& event);
    void on(const Settled& event);
    void on(const Disconnected& event);

    Node* find(ObjectId id);
    template <class Map> bool hasRoom(const Map& map, ObjectId id);

    void direct(Node& stream, const Route& route);
    void look(ObjectId id, Node& stream, const Route& route);
    void open(Node& stream);
    void close(ObjectId id, Node& stream);
    void end(Node& stream);
    void finish(Session& session);
    void beginRun(ObjectId id, Session& session, const Node& stream);
    void endRun(Session& session);
    void follow(Session& session, const Node& stream, const Route& route);
    void tellStart(Session& session);
    void tellStop(Session& session, const StreamEnd& end);
    void tellRoute(Session& session, const std::set<std::string>& previous);
    void tellVolume(Session& session, double volume, bool playing);

    SessionSink& sink_;
    std::int64_t nextReporterID_;
    std::map<ObjectId, Properties> clients_;
    std::map<ObjectId, Node> nodes_;
    StreamRoutes routes_;
    StreamObserver* observer_ = nullptr;
    std::map<StreamKey, Session> leaving_; // their nodes are gone
    std::uint64_t ignoredObjects_ = 0;
};

} // namespace halyard::pipewire
