#include "platform/HYReportingUtilityDevice.h"

#include <gtest/gtest.h>
#include <limits>
#include <map>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/Platform.h"
#include "testing/FakeCondition.h"
#include "testing/FakeDevice.h"
#include "testing/RecordingLog.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;

class DeviceHelpersTest : public ::testing::Test {
protected:
    DeviceHelpersTest() {
        platform_.log = &log_;
        platform_.processTable = &processes_;
        platform_.ownProcess = &own_;
        platform_.deviceProperties = &properties_;
        platform::install(&platform_);
    }
    ~DeviceHelpersTest() override { platform::install(nullptr); }

    // On a platform that has asked nothing yet.
    bool isInternalAtFirst(std::map<std::string, bool> properties) {
        platform::Platform fresh;
        fresh.deviceProperties = &properties_;
        properties_.booleans = std::move(properties);
        platform::install(&fresh);
        const bool internal = HYReportingUtilityIsInternalBuild();
        platform::install(&platform_);
        return internal;
    }
    bool wait(double timeout) {
        return HYReportingUtilityWait(condition_, timeout, &done_, "waiting", "timed out",
                                      HYReportingSessionCategory);
    }

    testing::RecordingLog log_;
    testing::FakeProcessTable processes_;
    testing::FakeOwnProcess own_;
    testing::FakeDeviceProperties properties_;
    testing::FakeCondition condition_;
    bool done_ = false;
    platform::Platform platform_;
};

TEST_F(DeviceHelpersTest, NoProcessHasANumberBelowOne) {
    processes_.names[0] = "swapper";
    processes_.names[-1] = "nobody";
    EXPECT_EQ(HYReportingUtilityProcessNameForPID(0), std::nullopt);
    EXPECT_EQ(HYReportingUtilityProcessNameForPID(-1), std::nullopt);
}

TEST_F(DeviceHelpersTest, TheOwnProcessGoesByItsOwnName) {
    processes_.names[own_.ownPID] = "cut by the kern";
    EXPECT_EQ(HYReportingUtilityProcessNameForPID(own_.ownPID), own_.ownName);
}

TEST_F(DeviceHelpersTest, OthersGoByTheKernelsName) {
    processes_.names[1] = "init";
    EXPECT_EQ(HYReportingUtilityProcessNameForPID(1), "init");
    EXPECT_EQ(HYReportingUtilityProcessNameForPID(2), std::nullopt);
}

TEST_F(DeviceHelpersTest, ANameCutInsideACharacterIsStillText) {
    processes_.names[7] = "player \xC3";
    EXPECT_EQ(HYReportingUtilityProcessNameForPID(7), "player \xEF\xBF\xBD");
}

TEST_F(DeviceHelpersTest, ProcessInfoOfAVanishedProcessIsLeftAlone) {
    platform::ProcessInfo info{"before"};
    EXPECT_FALSE(HYReportingUtilityProcessInfoForPID(9, info));
    EXPECT_EQ(info.shortCommandName, "before");
    processes_.names[9] = "mpv";
    EXPECT_TRUE(HYReportingUtilityProcessInfoForPID(9, info));
    EXPECT_EQ(info.shortCommandName, "mpv");
}

TEST_F(DeviceHelpersTest, ABuildIsInternalOnlyWhenTheDeviceSaysSo) {
    EXPECT_FALSE(isInternalAtFirst({}));
    EXPECT_FALSE(isInternalAtFirst({{"InternalBuild", false}}));
    EXPECT_TRUE(isInternalAtFirst({{"InternalBuild", true}}));
}

TEST_F(DeviceHelpersTest, EachPlatformKeepsItsFirstAnswer) {
    EXPECT_FALSE(HYReportingUtilityIsInternalBuild());
    EXPECT_TRUE(isInternalAtFirst({{"InternalBuild", true}}));
    EXPECT_FALSE(HYReportingUtilityIsInternalBuild());
}

TEST_F(DeviceHelpersTest, TheKindOfBuildIsAskedOnceByAllThreadsTogether) {
    properties_.booleans["InternalBuild"] = true;
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([] { EXPECT_TRUE(HYReportingUtilityIsInternalBuild()); });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    properties_.booleans["InternalBuild"] = false;
    EXPECT_TRUE(HYReportingUtilityIsInternalBuild());
    EXPECT_EQ(properties_.asked, std::vector<std::string>{"InternalBuild"});
}

TEST_F(DeviceHelpersTest, ASignalBeforeTheWaitEndsItAtOnce) {
    HYReportingUtilitySignal(condition_, &done_);
    EXPECT_EQ(condition_.signals, 1);
    EXPECT_TRUE(wait(5));
    EXPECT_TRUE(condition_.waits.empty());
    EXPECT_TRUE(log_.lines().empty());
    EXPECT_FALSE(condition_.locked);
}

TEST_F(DeviceHelpersTest, AWaitOfZeroReturnsAfterOnePass) {
    EXPECT_FALSE(wait(0));
    const std::vector<testing::RecordingLog::Line> expected = {
        {LogLevel::Info, "hyrr", "waiting"}, {LogLevel::Error, "hyrr", "timed out"}};
    EXPECT_EQ(log_.lines(), expected);
    EXPECT_FALSE(condition_.locked);
}

TEST_F(DeviceHelpersTest, EachWakeUpWithoutTheFlagGrantsAFreshTimeout) {
    condition_.onWait = [this] {
        done_ = condition_.waits.size() == 3;
        return true;
    };
    EXPECT_TRUE(wait(1.5));
    EXPECT_EQ(condition_.waits, std::vector<std::chrono::nanoseconds>(3, 1500ms));
    EXPECT_EQ(log_.texts(), (std::vector<std::string>{"waiting", "continuing", "waiting",
                                                      "continuing", "waiting", "continuing"}));
}

TEST_F(DeviceHelpersTest, AbsurdTimeoutsAreHarmless) {
    EXPECT_FALSE(wait(-1));
    EXPECT_FALSE(wait(std::numeric_limits<double>::quiet_NaN()));
    EXPECT_FALSE(wait(1e300));
    EXPECT_EQ(condition_.waits[0], 0ns);
    EXPECT_EQ(condition_.waits[1], 0ns);
    EXPECT_GT(condition_.waits[2], 24h);
}

} // namespace
} // namespace halyard
