// What is there, as a table for people: the devices of a graph, and the streams of
// its programs. For support, and for a first look at a machine; nothing of it is
// sent anywhere, and titles and file names are left out here, too.
//
// Not thread-safe: runs on the thread that delivers the graph's events.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "Cycle.h"
#include "GraphEvents.h"
#include "StreamFacts.h"
#include "StreamRoutes.h"

namespace halyard::pipewire {

class OnceReport final {
public:
    // Objects of one kind that are shown; more are counted in a last line.
    static constexpr std::size_t kMaxObjects = 8192;

    void handle(const GraphEvent& event);
    // A driver's cycle, which its followers share.
    void take(const Cycle& cycle);

    // Whether the length of a cycle is known of each device that runs.
    [[nodiscard]] bool complete() const;
    [[nodiscard]] std::string text() const;

private:
    struct Node {
        Properties properties;
        bool running = false;
        float volume = 1;
        bool muted = false;
        std::string format;
        std::string quantum; // of its last cycle: "1024/48000"
    };
    using Row = std::vector<std::string>;

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
    const Properties& clientOf(const Node& node) const;
    Row deviceRow(const Node& node) const;
    // Nullopt for what is no stream that reports.
    std::optional<Row> streamRow(ObjectId id, const Node& node) const;

    std::map<ObjectId, Properties> clients_;
    std::map<ObjectId, Node> nodes_;
    StreamRoutes routes_;
    std::uint64_t ignored_ = 0;
};

} // namespace halyard::pipewire
