#include "linux/queues/FairSerialQueue.h"

#include <future>
#include <gmock/gmock.h>
#include <string>
#include <thread>

namespace halyard::linux_ {
namespace {

using platform::ClientBudget;
using ::testing::ElementsAre;

class FairSerialQueueTest : public ::testing::Test {
protected:
    // Whatever is submitted meanwhile waits until release().
    void hold() {
        queue_->async([open = opened_.get_future().share()] { open.wait(); });
    }
    void release() { opened_.set_value(); }
    void submit(const platform::ClientBudgetPtr& client, platform::Task task) {
        const ChargeScope scope(client != nullptr ? std::make_shared<Charge>(client) : nullptr);
        queue_->async(std::move(task));
    }
    platform::Task note(const std::string& text) {
        return [this, text] { ran_.push_back(text); };
    }
    // Longer than a turn, by the queue's own clock.
    platform::Task noteLong(const std::string& text) {
        return [this, text] {
            ran_.push_back(text);
            const auto end = std::chrono::steady_clock::now() + FairSerialQueue::kTurn;
            while (std::chrono::steady_clock::now() < end) {
            }
        };
    }
    void waitUntilAllHasRun() {
        std::promise<void> done;
        queue_->asyncBehindAll([&] { done.set_value(); });
        done.get_future().wait();
    }
    platform::Task noteThread() {
        return [this] { threads_.push_back(std::this_thread::get_id()); };
    }
    static platform::ClientBudgetPtr makeClient() {
        return std::make_shared<ClientBudget>(std::make_shared<platform::SharedLimits>());
    }

