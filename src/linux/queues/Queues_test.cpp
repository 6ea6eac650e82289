#include "linux/queues/Queues.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <asio/executor_work_guard.hpp>
#include <atomic>
#include <future>
#include <mutex>
#include <thread>

#include "linux/queues/BlockingSection.h"
#include "linux/system/LinuxFacts.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using platform::QueuePriority;

class QueuesTest : public ::testing::Test {
protected:
    ~QueuesTest() override {
        queues_.stop();
        guard_.reset();
        timers_.stop();
        timerThread_.join();
    }

    std::shared_ptr<platform::SerialQueue> relayQueue() {
        return queues_.makeSerialQueue("relay", QueuePriority::Utility);
    }
    // Waits until everything submitted so far has run.
    void drain() {
        std::promise<void> done;
        queues_.drain([&] { done.set_value(); });
        done.get_future().wait();
    }

    asio::io_context timers_;
    asio::executor_work_guard<asio::io_context::executor_type> guard_{timers_.get_executor()};
    std::thread timerThread_{[this] { timers_.run(); }};
    Pressure pressure_;
    Queues queues_{timers_, pressure_};
};

TEST_F(QueuesTest, RunsTasksInTheOrderOfSubmission) {
    const auto queue = relayQueue();
    std::vector<int> order;
    for (int i = 0; i < 1000; ++i) {
        queue->async([&order, i] { order.push_back(i); });
    }
    drain();

    ASSERT_EQ(order.size(), 1000u);
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST_F(QueuesTest, RunsOneTaskOfAQueueAtATime) {
    const auto queue = relayQueue();
    std::atomic<int> inside{0};
    std::atomic<bool> overlapped{false};
    std::vector<std::thread> submitters;
    for (int thread = 0; thread < 4; ++thread) {
        submitters.emplace_back([&] {
            for (int i = 0; i < 500; ++i) {
                queue->async([&] {
                    overlapped = overlapped || inside.fetch_add(1) != 0;
                    inside.fetch_sub(1);
                });
            }
        });
    }
    for (auto& submitter : submitters) {
        submitter.join();
    }
    drain();

    EXPECT_FALSE(overlapped);
}

TEST_F(QueuesTest, ADroppedQueueStillRunsWhatWasSubmitted) {
    std::promise<void> ran;
    relayQueue()->async([&] { ran.set_value(); });

    ran.get_future().wait();
}

TEST_F(QueuesTest, ASuspendedQueueHoldsBackWhatIsBehind) {
    const auto queue = relayQueue();
    std::vector<int> order;
    std::promise<void> suspended;
    queue->async([&] {
        queue->suspend(1h, [] { FAIL() << "the limit has not passed"; });
        suspended.set_value();
    });
    queue->async([&] { order.push_back(2); });
    suspended.get_future().wait();
    queue->async([&] { order.push_back(3); });

    EXPECT_TRUE(queue->resume([&] { order.push_back(1); }));
    drain();
    EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST_F(QueuesTest, ASuspendedQueueGoesOnWhenItsLimitPasses) {
    const auto queue = relayQueue();
    std::vector<int> order;
    std::promise<void> last;
    queue->async([&] { queue->suspend(1ms, [&] { order.push_back(1); }); });
    queue->async([&] {
        order.push_back(2);
        last.set_value();
    });
    last.get_future().wait();

    EXPECT_EQ(order, (std::vector<int>{1, 2}));
    EXPECT_FALSE(queue->resume([] { FAIL() << "it is not suspended any more"; }));
}

TEST_F(QueuesTest, WhatIsSubmittedInAScopeRunsWhenItEnds) {
    const auto queue = relayQueue();
    std::atomic<int> ran{0};
    {
        const WakeUpScope scope;
        queue->async([&] { ++ran; });
        relayQueue()->async([] {});
        EXPECT_EQ(ran, 0);
    }
    drain();

    EXPECT_EQ(ran, 1);
}

TEST_F(QueuesTest, WhatIsSubmittedRunsAtOnceWhereItsThreadBlocks) {
    std::promise<void> before;
    std::promise<void> within;
    std::atomic<bool> after{false};
    {
        const WakeUpScope scope;
        relayQueue()->async([&] { before.set_value(); });
        {
            const BlockingSection blocking;
            before.get_future().wait();
            relayQueue()->async([&] { within.set_value(); });
            within.get_future().wait();
        }
        relayQueue()->async([&] { after = true; });
        EXPECT_FALSE(after) << "the scope goes on behind the section";
    }
    drain();
}

TEST_F(QueuesTest, WhatATaskSubmitsOnALentThreadRunsThereToo) {
    const auto service = queues_.makeSerialQueue("service", QueuePriority::UserInteractive);
    const auto relay = relayQueue();
    std::thread::id thread;
    bool wasBehind = false;
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        service->async([&] {
            relay->async([&] {
                thread = std::this_thread::get_id();
                wasBehind = !service->isCurrent();
            });
        });
    }
    EXPECT_EQ(thread, std::this_thread::get_id());
    EXPECT_TRUE(wasBehind);
}

TEST_F(QueuesTest, ManyQueuesRunOnTheWorkersThoughAThreadIsLent) {
    const auto service = queues_.makeSerialQueue("service", QueuePriority::UserInteractive);
    std::vector<std::shared_ptr<platform::SerialQueue>> many(64);
    std::generate(many.begin(), many.end(), [this] { return relayQueue(); });
    std::atomic<std::size_t> elsewhere{0};
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        service->async([&, here = std::this_thread::get_id()] {
            for (const auto& queue : many) {
                queue->async([&, here] { elsewhere += std::this_thread::get_id() != here; });
            }
        });
    }
    drain();
    EXPECT_EQ(elsewhere, many.size());
}

