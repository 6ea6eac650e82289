#include "session/AsyncSemaphore.h"

#include <utility>

namespace halyard {

void AsyncSemaphore::signal() {
    std::shared_ptr<Waiter> waiter;
    {
        const MutexLock lock(mutex_);
        waiter = std::exchange(waiter_, {}).lock();
        if (waiter == nullptr) {
            ++count_;
            return;
        }
    }
    if (waiter->queue->resume([done = waiter->done] { done(true); })) {
        waiter->done = nullptr; // A queue may hold its timer longer than the wait.
        return;
    }
    const MutexLock lock(mutex_);
    ++count_; // It had just given up.
}

bool AsyncSemaphore::takeSignalOrEnlist(const std::shared_ptr<platform::SerialQueue>& queue,
                                        std::chrono::nanoseconds limit, const Done& done) {
    const MutexLock lock(mutex_);
    if (count_ > 0) {
        --count_;
        return true;
    }
    auto waiter = std::make_shared<Waiter>(Waiter{queue, done});
    waiter_ = waiter;
    // Suspended under the lock, so that no signal can come between.
    queue->suspend(limit, [self = shared_from_this(), waiter] {
        {
            const MutexLock relock(self->mutex_);
            if (self->waiter_.lock() == waiter) {
                self->waiter_.reset();
            }
        }
        waiter->done(false);
    });
    return false;
}

void AsyncSemaphore::wait(const std::shared_ptr<platform::SerialQueue>& queue,
                          std::chrono::nanoseconds limit, Done done) {
    if (takeSignalOrEnlist(queue, limit, done)) {
        done(true);
    }
}

} // namespace halyard
