#include "StreamTracker.h"

#include <charconv>
#include <utility>

#include "halyard/halyard.h"

namespace halyard::pipewire {

StreamTracker::StreamTracker(SessionSink& sink, std::int64_t firstReporterID)
    : sink_(sink), nextReporterID_(firstReporterID) {}

void StreamTracker::handle(const GraphEvent& event) {
    std::visit([this](const auto& what) { on(what); }, event);
}

void StreamTracker::restate() {
    for (auto& [id, node] : nodes_) {
        if (!node.session || !node.session->playing) {
            continue;
        }
        tellStart(*node.session);
        if (const auto told = std::exchange(node.session->told, std::nullopt)) {
            tellVolume(*node.session, told->volume, true);
        }
    }
}

void StreamTracker::closeAll() {
    if (observer_ != nullptr) {
        observer_->settleAll();
    }
    for (auto& [id, node] : nodes_) {
        close(id, node);
    }
    for (auto& [key, session] : leaving_) {
        finish(session);
    }
    leaving_.clear();
}

void StreamTracker::settle(StreamKey stream) {
    const auto found = leaving_.find(stream);
    if (found != leaving_.end()) {
        finish(found->second);
        leaving_.erase(found);
    }
}

// ---- The picture of the graph

template <class Map> bool StreamTracker::hasRoom(const Map& map, ObjectId id) {
    if (map.size() < kMaxObjects || map.contains(id)) {
        return true;
    }
    ++ignoredObjects_;
    return false;
}

StreamTracker::Node* StreamTracker::find(ObjectId id) {
    const auto found = nodes_.find(id);
    return found == nodes_.end() ? nullptr : &found->second;
}

void StreamTracker::on(const ClientChanged& event) {
    if (hasRoom(clients_, event.id)) {
        clients_[event.id] = event.properties;
    }
}

void StreamTracker::on(const NodeChanged& event) {
    if (!hasRoom(nodes_, event.id)) {
        return;
    }
    Node& node = nodes_[event.id];
    node.properties = event.properties;
    routes_.setNode(event.id, node.properties);
    // A session goes on as what it began.
    if (!node.session) {
        node.direction = reportedDirection(node.properties);
        node.passes = passesSound(node.properties);
        node.linked = !node.passes;
    }
}

void StreamTracker::on(const NodeStateChanged& event) {
    if (Node* const node = find(event.id)) {
        node->running = event.state == NodeState::Running;
        node->ranSinceLook = node->ranSinceLook || node->running;
    }
}

void StreamTracker::on(const NodeVolumeChanged& event) {
    if (Node* const node = find(event.id)) {
        node->volume = event.muted ? 0 : event.linearVolume;
        node->muted = event.muted;
        routes_.setVolume(event.id, event.linearVolume, event.muted);
    }
}

void StreamTracker::on(const NodeFormatChanged& event) {
    if (Node* const node = find(event.id)) {
        node->format = event.format;
    }
}

void StreamTracker::on(const LinkAdded& event) {
    if (!routes_.addLink(event)) {
        ++ignoredObjects_;
    }
}

void StreamTracker::on(const ObjectRemoved& event) {
    if (Node* const node = find(event.id)) {
        close(event.id, *node);
        nodes_.erase(event.id);
    }
    routes_.remove(event.id);
    clients_.erase(event.id);
}

void StreamTracker::on(const Disconnected&) {
    closeAll();
    nodes_.clear();
    routes_.clear();
    clients_.clear();
}

// ---- What comes of looking at it

void StreamTracker::on(const Settled&) {
    for (auto& [id, node] : nodes_) {
        if (!node.direction && !node.passes) {
            continue;
        }
        const Route route = routes_.routeOf(id);
        if (node.passes) {
            direct(node, route);
        }
        if (node.direction) {
            look(id, node, route);
            if (node.session && node.session->playing && !(node.running && node.linked)) {
                endRun(*node.session);
            }
        }
    }
}

// Such a node runs whether it is linked or not, and says nothing until it is. One
// that captured and plays now, or the other way, begins another session.
void StreamTracker::direct(Node& stream, const Route& route) {
    stream.linked = route.plays || route.captures();
    if (!stream.linked) {
        return;
    }
    const Direction direction = route.plays ? Direction::Playback : Direction::Capture;
    if (stream.session && direction != stream.direction) {
        end(stream);
    }
    stream.direction = direction;
}

void StreamTracker::look(ObjectId id, Node& stream, const Route& route) {
    const bool runs = stream.running && stream.linked;
    const bool ran = (std::exchange(stream.ranSinceLook, false) && stream.linked) || runs;
    if (!stream.session && ran) {
        open(stream);
    }
    if (!stream.session) {
        return;
    }
    Session& session = *stream.session;
    follow(session, stream, route);
    session.around.streamMuted = stream.muted;
    const double volume = perceivedVolume(stream.volume * session.deviceVolume);
    if (ran && !session.playing) {
        beginRun(id, session, stream);
    }
    // Also for a stream that is over already: it played at this volume.
    if (ran) {
        tellVolume(session, volume, true);
    }
    if (!runs) {
        tellVolume(session, volume, false);
    }
}

void StreamTracker::beginRun(ObjectId id, Session& session, const Node& stream) {
    session.playing = true;
    ++session.run;
    session.facts.node = id;
    session.facts.bufferSeconds = bufferSeconds(stream.properties, session.around.format);
    if (observer_ != nullptr) {
        observer_->runs(session.facts);
    }
    tellStart(session);
}

void StreamTracker::endRun(Session& session) {
    if (observer_ != nullptr) {
        observer_->stopped(session.reporterID);
    }
    tellStop(session, {});
}

void StreamTracker::open(Node& stream) {
    static const Properties kNobody;
    Properties client;
    ObjectId clientId = 0;
    const std::string text = property(stream.properties, "client.id");
    const char* const end = text.data() + text.size();
    if (std::from_chars(text.data(), end, clientId).ec == std::errc()) {
        const auto found = clients_.find(clientId);
        client = found == clients_.end() ? kNobody : found->second;
    }
    const Direction direction = *stream.direction;
    Session& session = stream.session.emplace(Session{});
    session.reporterID = nextReporterID_++;
    session.facts = {.key = session.reporterID,
                     .direction = direction,
                     .application = applicationName(stream.properties, client),
                     .nodeName = property(stream.properties, "node.name"),
                     .process = processId(stream.properties, client),
                     .viaServer = viaServer(stream.properties, client)};
    session.operationProcess = processName(stream.properties, client);
    if (session.operationProcess.empty()) {
        session.operationProcess = applicationName(stream.properties, client);
    }
    sink_.open(session.reporterID, serviceTypeOf(stream.properties, direction),
               configurationOf(stream.properties, client, direction));
}

void StreamTracker::close(ObjectId id, Node& stream) {
    if (!stream.direction) {
        return;
    }
    stream.running = false;
    look(id, stream, Route{});
    end(stream);
}

// What is known of a stream's last second comes later.
void StreamTracker::end(Node& stream) {
    if (!stream.session) {
        return;
    }
    Session& session = *stream.session;
    if (session.playing) {
        tellVolume(session, session.told ? session.told->volume : 0, false);
    }
    if (observer_ != nullptr && observer_->gone(session.reporterID)) {
        leaving_.emplace(session.reporterID, std::move(session));
    } else {
        finish(session);
    }
    stream.session.reset();
}

void StreamTracker::finish(Session& session) {
    const StreamEnd end =
        observer_ != nullptr ? observer_->closing(session.reporterID) : StreamEnd{};
    if (session.playing || end.unreported != 0) {
        tellStop(session, end);
    }
    sink_.close(session.reporterID);
}

// A stretch of playback belongs to one device and one format, so a change of
// either ends it before the change is told. Links and format vanish before a
// stream does; what they were last stays.
void StreamTracker::follow(Session& session, const Node& stream, const Route& route) {
    const bool rerouted = !route.devices.empty() && (route.devices != session.around.devices ||
                                                     route.hears != session.around.hears ||
                                                     route.monitors != session.around.monitors);
    const bool reformatted = !stream.format.empty() && stream.format != session.around.format;
    const bool endsStretch = (rerouted && !session.around.devices.empty()) ||
                             (reformatted && !session.around.format.empty());
    if (endsStretch && session.playing && session.told) {
        tellVolume(session, session.told->volume, false);
    }
    if (reformatted) {
        session.around.format = stream.format;
    }
    if (!route.devices.empty()) {
        session.facts.device = route.principal;
        session.deviceVolume = route.volume;
        session.around.devicesMuted = route.muted;
        session.around.hears = route.hears;
        session.around.monitors = route.monitors;
    }
    if (rerouted && observer_ != nullptr) {
        observer_->routed(session.reporterID, route.principal);
    }
    if (rerouted) {
        const std::set<std::string> previous = std::exchange(session.around.devices, route.devices);
        if (!previous.empty()) {
            tellRoute(session, previous);
        }
    }
}

void StreamTracker::tellStart(Session& session) {
    sink_.send(session.reporterID, {categoryOf(session.facts.direction), HALYARD_TYPE_START,
                                    startContents(session.run, session.around)});
}

void StreamTracker::tellStop(Session& session, const StreamEnd& end) {
    session.playing = false;
    sink_.send(session.reporterID, {categoryOf(session.facts.direction), HALYARD_TYPE_STOP,
                                    stopContents(session.run, end)});
}

void StreamTracker::tellRoute(Session& session, const std::set<std::string>& previous) {
    sink_.send(session.reporterID, {HALYARD_CATEGORY_ROUTE_CHANGE, HALYARD_TYPE_ACTIVATE,
                                    routeContents(previous, session.around)});
}

void StreamTracker::tellVolume(Session& session, double volume, bool playing) {
    const Loudness loudness{volume, playing, session.around.streamMuted,
                            session.around.devicesMuted};
    if (session.told == loudness) {
        return;
    }
    session.told = loudness;
    sink_.send(session.reporterID,
               {HALYARD_CATEGORY_VOLUME, HALYARD_TYPE_ACTIVATE,
                volumeContents(volume, playing, session.operationProcess, session.around)});
}

} // namespace halyard::pipewire
