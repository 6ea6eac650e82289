#include "platform/QueueCheck.h"

#include <gtest/gtest.h>

#include <optional>

#include "testing/ManualQueues.h"

namespace halyard::platform {
namespace {

class QueueCheckTest : public ::testing::Test {
protected:
    void run(const std::shared_ptr<SerialQueue>& queue, Task task) {
        queue->async(std::move(task));
        queues_.runUntilIdle();
    }

    testing::ManualClock clock_;
    testing::ManualQueues queues_{clock_};
    std::shared_ptr<SerialQueue> own_ = queues_.makeSerialQueue("own", QueuePriority::Utility);
    std::shared_ptr<SerialQueue> other_ = queues_.makeSerialQueue("other", QueuePriority::Utility);
};

TEST_F(QueueCheckTest, AQueueIsCurrentInItsTasks) {
    bool own = false;
    bool other = true;
    run(own_, [&] {
        own = own_->isCurrent();
        other = other_->isCurrent();
    });
    EXPECT_TRUE(own);
    EXPECT_FALSE(other);
    EXPECT_EQ(SerialQueue::current(), nullptr);
}

TEST_F(QueueCheckTest, TheInnermostTaskCounts) {
    const SerialQueue* within = nullptr;
    const SerialQueue* after = nullptr;
    run(own_, [&] {
        run(other_, [&] { within = SerialQueue::current(); });
        after = SerialQueue::current();
    });
    EXPECT_EQ(within, other_.get());
    EXPECT_EQ(after, own_.get());
}

TEST_F(QueueCheckTest, ChecksHoldOnTheQueueThatTheyAreMadeFor) {
    std::optional<SameQueue> made;
    run(own_, [&] { made.emplace(); });
    run(own_, [&] {
        HY_ASSERT_ON_QUEUE(own_);
        made->check();
    });
}

#ifndef NDEBUG
using QueueCheckDeathTest = QueueCheckTest;

TEST_F(QueueCheckDeathTest, ChecksFailOnAnyOtherQueue) {
    std::optional<SameQueue> made;
    run(own_, [&] { made.emplace(); });
    EXPECT_DEATH(run(other_, [&] { made->check(); }), "madeOn_");
    EXPECT_DEATH(made->check(), "madeOn_");
    EXPECT_DEATH(run(other_, [&] { HY_ASSERT_ON_QUEUE(own_); }), "isCurrent");
}
#endif

} // namespace
} // namespace halyard::platform
