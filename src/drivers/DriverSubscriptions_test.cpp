// How the utility subscribes: once, to the eight groups, at its construction.
#include "drivers/DriverFixture.h"
#include "platform/Platform.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::IsEmpty;

constexpr const char* kDescriptions[] = {
    "KestrelZR4QLX-(null)",           "Speaker-(null)", "(null)-QLX", "Haptics-Stats",
    "StateTransitionTimes_ms-(null)", "Rx-(null)",      "Tx-(null)",  "(null)-HWAudio2"};

class DriverSubscriptionsTest : public DriverTest {
protected:
    void offerAllGroups() {
        for (const char* description : kDescriptions) {
            group(description) = {};
        }
    }
};

TEST_F(DriverSubscriptionsTest, SubscribesToEveryGroupInTheOrderOfTheTable) {
    offerAllGroups();
    EXPECT_THAT(descriptions(HYReportingDriverUtility()), ElementsAreArray(kDescriptions));
    EXPECT_EQ(platform_.hwReport.calls.front(), "list KestrelZR4QLX-(null)");
    EXPECT_EQ(platform_.hwReport.calls.back(), "subscribe (null)-HWAudio2");
}

TEST_F(DriverSubscriptionsTest, LeavesOutTheRowsThatYieldNoChannels) {
    offerAllGroups();
    group("Speaker-(null)").channelCount = 0;
    group("Tx-(null)").listed = false;
    EXPECT_THAT(descriptions(HYReportingDriverUtility()),
                ElementsAre("KestrelZR4QLX-(null)", "(null)-QLX", "Haptics-Stats",
                            "StateTransitionTimes_ms-(null)", "Rx-(null)", "(null)-HWAudio2"));
}

TEST_F(DriverSubscriptionsTest, TheThirdRowHasNoGroup) {
    offerAllGroups();
    EXPECT_EQ(descriptions(HYReportingDriverUtility()).at(2), "(null)-QLX");
}

TEST_F(DriverSubscriptionsTest, KeepsTheHandleAndWhatWasSubscribedTo) {
    group("Rx-(null)") = {};
    const HYReportingDriverUtility utility;
    const auto& subscription = utility.ioChannelSubscriptions().at(0);
    EXPECT_EQ(subscription.subscription(), &platform_.hwReport.subscriptions["Rx-(null)"]);
    const auto* channels = dynamic_cast<const testing::FakeHWReport::Channels*>(
        subscription.subscribedChannels().get());
    ASSERT_NE(channels, nullptr);
    EXPECT_EQ(channels->group, "Rx-(null) subscribed");
}

TEST_F(DriverSubscriptionsTest, KeepsASubscriptionThatFailed) {
    group("Rx-(null)") = {.handle = false, .describes = false};
    const HYReportingDriverUtility utility;
    ASSERT_EQ(utility.ioChannelSubscriptions().size(), 1U);
    EXPECT_EQ(utility.ioChannelSubscriptions()[0].subscription(), nullptr);
    EXPECT_EQ(utility.ioChannelSubscriptions()[0].subscribedChannels(), nullptr);
    EXPECT_EQ(platform_.log.lines().back(),
              line(LogLevel::Info, "subscribed to group group Rx-(null)"));
}

TEST_F(DriverSubscriptionsTest, LogsWhatBecameOfEachGroup) {
    group("KestrelZR4QLX-(null)") = {};
    group("Speaker-(null)") = {.channelCount = 0};
    group("(null)-QLX") = {.listed = false, .listingError = 5};
    group("Haptics-Stats") = {.listed = false};
    group("Rx-(null)") = {.listingError = -2, .channelCount = 0};
    const HYReportingDriverUtility utility;
    EXPECT_EQ(
        platform_.log.lines(),
        (Lines{line(LogLevel::Info, "creating hwreporting driver utility"),
               line(LogLevel::Info, "subscribed to group group KestrelZR4QLX-(null)"),
               line(LogLevel::Info, "couldn't find any channels for driver group Speaker-(null)"),
               line(LogLevel::Error, "error 5 getting channels for driver (null)-QLX"),
               line(LogLevel::Error, "error -2 getting channels for driver Rx-(null)"),
               line(LogLevel::Info, "couldn't find any channels for driver group Rx-(null)")}));
}

TEST_F(DriverSubscriptionsTest, ADeviceWithoutChannelsHasNoSubscriptions) {
    offerAllGroups();
    for (auto& [description, each] : platform_.hwReport.groups) {
        each.channelCount = 0;
    }
    group("Rx-(null)") = {.listed = false, .listingError = 1};
    EXPECT_THAT(HYReportingDriverUtility().ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(platform_.log.texts(LogLevel::Info).size(), 1U + 8U);
    EXPECT_THAT(platform_.log.texts(LogLevel::Error),
                ElementsAre("error 1 getting channels for driver Rx-(null)"));
}

TEST_F(DriverSubscriptionsTest, AGroupListedWithAnErrorIsStillSubscribed) {
    group("Tx-(null)") = {.listingError = 22};
    EXPECT_THAT(descriptions(HYReportingDriverUtility()), ElementsAre("Tx-(null)"));
    EXPECT_EQ(platform_.log.lines()[1],
              line(LogLevel::Error, "error 22 getting channels for driver Tx-(null)"));
    EXPECT_EQ(platform_.log.lines()[2],
              line(LogLevel::Info, "subscribed to group group Tx-(null)"));
}

TEST_F(DriverSubscriptionsTest, ASystemWithoutSuchStatisticsHasNoSubscriptions) {
    const platform::Platform& whole = platform::current();
    platform::Platform bare;
    bare.log = whole.log;
    platform::install(&bare);
    EXPECT_THAT(HYReportingDriverUtility().ioChannelSubscriptions(), IsEmpty());
    platform::install(&whole);
}

TEST_F(DriverSubscriptionsTest, TheListCanBeReplaced) {
    offerAllGroups();
    HYReportingDriverUtility utility;
    utility.setIoChannelSubscriptions({});
    EXPECT_THAT(utility.ioChannelSubscriptions(), IsEmpty());
}

} // namespace
} // namespace halyard
