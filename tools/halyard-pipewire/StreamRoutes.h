// Which devices a stream reaches: those that it is linked to, and those behind
// programs that pass sound on, as the nodes of JACK programs do.
//
// Walks are bounded: a graph wired by hand may be as large and as tangled as
// somebody makes it, and a look must not take longer for that.
//
// Not thread-safe: belongs to the tracker, and runs on its thread.
#pragma once

#include <cstddef>
#include <map>
#include <set>
#include <string>
#include <utility>

#include "GraphEvents.h"

namespace halyard::pipewire {

struct Route {
    std::set<std::string> devices; // node names of all of them
    std::string principal;         // the first that plays, else that is captured
    bool plays = false;            // sound goes to a device
    bool hears = false;            // sound comes from what a device hears: a microphone
    bool monitors = false;         // sound comes from what others play on a device
    float volume = 0;              // of the loudest that plays, else that is captured
    bool muted = false;            // each of those is

    bool captures() const { return hears || monitors; }
};

class StreamRoutes final {
public:
    static constexpr std::size_t kMaxLinks = 8192;
    // Programs that one walk goes through; devices behind more are not found.
    static constexpr std::size_t kMaxPassed = 64;

    // A node appeared, or its properties changed.
    void setNode(ObjectId id, const Properties& properties);
    // Requires a known node.
    void setVolume(ObjectId id, float linearVolume, bool muted);
    // False when there is no room.
    [[nodiscard]] bool addLink(const LinkAdded& link);
    // Of a node or link, known or not.
    void remove(ObjectId id);
    void clear();

    [[nodiscard]] Route routeOf(ObjectId stream) const;

private:
    struct Place {
        Properties properties;
        bool device = false;
        bool passes = false; // sound goes through it
        float volume = 1;    // 0 when muted
        bool muted = false;
    };
    // A node, and a link that leads away from it.
    using Ways = std::set<std::pair<ObjectId, ObjectId>>;

    // Of a device that is the first that counts, or one more.
    static void addPrincipal(Route& route, const Place& device, bool first);
    void removeLink(ObjectId id);
    template <class Visit>
    void walk(ObjectId from, const Ways& ways, ObjectId LinkAdded::*end, Visit visit) const;

    std::map<ObjectId, Place> places_;
    std::map<ObjectId, LinkAdded> links_;
    Ways downstream_;
    Ways upstream_;
};

} // namespace halyard::pipewire
