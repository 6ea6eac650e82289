#pragma once

#include <chrono>
#include <memory>

namespace halyard::platform {

// A lock with a condition, for completions that a thread has to wait for.
class Condition {
public:
    virtual ~Condition() = default;
    virtual void lock() = 0;
    virtual void unlock() = 0;
    // Requires the lock. False when `timeout` ran out first; spurious returns of
    // true are allowed.
    [[nodiscard]] virtual bool waitFor(std::chrono::nanoseconds timeout) = 0;
    // Wakes one waiter.
    virtual void signal() = 0;
};

class ConditionFactory {
public:
    virtual ~ConditionFactory() = default;
    virtual std::unique_ptr<Condition> makeCondition() = 0;
};

} // namespace halyard::platform
