#include "platform/Semaphore.h"

#include <gtest/gtest.h>
#include <memory>
#include <optional>

#include "platform/Platform.h"
#include "testing/FakeCondition.h"

namespace halyard::platform {
namespace {

// Hands out one condition and keeps an eye on it.
class OneCondition final : public ConditionFactory {
public:
    std::unique_ptr<Condition> makeCondition() override {
        auto condition = std::make_unique<halyard::testing::FakeCondition>();
        made = condition.get();
        return condition;
    }

    halyard::testing::FakeCondition* made = nullptr; // the semaphore's
};

class SemaphoreTest : public ::testing::Test {
protected:
    SemaphoreTest() {
        platform_.conditions = &conditions_;
        install(&platform_);
        semaphore_.emplace();
    }
    ~SemaphoreTest() override { install(nullptr); }
    halyard::testing::FakeCondition& condition() { return *conditions_.made; }

    OneCondition conditions_;
    Platform platform_;
    std::optional<Semaphore> semaphore_;
};

TEST_F(SemaphoreTest, ASignalThatCameBeforeEndsAWaitAtOnce) {
    semaphore_->signal();
    semaphore_->signal();
    EXPECT_EQ(condition().signals, 2);
    semaphore_->wait();
    semaphore_->wait();
    EXPECT_TRUE(condition().waits.empty());
    EXPECT_FALSE(condition().locked);
}

TEST_F(SemaphoreTest, EachWaitTakesOneSignal) {
    semaphore_->signal();
    semaphore_->wait();
    condition().onWait = [this] {
        semaphore_->signal();
        return true;
    };
    semaphore_->wait();
    EXPECT_EQ(condition().waits.size(), 1U);
}

TEST_F(SemaphoreTest, NeitherADeadlineNorAWakeUpWithoutASignalEndsAWait) {
    condition().onWait = [this] {
        if (condition().waits.size() == 3) {
            semaphore_->signal();
        }
        return condition().waits.size() == 2;
    };
    semaphore_->wait();
    EXPECT_EQ(condition().waits.size(), 3U);
}

} // namespace
} // namespace halyard::platform
