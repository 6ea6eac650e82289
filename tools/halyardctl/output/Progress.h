// A bar on standard error for what takes longer than a second.
//
// Only on a terminal, and gone when it is done. Not thread-safe.
#pragma once

#include <chrono>
#include <string>

namespace halyard::ctl {

class Progress {
public:
    explicit Progress(std::string what);
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    // From 0 to 1. May be called as often as one likes.
    void update(double share);

private:
    using Clock = std::chrono::steady_clock;

    const std::string what_;
    const bool shown_;
    Clock::time_point next_;
    bool drawn_ = false;
};

} // namespace halyard::ctl
