#include "CycleCounter.h"

#include <algorithm>
#include <limits>
#include <variant>

#include "StreamFacts.h"

namespace halyard::pipewire {

namespace {

constexpr double kSecond = 1e9;

// Not measured when it is negative.
double secondsBetween(Nanoseconds from, Nanoseconds to) {
    return to >= from ? static_cast<double>(to - from) / kSecond
                      : std::numeric_limits<double>::quiet_NaN();
}

} // namespace

void CycleCounter::handle(const GraphEvent& event) {
    if (const auto* const removed = std::get_if<ObjectRemoved>(&event)) {
        devices_.erase(removed->id);
    } else if (std::holds_alternative<Disconnected>(event)) {
        devices_.clear();
    } else if (const auto* const node = std::get_if<NodeChanged>(&event)) {
        if (isDevice(node->properties) &&
            (devices_.size() < kMaxNames || devices_.contains(node->id))) {
            Device& device = devices_[node->id];
            device.name = property(node->properties, "node.name");
            // What plays and records at once is driven by what it plays.
            device.isSink = !property(node->properties, "media.class").starts_with("Audio/Source");
        }
    }
}

// A cycle that somebody missed is told twice, the first time with the signal of the
// one before.
void CycleCounter::take(const Cycle& cycle) {
    const auto found = devices_.find(cycle.driver.id);
    const NodeCycle& driver = cycle.driver;
    if (found == devices_.end() || driver.signal == driver.previousSignal ||
        driver.signal <= found->second.signal) {
        return;
    }
    Device& device = found->second;
    const bool first = device.signal == 0;
    device.signal = driver.signal;
    const bool missed =
        std::any_of(cycle.followers.begin(), cycle.followers.end(), [](const NodeCycle& node) {
            return node.progress == Progress::Triggered || node.progress == Progress::Awake;
        });
    const double unknown = std::numeric_limits<double>::quiet_NaN();
    statistics_.add(
        device.name, device.isSink,
        {.waitSeconds = secondsBetween(cycle.clock - (missed ? cycle.length() : 0), driver.signal),
         .busySeconds = missed ? unknown : secondsBetween(driver.signal, driver.finish),
         .cycleSeconds = first ? unknown : secondsBetween(driver.previousSignal, driver.signal),
         .missed = missed});
}

} // namespace halyard::pipewire
