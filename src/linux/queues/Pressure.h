// Whether the daemon has all the unfinished work it wants to hold.
//
// Work that no single connection can be charged with (rows that wait for the
// disk, single messages that wait for their moment) has its own high-water
// marks; while one of them is passed, nothing is read from any client. So an
// overloaded daemon reads less instead of growing or dropping what it has read.
//
// Any thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>

namespace halyard::linux_ {

class Pressure {
public:
    enum Source : std::uint32_t { Store = 1, DelayedTasks = 2 };

    // Called when the last source lets go. Requires that no other thread uses
    // this object yet.
    void setReliefHandler(std::function<void()> handler) { relief_ = std::move(handler); }

    void set(Source source, bool on) {
        if (on) {
            sources_.fetch_or(source);
        } else if (sources_.fetch_and(~static_cast<std::uint32_t>(source)) == source && relief_) {
            relief_();
        }
    }
    bool isOn() const { return sources_.load() != 0; }

private:
    std::atomic<std::uint32_t> sources_{0};
    std::function<void()> relief_;
};

} // namespace halyard::linux_
