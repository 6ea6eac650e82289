#include "platform/ClientBudget.h"

#include <gtest/gtest.h>

namespace halyard::platform {
namespace {

class ClientBudgetTest : public ::testing::Test {
protected:
    const std::shared_ptr<SharedLimits> limits_ = std::make_shared<SharedLimits>(
        ClientLimits{.memory = 100, .sessions = 2, .connections = 1});
    const ClientBudgetPtr budget_ = std::make_shared<ClientBudget>(limits_);
};

TEST_F(ClientBudgetTest, TakesWhatFitsAndNothingOfWhatDoesNot) {
    EXPECT_TRUE(budget_->charge(60));
    EXPECT_FALSE(budget_->charge(41));
    EXPECT_EQ(budget_->keptBytes(), 60U);
    EXPECT_TRUE(budget_->fits(40));
    EXPECT_FALSE(budget_->fits(41));
    EXPECT_TRUE(budget_->charge(40));
    budget_->release(100);
    EXPECT_EQ(budget_->keptBytes(), 0U);
}

TEST_F(ClientBudgetTest, CountsSessionsAndConnections) {
    EXPECT_TRUE(budget_->addSession());
    EXPECT_TRUE(budget_->addSession());
    EXPECT_FALSE(budget_->addSession());
    budget_->removeSession();
    EXPECT_TRUE(budget_->addSession());
    EXPECT_TRUE(budget_->addConnection());
    EXPECT_FALSE(budget_->addConnection());
}

TEST_F(ClientBudgetTest, FollowsTheOperator) {
    limits_->set({.memory = 10});
    EXPECT_FALSE(budget_->charge(11));
    limits_->set({.memory = 11});
    EXPECT_TRUE(budget_->charge(11));
    EXPECT_EQ(budget_->limits(), ClientLimits{.memory = 11});
}

TEST_F(ClientBudgetTest, AnAllotmentGivesBackWhatItTook) {
    {
        Allotment allotment(budget_);
        EXPECT_TRUE(allotment.resize(70));
        EXPECT_FALSE(allotment.resize(101));
        EXPECT_EQ(allotment.bytes(), 70U);
        EXPECT_TRUE(allotment.resize(30));
        const Allotment moved(std::move(allotment));
        EXPECT_EQ(budget_->keptBytes(), 30U);
    }
    EXPECT_EQ(budget_->keptBytes(), 0U);
    EXPECT_TRUE(Allotment().resize(1'000'000)) << "of nobody's budget";
}

TEST_F(ClientBudgetTest, TheCurrentOneIsThatOfTheInnermostScope) {
    const auto other = std::make_shared<ClientBudget>(limits_);
    const BudgetScope scope(budget_);
    {
        const BudgetScope inner(other);
        EXPECT_EQ(ClientBudget::current(), other);
    }
    EXPECT_EQ(ClientBudget::current(), budget_);
}

TEST_F(ClientBudgetTest, WhoHasTooMuchOnItsWayWaitsAndIsTold) {
    using Work = ClientBudget::Work;
    int relieved = 0;
    budget_->setReliefHandler([&] { ++relieved; });
    for (int i = 0; i < 4095; ++i) {
        budget_->begin(Work::Requests, 1);
    }
    EXPECT_FALSE(budget_->isBusy());
    budget_->begin(Work::Requests, 1);
    EXPECT_TRUE(budget_->isBusy());
    EXPECT_FALSE(budget_->isBacklogged()) << "what was read is done";
    budget_->begin(Work::Rows, 12 * 1024 * 1024);
    EXPECT_TRUE(budget_->isBacklogged());
    budget_->end(Work::Requests, 4096, 4096);
    EXPECT_EQ(relieved, 0);
    budget_->end(Work::Rows, 1, 12 * 1024 * 1024);
    EXPECT_EQ(relieved, 1);
    budget_->begin(Work::Singles, 0);
    budget_->end(Work::Singles, 1, 0);
    EXPECT_EQ(relieved, 1) << "nobody was waiting";
}

TEST_F(ClientBudgetTest, ARefusalNamesTheBound) {
    for (const auto& [bound, name] : {std::pair{ClientBound::Memory, "limits.memory"},
                                      {ClientBound::Sessions, "limits.sessions"},
                                      {ClientBound::Connections, "limits.connections"},
                                      {ClientBound::Configuration, "limits.configuration"},
                                      {ClientBound::Copies, "limits.copies"}}) {
        const Error error = boundReached(bound);
        EXPECT_EQ(error.domain, kIpcErrorDomain);
        EXPECT_EQ(error.code, 5);
        EXPECT_TRUE(error.message.starts_with(name)) << error.message;
    }
}

} // namespace
} // namespace halyard::platform
