#include "CycleStatistics.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>
#include <iterator>

namespace halyard::pipewire {

void CycleHistogram::add(double seconds) noexcept {
    if (!std::isfinite(seconds) || seconds < 0) {
        return;
    }
    // By way of nanoseconds, since 0.00003 times a million is less than 30.
    const double longest = static_cast<double>(kBounds[kBuckets]) / 1e6;
    const std::int64_t microseconds = std::llround(std::min(seconds, longest) * 1e9) / 1000;
    const auto* const above =
        std::upper_bound(std::begin(kBounds), std::end(kBounds) - 1, microseconds);
    ++hits_[static_cast<std::size_t>(above - std::begin(kBounds)) - 1];
}

std::string CycleHistogram::text() const {
    std::string text;
    for (std::size_t place = 0; place < kBuckets; ++place) {
        fmt::format_to(std::back_inserter(text), "{} {} {}\n", kBounds[place], kBounds[place + 1],
                       hits_[place]);
    }
    return text;
}

std::string DeviceCycles::countsText() const {
    return fmt::format("direction {}\ncycles {}\nmissed {}\n", isSink ? "sink" : "source", cycles,
                       missed);
}

DeviceCycles* CycleStatistics::find(std::string_view device, bool isSink) {
    const auto at = std::find_if(devices_.begin(), devices_.end(), [&](const DeviceCycles& each) {
        return each.isSink == isSink && each.device == device;
    });
    if (at != devices_.end()) {
        return &*at;
    }
    if (devices_.size() == kMaxDevices || device.empty()) {
        return nullptr;
    }
    DeviceCycles& added = devices_.emplace_back();
    added.device = device;
    added.isSink = isSink;
    return &added;
}

void CycleStatistics::add(std::string_view device, bool isSink, const Cycle& cycle) {
    DeviceCycles* const found = find(device, isSink);
    if (found == nullptr) {
        ++ignored_;
        return;
    }
    ++found->cycles;
    found->missed += cycle.missed ? 1 : 0;
    found->wait.add(cycle.waitSeconds);
    found->busy.add(cycle.busySeconds);
    found->cycle.add(cycle.cycleSeconds);
}

void CycleStatistics::restart(std::size_t place) {
    DeviceCycles anew;
    anew.device = std::move(devices_[place].device);
    anew.isSink = devices_[place].isSink;
    devices_[place] = std::move(anew);
}

} // namespace halyard::pipewire
