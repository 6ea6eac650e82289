#include "linux/net/ClientBudgets.h"

#include <gtest/gtest.h>
#include <unistd.h>

namespace halyard::linux_ {
namespace {

Peer peer(std::int32_t pid, std::uint32_t uid = 1) {
    return {pid, uid, 0, {}};
}

TEST(ClientBudgetsTest, AProcessHasOneForAllItsConnections) {
    ClientBudgets budgets;
    const Peer self = peer(::getpid());
    const auto budget = budgets.of(self);
    EXPECT_EQ(budgets.of(self), budget);
    EXPECT_NE(budgets.of(peer(::getppid())), budget);
    EXPECT_NE(budgets.of(peer(::getpid(), 2)), budget);
}

TEST(ClientBudgetsTest, FollowLimitsAlsoOfThoseWhoAreConnected) {
    ClientBudgets budgets;
    const auto budget = budgets.of(peer(::getpid()));
    EXPECT_TRUE(budget->fits(1000));
    budgets.setLimits({.memory = 999});
    EXPECT_FALSE(budget->fits(1000));
}

TEST(ClientBudgetsTest, TellOfReliefWhosever) {
    ClientBudgets budgets;
    int relieved = 0;
    budgets.onRelief([&] { ++relieved; });
    const auto budget = budgets.of(peer(::getpid()));
    using Work = platform::ClientBudget::Work;
    budget->begin(Work::Rows, std::size_t{1} << 30);
    EXPECT_TRUE(budget->isBacklogged());
    budget->end(Work::Rows, 1, std::size_t{1} << 30);
    EXPECT_EQ(relieved, 1);
}

TEST(StartOfProcessTest, IsThatOfTheProcess) {
    EXPECT_GT(startOfProcess(::getpid()), startOfProcess(1));
    EXPECT_EQ(startOfProcess(-1), 0U);
}

} // namespace
} // namespace halyard::linux_