TEST_F(QueuesTest, WhatATaskOnALentThreadWaitsForRunsOnAWorker) {
    const auto service = queues_.makeSerialQueue("service", QueuePriority::UserInteractive);
    const auto relay = relayQueue();
    std::promise<void> ran;
    {
        const WakeUpScope scope(WakeUpScope::Thread::Lent);
        service->async([&] {
            relay->async([&] { ran.set_value(); });
            const BlockingSection blocking;
            ran.get_future().wait();
        });
    }
    drain();
}

TEST_F(QueuesTest, ATaskMayWaitForWhatItSubmits) {
    const auto queue = relayQueue();
    const auto condition = SystemConditions().makeCondition();
    bool ran = false;
    const auto service = queues_.makeSerialQueue("service", QueuePriority::UserInteractive);
    service->async([&] {
        const std::lock_guard lock(*condition);
        queue->async([&] {
            const std::lock_guard inner(*condition);
            ran = true;
            condition->signal();
        });
        while (!ran) {
            (void)condition->waitFor(1h);
        }
    });
    drain();

    EXPECT_TRUE(ran);
}

TEST_F(QueuesTest, AThousandWaitingQueuesHoldNoThread) {
    std::vector<std::shared_ptr<platform::SerialQueue>> waiting;
    std::vector<std::promise<void>> suspended(1000);
    for (int i = 0; i < 1000; ++i) {
        waiting.push_back(relayQueue());
        waiting.back()->async([&, i] {
            waiting[static_cast<std::size_t>(i)]->suspend(1h, [] {});
            suspended[static_cast<std::size_t>(i)].set_value();
        });
        suspended[static_cast<std::size_t>(i)].get_future().wait();
    }
    std::promise<void> ran;
    relayQueue()->async([&] { ran.set_value(); });

    ran.get_future().wait(); // Nobody is delayed by those that wait.
    for (const auto& queue : waiting) {
        EXPECT_TRUE(queue->resume([] {}));
    }
}

