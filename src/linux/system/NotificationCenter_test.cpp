#include "linux/system/NotificationCenter.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "testing/ManualQueues.h"

namespace halyard::linux_ {
namespace {

using ::testing::ElementsAre;

class NotificationCenterTest : public ::testing::Test {
protected:
    platform::Notifications::Registration listen(std::string_view name, const char* queue = "q") {
        return center_.registerFor(name,
                                   queues_.makeSerialQueue(queue, platform::QueuePriority::Utility),
                                   [this](int token) { heard_.push_back(token); });
    }
    void post(std::string_view name) {
        center_.post(name);
        queues_.runUntilIdle();
    }

    testing::ManualClock clock_;
    testing::ManualQueues queues_{clock_};
    NotificationCenter center_;
    std::vector<int> heard_;
};

TEST_F(NotificationCenterTest, TokensCountUpFromOne) {
    for (int token = 1; token <= 3; ++token) {
        const auto registration = listen("a");
        EXPECT_EQ(registration.status, 0u);
        EXPECT_EQ(registration.token, token);
    }
}

TEST_F(NotificationCenterTest, APostReachesEveryListenerOfItsNameInOrder) {
    listen("a");
    listen("b");
    listen("a");

    post("a");
    EXPECT_THAT(heard_, ElementsAre(1, 3));
    post("b");
    EXPECT_THAT(heard_, ElementsAre(1, 3, 2));
    post("nobody's");
    EXPECT_THAT(heard_, ElementsAre(1, 3, 2));
}

TEST_F(NotificationCenterTest, EveryPostIsDeliveredOnTheListenersQueue) {
    listen("a", "service");

    center_.post("a");
    center_.post("a");
    EXPECT_THAT(heard_, ElementsAre());
    EXPECT_EQ(queues_.pending("service"), 2u);
    queues_.runUntilIdle();
    EXPECT_THAT(heard_, ElementsAre(1, 1));
}

TEST_F(NotificationCenterTest, WhatWasPostedBeforeIsNotHeard) {
    post("a");
    listen("a");

    queues_.runUntilIdle();
    EXPECT_THAT(heard_, ElementsAre());
}

TEST_F(NotificationCenterTest, AHandlerMayRegisterAndPost) {
    center_.registerFor("a", queues_.makeSerialQueue("q", platform::QueuePriority::Utility),
                        [this](int) {
                            listen("b");
                            center_.post("b");
                        });
    post("a");
    EXPECT_THAT(heard_, ElementsAre(2));
}

TEST_F(NotificationCenterTest, RegistrationsAreBounded) {
    for (std::size_t i = 0; i < NotificationCenter::kMaxRegistrations; ++i) {
        ASSERT_EQ(listen("a").status, 0u);
    }
    const auto refused = listen("b");
    EXPECT_EQ(refused.status, NotificationCenter::kTooManyRegistrations);
    EXPECT_EQ(refused.token, -1);

    post("b");
    EXPECT_THAT(heard_, ElementsAre());
}

} // namespace
} // namespace halyard::linux_
