#include "linux/net/IdleExit.h"

#include <gtest/gtest.h>

#include <utility>

#include "platform/Platform.h"
#include "testing/ManualClock.h"
#include "testing/ManualQueues.h"
#include "testing/RecordingLog.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

class CountingQueue final : public platform::WorkQueue {
public:
    explicit CountingQueue(platform::WorkQueue& queue) : queue_(queue) {}
    void async(platform::Task task) override { queue_.async(std::move(task)); }
    void asyncAfter(std::chrono::nanoseconds delay, platform::Task task) override {
        ++delayed;
        queue_.asyncAfter(delay, std::move(task));
    }

    int delayed = 0;

private:
    platform::WorkQueue& queue_;
};

class IdleExitTest : public ::testing::Test {
protected:
    IdleExitTest() {
        platform_.log = &log_;
        platform::install(&platform_);
    }
    ~IdleExitTest() override { platform::install(nullptr); }

    void advance(std::chrono::nanoseconds by) {
        queues_.advance(by);
        queues_.runUntilIdle();
    }
    void finishDraining() {
        std::exchange(drain_, nullptr)();
        queues_.runUntilIdle();
    }
    // As the listener answers to stopAccepting.
    void answer(bool stopped) {
        std::exchange(stop_, nullptr)(stopped);
        queues_.runUntilIdle();
    }

    testing::ManualClock clock_;
    testing::ManualQueues queues_{clock_};
    CountingQueue loop_{queues_.backgroundQueue()};
    testing::RecordingLog log_;
    platform::Platform platform_;
    std::function<void()> drain_;
    std::function<void(bool)> stop_;
    int drains_ = 0;
    int ends_ = 0;
    IdleExit idle_{clock_,
                   loop_,
                   {.drain =
                        [this](std::function<void()> done) {
                            ++drains_;
                            drain_ = std::move(done);
                        },
                    .stopAccepting = [this](std::function<void(bool)> done) { stop_ = done; },
                    .end = [this] { ++ends_; }}};
};

TEST_F(IdleExitTest, NeverEndsWithoutALimit) {
    advance(24h);

    EXPECT_FALSE(drain_);
}

TEST_F(IdleExitTest, BeginsExactlyAtTheLimit) {
    idle_.setLimit(30s);

    advance(30s - 1ns);
    EXPECT_FALSE(drain_);
    advance(1ns);
    EXPECT_TRUE(drain_);
}

TEST_F(IdleExitTest, EndsOnceAllIsWrittenAndNobodyCame) {
    idle_.setLimit(30s);
    advance(30s);
    EXPECT_FALSE(stop_) << "something may still be on its way to the disk";

    finishDraining();
    ASSERT_TRUE(stop_);
    EXPECT_EQ(ends_, 0) << "somebody may come in this moment";
    answer(true);
    EXPECT_EQ(ends_, 1);
}

TEST_F(IdleExitTest, WhoIsConnectedKeepsIt) {
    idle_.setLimit(30s);
    idle_.connectionsChanged(2);
    idle_.connectionsChanged(1);

    advance(24h);
    EXPECT_FALSE(drain_);
}

TEST_F(IdleExitTest, CountsFromWhenTheLastOneLeft) {
    idle_.setLimit(30s);
    idle_.connectionsChanged(1);
    advance(20s);
    idle_.connectionsChanged(0);

    advance(30s - 1ns);
    EXPECT_FALSE(drain_);
    advance(1ns);
    EXPECT_TRUE(drain_);
}

TEST_F(IdleExitTest, OneTimerServesAnyNumberOfVisits) {
    idle_.setLimit(30s);
    for (int visit = 0; visit < 100; ++visit) {
        idle_.connectionsChanged(1);
        advance(1ms);
        idle_.connectionsChanged(0);
    }

    EXPECT_EQ(loop_.delayed, 1);
}

TEST_F(IdleExitTest, AVisitWhileItDrainsStartsTheTimeAgain) {
    idle_.setLimit(30s);
    advance(30s);
    idle_.connectionsChanged(1);
    idle_.connectionsChanged(0);
    finishDraining();
    EXPECT_FALSE(stop_);

    advance(30s);
    EXPECT_EQ(drains_, 2);
}

TEST_F(IdleExitTest, WhoComesInTheLastMomentKeepsIt) {
    idle_.setLimit(30s);
    advance(30s);
    finishDraining();
    idle_.connectionsChanged(1);
    answer(false);
    advance(24h);
    EXPECT_EQ(std::pair(ends_, drains_), std::pair(0, 1));

    idle_.connectionsChanged(0);
    advance(30s);
    EXPECT_EQ(drains_, 2);
}

TEST_F(IdleExitTest, AShorterLimitHoldsAtOnce) {
    idle_.setLimit(1h);
    advance(10s);
    idle_.setLimit(20s);

    advance(10s);
    EXPECT_TRUE(drain_);
}

TEST_F(IdleExitTest, ALimitThatIsTakenAwayHoldsNoMore) {
    idle_.setLimit(30s);
    advance(30s);
    idle_.setLimit(std::nullopt);
    finishDraining();

    EXPECT_FALSE(stop_);
}

} // namespace
} // namespace halyard::linux_