TEST_F(QueuesTest, DrainingRunsDelayedTasksAtOnce) {
    bool ran = false;
    queues_.backgroundQueue().asyncAfter(1h, [&] { ran = true; });
    drain();

    EXPECT_TRUE(ran);
    EXPECT_EQ(queues_.delayedTasks(), 0u);
}

TEST_F(QueuesTest, DrainingFollowsWorkFromQueueToQueue) {
    const auto service = queues_.makeSerialQueue("service", QueuePriority::UserInteractive);
    const auto relay = relayQueue();
    bool ran = false;
    service->async([&] {
        relay->async([&] { queues_.backgroundQueue().asyncAfter(1h, [&] { ran = true; }); });
    });
    drain();

    EXPECT_TRUE(ran);
}

TEST_F(QueuesTest, DrainingWaitsForAQueueThatIsSuspended) {
    const auto relay = relayQueue();
    std::promise<void> suspended;
    relay->async([&] {
        relay->suspend(1h, [] {});
        suspended.set_value();
    });
    suspended.get_future().wait();
    std::promise<void> drained;
    bool ran = false;
    queues_.drain([&] { drained.set_value(); });
    ASSERT_TRUE(relay->resume([&] { ran = true; }));
    drained.get_future().wait();

    EXPECT_TRUE(ran);
}

TEST_F(QueuesTest, ATaskMayWaitForTheDrainingOfWhatCameBeforeIt) {
    for (const auto priority : {QueuePriority::UserInteractive, QueuePriority::Utility}) {
        const auto queue = queues_.makeSerialQueue("own", priority);
        const auto relay = relayQueue();
        bool delivered = false;
        std::promise<bool> found;
        queue->async([&] { relay->async([&] { delivered = true; }); });
        queue->async([&] {
            const BlockingSection blocking;
            drain();
            found.set_value(delivered);
        });
        EXPECT_TRUE(found.get_future().get());
    }
}

TEST_F(QueuesTest, AQueueIsCurrentWhereItsTaskRuns) {
    const auto queue = relayQueue();
    const auto other = relayQueue();
    EXPECT_FALSE(queue->isCurrent());
    bool own = false;
    bool others = true;
    queue->async([&] {
        own = queue->isCurrent();
        others = other->isCurrent();
    });
    drain();

    EXPECT_TRUE(own);
    EXPECT_FALSE(others);
}

TEST_F(QueuesTest, TooManyDelayedTasksPutTheDaemonUnderPressure) {
    for (std::size_t i = 1; i < Queues::kDelayedHighWater; ++i) {
        queues_.backgroundQueue().asyncAfter(1h, [] {});
    }
    EXPECT_FALSE(pressure_.isOn());
    queues_.backgroundQueue().asyncAfter(1h, [] {});
    EXPECT_TRUE(pressure_.isOn());

    drain();
    EXPECT_FALSE(pressure_.isOn());
}

class CountedCharge final : public Charge {
public:
    explicit CountedCharge(std::promise<void>& ended) : ended_(ended) {}
    ~CountedCharge() override { ended_.set_value(); }

private:
    std::promise<void>& ended_;
};

TEST_F(QueuesTest, AChargeLastsUntilTheWorkItLedToIsDone) {
    const auto first = relayQueue();
    const auto second = relayQueue();
    std::promise<void> ended;
    auto future = ended.get_future();
    std::promise<void> gate;
    {
        const ChargeScope scope(std::make_shared<CountedCharge>(ended));
        first->async([&] { second->async([&] { gate.get_future().wait(); }); });
    }
    EXPECT_EQ(future.wait_for(0s), std::future_status::timeout);

    gate.set_value();
    future.wait();
}

TEST_F(QueuesTest, ADelayedTaskIsNotCharged) {
    std::promise<void> ended;
    {
        const ChargeScope scope(std::make_shared<CountedCharge>(ended));
        queues_.backgroundQueue().asyncAfter(1h, [] {});
    }
    ended.get_future().wait();
}

} // namespace
} // namespace halyard::linux_
