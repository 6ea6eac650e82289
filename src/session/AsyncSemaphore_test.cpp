#include "session/AsyncSemaphore.h"

#include <gmock/gmock.h>
#include <string>
#include <thread>
#include <vector>

#include "testing/ManualQueues.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

class AsyncSemaphoreTest : public ::testing::Test {
protected:
    ~AsyncSemaphoreTest() override { queues_.clear(); }

    // Waits on `queue`, with more work behind the wait.
    void wait(const std::shared_ptr<platform::SerialQueue>& queue) {
        queue->async([this, queue] {
            semaphore_->wait(queue, 9s, [this](bool signalled) {
                happened_.emplace_back(signalled ? "signalled" : "timed out");
            });
        });
        queue->async([this] { happened_.emplace_back("next"); });
        queues_.runUntilIdle();
    }

    testing::ManualClock clock_;
    testing::ManualQueues queues_{clock_};
    const std::shared_ptr<platform::SerialQueue> queue_ =
        queues_.makeSerialQueue("waiting", platform::QueuePriority::Utility);
    const std::shared_ptr<AsyncSemaphore> semaphore_ = std::make_shared<AsyncSemaphore>();
    std::vector<std::string> happened_;
};

TEST_F(AsyncSemaphoreTest, TakesASignalThatCameBefore) {
    semaphore_->signal();
    wait(queue_);
    EXPECT_THAT(happened_, ElementsAre("signalled", "next"));
}

TEST_F(AsyncSemaphoreTest, HoldsTheQueueBackUntilTheSignal) {
    wait(queue_);
    EXPECT_TRUE(happened_.empty());
    semaphore_->signal();
    queues_.runUntilIdle();
    EXPECT_THAT(happened_, ElementsAre("signalled", "next"));
}

TEST_F(AsyncSemaphoreTest, GivesUpExactlyAtTheLimit) {
    wait(queue_);
    queues_.advance(9s - 1ns);
    EXPECT_TRUE(happened_.empty());
    queues_.advance(1ns);
    EXPECT_THAT(happened_, ElementsAre("timed out", "next"));
}

TEST_F(AsyncSemaphoreTest, TheLimitOfAnEndedWaitDoesNotEndTheNext) {
    wait(queue_);
    queues_.advance(8s);
    semaphore_->signal();
    wait(queue_);
    queues_.advance(9s - 1ns);
    EXPECT_THAT(happened_, ElementsAre("signalled", "next"));
}

TEST_F(AsyncSemaphoreTest, ALateSignalStaysForTheNextWait) {
    wait(queue_);
    queues_.advance(9s);
    semaphore_->signal();
    wait(queue_);
    EXPECT_THAT(happened_, ElementsAre("timed out", "next", "signalled", "next"));
}

TEST_F(AsyncSemaphoreTest, OneSignalEndsOneWait) {
    semaphore_->signal();
    wait(queue_);
    wait(queue_);
    EXPECT_THAT(happened_, ElementsAre("signalled", "next"));
}

TEST_F(AsyncSemaphoreTest, HoldsNoOtherQueueBack) {
    wait(queue_);
    const auto other = queues_.makeSerialQueue("other", platform::QueuePriority::Utility);
    other->async([this] { happened_.emplace_back("other"); });
    queues_.runUntilIdle();
    EXPECT_THAT(happened_, ElementsAre("other"));
}

TEST_F(AsyncSemaphoreTest, AWaitThatEndsLetsGoOfWhatItHeld) {
    auto held = std::make_shared<int>();
    const std::weak_ptr<int> watch = held;
    queue_->async(
        [this, held = std::move(held)] { semaphore_->wait(queue_, 9s, [held](bool) {}); });
    queues_.runUntilIdle();
    EXPECT_FALSE(watch.expired());
    semaphore_->signal();
    queues_.runUntilIdle();
    EXPECT_TRUE(watch.expired());
}

TEST_F(AsyncSemaphoreTest, AWaitIsDroppedWithItsQueue) {
    wait(queue_);
    const std::weak_ptr<AsyncSemaphore> watch = semaphore_;
    queues_.clear();
    EXPECT_EQ(watch.use_count(), 1) << "only the fixture is left";
    semaphore_->signal();
    wait(queues_.makeSerialQueue("next", platform::QueuePriority::Utility));
    EXPECT_THAT(happened_, ElementsAre("signalled", "next"));
}

// A queue whose limit has run out, though its timeout has not yet been told.
class GivenUpQueue final : public platform::SerialQueue {
public:
    void async(platform::Task) override {}
    void asyncAfter(std::chrono::nanoseconds, platform::Task) override {}
    void suspend(std::chrono::nanoseconds, platform::Task onTimeout) override {
        timeout = std::move(onTimeout);
    }
    bool resume(platform::Task) override { return false; }
    void continueWith(platform::Task) override {}

    platform::Task timeout;
};

TEST_F(AsyncSemaphoreTest, KeepsASignalThatCameJustTooLate) {
    const auto givenUp = std::make_shared<GivenUpQueue>();
    semaphore_->wait(givenUp, 9s, [](bool signalled) { EXPECT_FALSE(signalled); });
    semaphore_->signal();
    givenUp->timeout();
    givenUp->timeout = nullptr; // It holds its own queue.
    wait(queue_);
    EXPECT_THAT(happened_, ElementsAre("signalled", "next"));
}

TEST_F(AsyncSemaphoreTest, CountsTheSignalsOfManyThreads) {
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([this] { semaphore_->signal(); });
    }
    for (auto& thread : threads) {
        thread.join();
    }
    for (int i = 0; i < 5; ++i) {
        wait(queue_);
    }
    EXPECT_EQ(std::count(happened_.begin(), happened_.end(), "signalled"), 4);
}

} // namespace
} // namespace halyard
