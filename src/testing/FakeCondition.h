#pragma once

#include <cassert>
#include <functional>
#include <memory>
#include <vector>

#include "platform/Condition.h"

namespace halyard::testing {

// A condition for tests of one thread: a wait asks `onWait` what becomes of it,
// and without one runs into its deadline.
class FakeCondition final : public platform::Condition {
public:
    void lock() override {
        assert(!locked);
        locked = true;
    }
    void unlock() override {
        assert(locked);
        locked = false;
    }
    bool waitFor(std::chrono::nanoseconds timeout) override {
        assert(locked);
        waits.push_back(timeout);
        locked = false;
        const bool woken = onWait && onWait();
        locked = true;
        return woken;
    }
    void signal() override {
        assert(locked);
        ++signals;
    }

    // Runs without the lock, as others do while somebody waits; false is the
    // deadline.
    std::function<bool()> onWait;
    std::vector<std::chrono::nanoseconds> waits;
    int signals = 0;
    bool locked = false;
};

// Outlives the conditions that it makes.
class FakeConditionFactory final : public platform::ConditionFactory {
public:
    std::unique_ptr<platform::Condition> makeCondition() override {
        auto condition = std::make_unique<FakeCondition>();
        condition->onWait = [this] { return onWait && onWait(); };
        return condition;
    }

    std::function<bool()> onWait; // of the conditions it makes, also when set later
};

} // namespace halyard::testing
