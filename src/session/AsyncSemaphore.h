// A counting semaphore whose waiter is a serial queue instead of a thread.
//
// A session waits seconds for its back ends. Were that a blocked thread, ten
// thousand sessions opening at once would need ten thousand of them.
//
// signal() may be called from any thread. At most one wait at a time.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

#include "common/Mutex.h"
#include "platform/WorkQueue.h"

namespace halyard {

class AsyncSemaphore : public std::enable_shared_from_this<AsyncSemaphore> {
public:
    using Done = std::function<void(bool signalled)>;

    void signal() HY_EXCLUDES(mutex_);

    // Calls done(true) as soon as there is a signal to take, done(false) after
    // `limit`; in both cases on `queue`, ahead of everything behind the calling
    // task. Requires that it is called from a task of `queue`. A signal that
    // nobody waits for any more stays for the next wait.
    void wait(const std::shared_ptr<platform::SerialQueue>& queue, std::chrono::nanoseconds limit,
              Done done) HY_EXCLUDES(mutex_);

private:
    // Owned by the suspended queue: were it ours, whoever waits for its own
    // semaphore would keep itself alive.
    struct Waiter {
        std::shared_ptr<platform::SerialQueue> queue;
        Done done;
    };

    bool takeSignalOrEnlist(const std::shared_ptr<platform::SerialQueue>& queue,
                            std::chrono::nanoseconds limit, const Done& done) HY_EXCLUDES(mutex_);

    Mutex mutex_;
    int count_ HY_GUARDED_BY(mutex_) = 0;
    std::weak_ptr<Waiter> waiter_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard
