// A clock that only moves when a test says so.
#pragma once

#include <chrono>

#include "platform/Clock.h"

namespace halyard::testing {

class ManualClock final : public platform::Clock {
public:
    platform::WallTime wallTime() const override { return wall_; }
    platform::SteadyTime steadyTime() const override { return steady_; }
    std::chrono::nanoseconds systemUptime() const override { return steady_.time_since_epoch(); }

    std::chrono::seconds utcOffset(platform::WallTime) const override { return offset; }

    void advance(std::chrono::nanoseconds by) {
        wall_ += by;
        steady_ += by;
    }
    // The wall clock alone, as an operator or NTP moves it.
    void setWallTime(platform::WallTime time) { wall_ = time; }

    std::chrono::seconds offset{0};

private:
    platform::WallTime wall_{std::chrono::seconds{1'700'000'000}};
    platform::SteadyTime steady_{std::chrono::seconds{1000}};
};

} // namespace halyard::testing
