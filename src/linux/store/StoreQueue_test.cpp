#include "linux/store/StoreQueue.h"

#include <gtest/gtest.h>

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using Steady = std::chrono::steady_clock;

StoreRow row() {
    return StoreMetricRow{"x", 1, 0};
}

void waitUntil(Steady::time_point moment) {
    while (Steady::now() <= moment) {
    }
}

TEST(StoreQueueTest, RowsThatCannotBeWrittenHoldTheirClientBackNoLonger) {
    StoreQueue queue({}, {.delay = 1h, .rows = 4}, nullptr);
    const auto client =
        std::make_shared<platform::ClientBudget>(std::make_shared<const platform::SharedLimits>());
    bool relieved = false;
    client->setReliefHandler([&relieved] { relieved = true; });
    const platform::BudgetScope scope(client);
    while (!client->isBusy()) {
        ASSERT_TRUE(queue.push(row()));
    }
    queue.setFailing(StoreLoss::DiskFull);
    EXPECT_TRUE(relieved);
    EXPECT_FALSE(client->isBusy());
    for (int i = 0; i < 5'000; ++i) {
        (void)queue.push(row());
    }
    EXPECT_FALSE(client->isBusy());
}

TEST(StoreQueueTest, RowsThatAreLeftBehindStayAsOldAsTheyAre) {
    StoreQueue queue({}, {.delay = 1h, .rows = 4}, nullptr);
    for (int i = 0; i < 6; ++i) {
        (void)queue.push(row());
    }
    const auto came = Steady::now();
    waitUntil(came + 2ms);
    std::vector<StoreItem> taken;
    queue.take(taken);
    EXPECT_EQ(taken.size(), 4U);
    queue.settle(taken);
    EXPECT_EQ(queue.levels().rows, 2U);
    EXPECT_GT(queue.levels().oldest, 2ms);
}

TEST(StoreQueueTest, RowsThatAreLeftBehindAreNoOlderThanTheyAre) {
    StoreQueue queue({}, {.delay = 1h, .rows = 4}, nullptr);
    for (int i = 0; i < 4; ++i) {
        (void)queue.push(row());
    }
    const auto before = Steady::now();
    waitUntil(before + 2ms);
    const auto came = Steady::now();
    (void)queue.push(row());
    std::vector<StoreItem> taken;
    queue.take(taken);
    queue.settle(taken);
    const auto oldest = queue.levels().oldest;
    EXPECT_LE(oldest, Steady::now() - came);
}

} // namespace
} // namespace halyard::linux_
