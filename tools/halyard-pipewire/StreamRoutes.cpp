#include "StreamRoutes.h"

#include <algorithm>
#include <vector>

#include "StreamFacts.h"

namespace halyard::pipewire {

void StreamRoutes::setNode(ObjectId id, const Properties& properties) {
    Place& place = places_[id];
    place.properties = properties;
    place.device = isDevice(properties);
    place.passes = passesSound(properties);
}

void StreamRoutes::setVolume(ObjectId id, float linearVolume, bool muted) {
    Place& place = places_.at(id);
    place.volume = muted ? 0 : linearVolume;
    place.muted = muted;
}

bool StreamRoutes::addLink(const LinkAdded& link) {
    removeLink(link.id);
    if (links_.size() >= kMaxLinks) {
        return false;
    }
    links_.emplace(link.id, link);
    downstream_.emplace(link.outputNode, link.id);
    upstream_.emplace(link.inputNode, link.id);
    return true;
}

void StreamRoutes::remove(ObjectId id) {
    places_.erase(id);
    removeLink(id);
}

void StreamRoutes::removeLink(ObjectId id) {
    const auto found = links_.find(id);
    if (found != links_.end()) {
        downstream_.erase({found->second.outputNode, id});
        upstream_.erase({found->second.inputNode, id});
        links_.erase(found);
    }
}

void StreamRoutes::clear() {
    places_.clear();
    links_.clear();
    downstream_.clear();
    upstream_.clear();
}

// Visits the devices at the `end` of the links that lead away from a node, and
// goes on behind the nodes that pass sound.
template <class Visit>
void StreamRoutes::walk(ObjectId from, const Ways& ways, ObjectId LinkAdded::*end,
                        Visit visit) const {
    std::set<ObjectId> seen{from};
    std::vector<ObjectId> passed{from};
    for (std::size_t i = 0; i < passed.size(); ++i) {
        for (auto way = ways.lower_bound({passed[i], 0});
             way != ways.end() && way->first == passed[i]; ++way) {
            const ObjectId other = links_.at(way->second).*end;
            const auto place = places_.find(other);
            if (place == places_.end() || !seen.insert(other).second) {
                continue;
            }
            if (place->second.device) {
                visit(place->second);
            } else if (place->second.passes && passed.size() <= kMaxPassed) {
                passed.push_back(other);
            }
        }
    }
}

void StreamRoutes::addPrincipal(Route& route, const Place& device, bool first) {
    const std::string name = property(device.properties, "node.name");
    route.principal = first ? name : std::min(route.principal, name);
    route.volume = first ? device.volume : std::max(route.volume, device.volume);
    route.muted = device.muted && (first || route.muted);
}

Route StreamRoutes::routeOf(ObjectId stream) const {
    Route route;
    walk(stream, downstream_, &LinkAdded::inputNode, [&](const Place& device) {
        addPrincipal(route, device, !route.plays);
        route.plays = true;
        route.devices.insert(property(device.properties, "node.name"));
    });
    const auto listener = places_.find(stream);
    walk(stream, upstream_, &LinkAdded::outputNode, [&](const Place& device) {
        if (!route.plays) {
            addPrincipal(route, device, !route.captures());
        }
        const bool monitor = listener != places_.end() &&
                             givesMonitor(device.properties, listener->second.properties);
        (monitor ? route.monitors : route.hears) = true;
        route.devices.insert(property(device.properties, "node.name"));
    });
    return route;
}

} // namespace halyard::pipewire
