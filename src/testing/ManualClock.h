// A clock that only moves when a test says so. Any thread may read it meanwhile.
#pragma once

#include <atomic>
#include <chrono>

#include "platform/Clock.h"

namespace halyard::testing {

class ManualClock final : public platform::Clock {
public:
    platform::WallTime wallTime() const override { return platform::WallTime(wall_.load()); }
    platform::SteadyTime steadyTime() const override {
        return platform::SteadyTime(steady_.load());
    }
    std::chrono::nanoseconds systemUptime() const override { return steady_.load(); }

    std::chrono::seconds utcOffset(platform::WallTime) const override { return offset; }

    void advance(std::chrono::nanoseconds by) {
        wall_.store(wall_.load() + by);
        steady_.store(steady_.load() + by);
    }
    // The wall clock alone, as an operator or NTP moves it.
    void setWallTime(platform::WallTime time) { wall_.store(time.time_since_epoch()); }

    std::chrono::seconds offset{0};

private:
    std::atomic<std::chrono::nanoseconds> wall_{std::chrono::seconds{1'700'000'000}};
    std::atomic<std::chrono::nanoseconds> steady_{std::chrono::seconds{1000}};
};

} // namespace halyard::testing
