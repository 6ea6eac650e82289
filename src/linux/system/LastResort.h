// Does something once time is up, unless it is destroyed before: for an end that must
// not hang, whatever hangs.
//
// A thread of its own, because every other may be what hangs. It takes no signals.
#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <thread>

#include "common/Mutex.h"

namespace halyard::linux_ {

class LastResort final {
public:
    LastResort(std::chrono::nanoseconds limit, std::function<void()> action);
    ~LastResort();
    LastResort(const LastResort&) = delete;
    LastResort& operator=(const LastResort&) = delete;

private:
    void wait(std::chrono::nanoseconds limit) HY_EXCLUDES(mutex_);

    const std::function<void()> action_;
    Mutex mutex_;
    std::condition_variable_any changed_;
    bool over_ HY_GUARDED_BY(mutex_) = false;
    std::thread thread_;
};

} // namespace halyard::linux_
