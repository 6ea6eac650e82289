// What happens in a PipeWire graph, as plain values: the adapter makes them, the
// tracker takes them. Nothing here knows libpipewire, so that the tracker can be
// tested with scripts of such events.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <variant>

namespace halyard::pipewire {

// An object's number in the graph. Numbers are used again for later objects.
using ObjectId = std::uint32_t;

// Properties as PipeWire gives them: text, whatever they mean.
using Properties = std::map<std::string, std::string, std::less<>>;

enum class NodeState : std::uint8_t {
    Stopped, // suspended, idle, creating or in error: no sound passes
    Running,
};

// A connected application appeared, or what is known of it changed.
struct ClientChanged {
    ObjectId id = 0;
    Properties properties;
};

// A node appeared, or its properties changed.
struct NodeChanged {
    ObjectId id = 0;
    Properties properties;
};

struct NodeStateChanged {
    ObjectId id = 0;
    NodeState state = NodeState::Stopped;
};

// The volume as it multiplies samples (1 is unchanged, a slider at half gives
// 0.125), of the loudest channel.
struct NodeVolumeChanged {
    ObjectId id = 0;
    float linearVolume = 1;
    bool muted = false;
};

// "F32LE 2ch 48000Hz"; empty when the node has no format now.
struct NodeFormatChanged {
    ObjectId id = 0;
    std::string format;
};

// One of the links between two nodes (there is one for each channel).
struct LinkAdded {
    ObjectId id = 0;
    ObjectId outputNode = 0;
    ObjectId inputNode = 0;
};

// A client, node or link is gone.
struct ObjectRemoved {
    ObjectId id = 0;
};

// A burst of events is over and the graph is worth looking at. Between, a
// stream that moves to another device may be linked to both or to none.
struct Settled {};

// The connection is lost: every object is gone.
struct Disconnected {};

using GraphEvent = std::variant<ClientChanged, NodeChanged, NodeStateChanged, NodeVolumeChanged,
                                NodeFormatChanged, LinkAdded, ObjectRemoved, Settled, Disconnected>;

using GraphListener = std::function<void(const GraphEvent&)>;

} // namespace halyard::pipewire
