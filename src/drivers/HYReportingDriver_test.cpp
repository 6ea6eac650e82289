#include "drivers/HYReportingDriver.h"

#include <gtest/gtest.h>

#include "drivers/HYReportingIOChannelSubscription.h"

namespace halyard {
namespace {

TEST(HYReportingDriverTest, DescribesBothNames) {
    EXPECT_EQ(HYReportingDriver::driverWithGroupName("Haptics", "Stats")->description(),
              "Haptics-Stats");
}

TEST(HYReportingDriverTest, DescribesAnAbsentNameAsNull) {
    EXPECT_EQ(HYReportingDriver::driverWithGroupName("Speaker", std::nullopt)->description(),
              "Speaker-(null)");
    EXPECT_EQ(HYReportingDriver::driverWithGroupName(std::nullopt, "QLX")->description(),
              "(null)-QLX");
    EXPECT_EQ(HYReportingDriver::driverWithGroupName(std::nullopt, std::nullopt)->description(),
              "(null)-(null)");
}

TEST(HYReportingDriverTest, AnEmptyNameIsNotAnAbsentOne) {
    EXPECT_EQ(HYReportingDriver::driverWithGroupName("", "QLX")->description(), "-QLX");
}

TEST(HYReportingDriverTest, NamesCanBeSet) {
    const auto driver = HYReportingDriver::driverWithGroupName("Rx", std::nullopt);
    driver->setGroupName(std::nullopt);
    driver->setSubGroupName("Tx");
    EXPECT_EQ(driver->groupName(), std::nullopt);
    EXPECT_EQ(driver->subGroupName(), "Tx");
    EXPECT_EQ(driver->description(), "(null)-Tx");
}

TEST(HYReportingIOChannelSubscriptionTest, StartsWithItsDriverAlone) {
    const auto driver = HYReportingDriver::driverWithGroupName("Rx", std::nullopt);
    HYReportingIOChannelSubscription subscription(driver);
    EXPECT_EQ(subscription.driver(), driver);
    EXPECT_EQ(subscription.subscription(), nullptr);
    EXPECT_EQ(subscription.subscribedChannels(), nullptr);

    platform::HWReportSubscription handle;
    const auto channels = std::make_shared<platform::HWReportChannels>();
    subscription.setSubscription(&handle);
    subscription.setSubscribedChannels(channels);
    subscription.setDriver(nullptr);
    EXPECT_EQ(subscription.subscription(), &handle);
    EXPECT_EQ(subscription.subscribedChannels(), channels);
    EXPECT_EQ(subscription.driver(), nullptr);
}

} // namespace
} // namespace halyard
