#include "tracing/EventPairing.h"

#include <map>
#include <utility>

namespace halyard {

EventPairing pairOverAllThreads(const std::vector<trace_point>& points, std::uint32_t startCode,
                                std::uint32_t stopCode) {
    EventPairing result;
    const trace_point* pending = nullptr;
    for (const trace_point& point : points) {
        if (point.code == startCode) {
            if (pending != nullptr) {
                result.discardedStarts.push_back(pending);
            }
            pending = point.timestamp != 0 ? &point : nullptr;
        } else if (point.code == stopCode) {
            if (pending != nullptr) {
                result.pairs.push_back({pending, &point});
            } else {
                result.discardedStops.push_back(&point);
            }
            pending = nullptr;
        }
    }
    if (pending != nullptr) {
        result.openStarts.push_back(pending);
    }
    return result;
}

EventPairing pairByThread(const std::vector<trace_point>& points, std::uint32_t startCode,
                          std::uint32_t stopCode) {
    EventPairing result;
    std::map<std::uint64_t, const trace_point*> pending; // by thread
    for (const trace_point& point : points) {
        if (point.code == startCode) {
            const auto [open, isNew] = pending.try_emplace(point.threadID, &point);
            if (!isNew) {
                result.discardedStarts.push_back(std::exchange(open->second, &point));
            }
        } else if (point.code == stopCode) {
            if (const auto open = pending.find(point.threadID); open != pending.end()) {
                result.pairs.push_back({open->second, &point});
                pending.erase(open);
            } else {
                result.discardedStops.push_back(&point);
            }
        }
    }
    for (const auto& [thread, start] : pending) {
        result.openStarts.push_back(start);
    }
    return result;
}

} // namespace halyard
