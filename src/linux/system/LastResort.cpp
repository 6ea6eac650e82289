#include "linux/system/LastResort.h"

#include <csignal>
#include <pthread.h>
#include <utility>

namespace halyard::linux_ {

LastResort::LastResort(std::chrono::nanoseconds limit, std::function<void()> action)
    : action_(std::move(action)), thread_([this, limit] { wait(limit); }) {}

LastResort::~LastResort() {
    {
        const MutexLock lock(mutex_);
        over_ = true;
        changed_.notify_all();
    }
    thread_.join();
}

void LastResort::wait(std::chrono::nanoseconds limit) {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_BLOCK, &all, nullptr);
    {
        const MutexLock lock(mutex_);
        const auto until = std::chrono::steady_clock::now() + limit;
        while (!over_ && changed_.wait_until(mutex_, until) != std::cv_status::timeout) {
        }
        if (over_) {
            return;
        }
    }
    action_();
}

} // namespace halyard::linux_
