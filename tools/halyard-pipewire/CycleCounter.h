// Counts the cycles of devices, by their names, out of the records of their drivers.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "Cycle.h"
#include "CycleStatistics.h"
#include "GraphEvents.h"

namespace halyard::pipewire {

class CycleCounter final {
public:
    // Devices that are known by name; those of more are not counted.
    static constexpr std::size_t kMaxNames = 256;

    void handle(const GraphEvent& event);
    void take(const Cycle& cycle);

    CycleStatistics& statistics() { return statistics_; }

private:
    struct Device {
        std::string name;
        bool isSink = false;
        Nanoseconds signal = 0; // of its latest cycle
    };

    std::map<ObjectId, Device> devices_;
    CycleStatistics statistics_;
};

} // namespace halyard::pipewire
