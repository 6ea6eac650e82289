#include "daemon/Stamps.h"

#include <cstdint>
#include <ctime>
#include <string_view>

namespace halyard::ctl {
namespace {

timespec timeOf(clockid_t clock) {
    timespec time{};
    ::clock_gettime(clock, &time);
    return time;
}

std::int64_t milliseconds(const timespec& time) {
    return time.tv_sec * 1000 + time.tv_nsec / 1'000'000;
}

// About when this process started.
const std::int64_t kStarted = milliseconds(timeOf(CLOCK_BOOTTIME));

} // namespace

void addStamps(Dictionary& message) {
    const timespec now = timeOf(CLOCK_REALTIME);
    const timespec boot = timeOf(CLOCK_BOOTTIME);
    const auto add = [&](std::string_view key, const Value& value) {
        if (!message.contains(key)) {
            message.set(key, value);
        }
    };
    add("hyreporting_timestamp",
        static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9);
    add("systemuptime_sec", std::int64_t{boot.tv_sec});
    add("processuptime_ms", milliseconds(boot) - kStarted);
}

} // namespace halyard::ctl
