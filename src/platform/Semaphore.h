#pragma once

#include <memory>

#include "platform/Condition.h"

namespace halyard::platform {

// A counting semaphore whose waiter blocks its thread without a limit. Any
// thread; count 0 at first. Requires an installed platform when it is made.
class Semaphore {
public:
    Semaphore();
    void signal();
    void wait();

private:
    const std::unique_ptr<Condition> condition_;
    unsigned count_ = 0; // under the condition's lock
};

} // namespace halyard::platform