    const PooledSerialQueue::Timer timer_ = [](std::chrono::nanoseconds, platform::Task) {};
    const platform::ClientBudgetPtr one_ = makeClient();
    const platform::ClientBudgetPtr two_ = makeClient();
    std::vector<std::string> ran_; // the worker's until all has run
    std::vector<std::thread::id> threads_;
    const std::thread::id here_ = std::this_thread::get_id();
    std::promise<void> opened_;
    Worker worker_{"test", 1, platform::QueuePriority::Utility};
    const std::shared_ptr<FairSerialQueue> queue_ =
        std::make_shared<FairSerialQueue>(worker_, timer_);
};

TEST_F(FairSerialQueueTest, AClientsTasksRunInTheOrderOfTheirSubmission) {
    for (const char* const text : {"a", "b", "c"}) {
        submit(one_, note(text));
    }
    waitUntilAllHasRun();
    EXPECT_THAT(ran_, ElementsAre("a", "b", "c"));
}

TEST_F(FairSerialQueueTest, EachClientHasItsTurn) {
    hold();
    for (int i = 1; i <= 3; ++i) {
        submit(one_, noteLong("one " + std::to_string(i)));
    }
    submit(two_, noteLong("two 1"));
    submit(two_, noteLong("two 2"));
    submit(nullptr, noteLong("own"));
    release();
    waitUntilAllHasRun();
    EXPECT_THAT(std::vector(ran_.begin(), ran_.begin() + 4),
                ::testing::UnorderedElementsAre("one 1", "two 1", "own", ::testing::_));
    EXPECT_EQ(ran_.back(), "one 3");
}

TEST_F(FairSerialQueueTest, WhatATaskLeavesComesBeforeItsClientsOthersAndBehindTheTurns) {
    hold();
    submit(one_, [this] {
        ran_.emplace_back("begun");
        queue_->continueWith(note("ended"));
    });
    submit(one_, note("next"));
    submit(two_, note("two"));
    release();
    waitUntilAllHasRun();
    EXPECT_THAT(ran_, ElementsAre("begun", "two", "ended", "next"));
}

TEST_F(FairSerialQueueTest, BehindAllIsBehindWhatIsLeftAsWell) {
    hold();
    submit(one_, [this] { queue_->continueWith(note("rest")); });
    submit(two_, note("two"));
    queue_->asyncBehindAll(note("behind"));
    submit(two_, note("later"));
    release();
    waitUntilAllHasRun();
    EXPECT_LT(std::ranges::find(ran_, "rest"), std::ranges::find(ran_, "behind"));
    EXPECT_LT(std::ranges::find(ran_, "two"), std::ranges::find(ran_, "behind"));
}

TEST_F(FairSerialQueueTest, AClientWhoseWorkHasPiledUpIsLeftOutUntilItIsRelieved) {
    hold();
    one_->setReliefHandler([this] { queue_->clientRelieved(); });
    one_->begin(ClientBudget::Work::Rows, std::size_t{1} << 30);
    submit(one_, note("one"));
    submit(two_, [this] {
        ran_.emplace_back("two");
        one_->end(ClientBudget::Work::Rows, 1, std::size_t{1} << 30);
    });
    release();
    waitUntilAllHasRun();
    EXPECT_THAT(ran_, ElementsAre("two", "one"));
}

TEST_F(FairSerialQueueTest, ASuspendedQueueRunsNothingBeforeItIsResumed) {
    std::promise<void> suspended;
    submit(one_, [&] {
        queue_->suspend(std::chrono::hours(1), [] {});
        ran_.emplace_back("suspends");
        suspended.set_value();
    });
    suspended.get_future().wait();
    submit(one_, note("one"));
    submit(two_, note("two"));
    EXPECT_TRUE(queue_->resume(note("first")));
    EXPECT_FALSE(queue_->resume(note("again")));
    waitUntilAllHasRun();
    ASSERT_EQ(ran_.size(), 4U);
    EXPECT_THAT(std::vector(ran_.begin(), ran_.begin() + 2), ElementsAre("suspends", "first"));
}

TEST_F(FairSerialQueueTest, WhatWaitsIsCountedAlsoOfAClientThatIsHeldBack) {
    one_->setReliefHandler([this] { queue_->clientRelieved(); });
    one_->begin(ClientBudget::Work::Rows, std::size_t{1} << 30);
    submit(one_, note("one"));
    submit(one_, note("another"));
    std::promise<void> ran;
    submit(two_, [&] { ran.set_value(); });
    ran.get_future().wait();
    EXPECT_EQ(queue_->waitingTasks(), 2U);
    one_->end(ClientBudget::Work::Rows, 1, std::size_t{1} << 30);
    waitUntilAllHasRun();
    EXPECT_EQ(queue_->waitingTasks(), 0U);
}

TEST_F(FairSerialQueueTest, ALentThreadRunsWhatItSubmits) {
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        submit(one_, noteThread());
        submit(one_, noteThread());
        EXPECT_TRUE(threads_.empty());
    }
    EXPECT_THAT(threads_, ElementsAre(here_, here_));
}

TEST_F(FairSerialQueueTest, ALentThreadIsGivenBackBeforeWhatMayWait) {
    {
        WakeUpScope scope(WakeUpScope::Thread::Lent);
        submit(one_, noteThread());
        scope.keepThread();
        submit(one_, noteThread());
    }
    waitUntilAllHasRun();
    EXPECT_THAT(threads_, ::testing::Each(::testing::Ne(here_)));
    EXPECT_EQ(threads_.size(), 2U);
}

TEST_F(FairSerialQueueTest, ALentThreadLeavesABusyQueueToItsWorker) {
    hold();
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        submit(one_, noteThread());
    }
    EXPECT_TRUE(threads_.empty());
    release();
    waitUntilAllHasRun();
    EXPECT_THAT(threads_, ElementsAre(::testing::Ne(here_)));
}

TEST_F(FairSerialQueueTest, ALentThreadLeavesToTheWorkerWhatItsTurnHasNoTimeFor) {
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        submit(one_, noteLong("long"));
        submit(one_, noteThread());
    }
    waitUntilAllHasRun();
    EXPECT_THAT(threads_, ElementsAre(::testing::Ne(here_)));
}

TEST_F(FairSerialQueueTest, ALentThreadLeavesToTheWorkerWhatATaskPutOff) {
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        submit(one_, [this] { queue_->continueWith(noteThread()); });
    }
    waitUntilAllHasRun();
    EXPECT_THAT(threads_, ElementsAre(::testing::Ne(here_)));
}

TEST_F(FairSerialQueueTest, ALentThreadLeavesToTheWorkerWhatOthersSubmit) {
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        submit(one_, noteThread());
        std::thread([this] { submit(two_, noteThread()); }).join();
    }
    waitUntilAllHasRun();
    EXPECT_EQ(threads_.size(), 2U);
    EXPECT_THAT(threads_, ::testing::Each(::testing::Ne(here_)));
}

} // namespace
} // namespace halyard::linux_
