#pragma once

#include <chrono>

namespace halyard::platform {

using WallTime = std::chrono::time_point<std::chrono::system_clock, std::chrono::nanoseconds>;
using SteadyTime = std::chrono::time_point<std::chrono::steady_clock, std::chrono::nanoseconds>;

// The only source of time in the core. Any thread.
class Clock {
public:
    virtual ~Clock() = default;
    // May jump in both directions.
    virtual WallTime wallTime() const = 0;
    virtual SteadyTime steadyTime() const = 0;
    // Since boot, time asleep included.
    virtual std::chrono::nanoseconds systemUptime() const = 0;
    // How far local time is ahead of UTC at `time`.
    virtual std::chrono::seconds utcOffset(WallTime time) const = 0;
};

// Seconds since 1970, as messages carry them.
inline double secondsSince1970(WallTime time) {
    return std::chrono::duration<double>(time.time_since_epoch()).count();
}

} // namespace halyard::platform
