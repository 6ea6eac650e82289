#include "platform/Semaphore.h"

#include <chrono>
#include <mutex>

#include "platform/Platform.h"

namespace halyard::platform {

Semaphore::Semaphore() : condition_(current().conditions->makeCondition()) {}

void Semaphore::signal() {
    const std::lock_guard lock(*condition_);
    ++count_;
    condition_->signal();
}

void Semaphore::wait() {
    const std::lock_guard lock(*condition_);
    while (count_ == 0) {
        // Any length will do, but for those that overflow a clock.
        (void)condition_->waitFor(std::chrono::hours(1));
    }
    --count_;
}

} // namespace halyard::platform
