// Groups that grow by the devices whose cycles somebody counts.
#include <gmock/gmock.h>

#include "linux/drivers/LinuxHWReportFixture.h"

namespace halyard::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class CyclesTest : public LinuxHWReportTest {
protected:
    CyclesTest() { EXPECT_TRUE(SharedFolder::make(folder_).ok()); }

    LinuxHWReport& library(const std::vector<DriverChannel>& channels = {}) {
        return library_.emplace(platform_.clock, channels,
                                LinuxHWReport::Options{tree_.path(), std::chrono::seconds(60),
                                                       folder_,
                                                       [](std::uint32_t) { return true; }});
    }
    void writeCounts(const std::string& stem, int cycles) {
        tree_.write("run/cycles/" + stem + ".counts",
                    "cycles " + std::to_string(cycles) + "\nmissed 0\n");
    }
    std::int64_t count(const std::optional<std::string>& group) {
        return library_->getChannelCount(*library_->copyChannelsInGroup(group, {}).value);
    }

    std::filesystem::path folder_ = makeParent();

private:
    std::filesystem::path makeParent() {
        std::filesystem::create_directory(tree_ / "run");
        return tree_ / "run/cycles";
    }
};

TEST_F(CyclesTest, TheFolderAloneMakesAGroupsSubscription) {
    library();
    EXPECT_EQ(count("Speaker"), 1);
    EXPECT_EQ(count("Rx"), 1);
    EXPECT_EQ(count("Tx"), 0);
    EXPECT_EQ(count({}), 2);
    EXPECT_EQ(library_->getChannelCount(*library_->copyChannelsInGroup({}, "QLX").value), 0);
}

TEST_F(CyclesTest, WithoutTheFolderThereIsNone) {
    std::filesystem::remove(folder_);
    library();
    EXPECT_EQ(count({}), 0);
}

TEST_F(CyclesTest, ADeviceThatComesAfterTheSubscriptionIsReported) {
    library();
    subscribe();
    const auto before = sample();
    writeCounts("out-a", 5);
    writeCounts("in-b", 7);
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("Cycles=5", "Missed cycles=0"));
    subscribe("Rx");
    const auto later = sample();
    writeCounts("in-b", 8);
    EXPECT_THAT(delta(later.get(), *sample()), ElementsAre("Cycles=1", "Missed cycles=0"));
}

TEST_F(CyclesTest, ADeviceThatComesBackGoesOnFromWhereItWas) {
    library();
    subscribe();
    writeCounts("out-a", 5);
    writeCounts("out-b", 5);
    const auto before = sample();
    std::filesystem::remove(folder_ / "out-a.counts");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("Cycles=0", "Missed cycles=0"));
    writeCounts("out-a", 6);
    std::filesystem::remove(folder_ / "out-b.counts");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("Cycles=1", "Missed cycles=0"));
}

TEST_F(CyclesTest, DevicesBeyondTheMostAreNotTakenForNewLater) {
    library();
    subscribe();
    for (std::size_t i = 0; i < CycleChannels::kMaxDevices; ++i) {
        writeCounts("out-a" + std::to_string(i), 1000);
    }
    sample();
    writeCounts("out-b", 1000);
    const auto before = sample();
    for (std::size_t i = 0; i < CycleChannels::kMaxDevices; ++i) {
        std::filesystem::remove(folder_ / ("out-a" + std::to_string(i) + ".counts"));
    }
    const auto between = sample();
    EXPECT_THAT(delta(before.get(), *between), IsEmpty());
    writeCounts("out-b", 1001);
    EXPECT_THAT(delta(between.get(), *sample()), ElementsAre("Cycles=1", "Missed cycles=0"));
}

TEST_F(CyclesTest, AChannelOfOnesOwnReplacesADevices) {
    tree_.write("own", "1\n");
    DriverChannel own = channel("Cycles", "file:/own");
    own.driver = "a";
    library({own});
    subscribe();
    writeCounts("out-a", 5);
    const auto before = sample();
    writeCounts("out-a", 50);
    tree_.write("own", "4\n");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("Cycles=3", "Missed cycles=0"));
}

TEST_F(CyclesTest, AFileThatCannotBeReadIsToldOnceAnEpisode) {
    library();
    subscribe();
    writeCounts("out-a", 5);
    sample(); // A device without histograms is none to speak of.
    EXPECT_THAT(platform_.log.texts(LogLevel::Default), IsEmpty());
    tree_.write("run/cycles/out-a.wait", "nonsense\n");
    sample();
    sample();
    const std::string told = "driver channel Speaker-(null) \"Wait\" cannot be read: " +
                             (folder_ / "out-a.wait").native() + ": not in the expected format";
    EXPECT_THAT(platform_.log.texts(LogLevel::Default), ElementsAre(told));
    tree_.write("run/cycles/out-a.wait", "0 10 1\n");
    sample();
    EXPECT_TRUE(
        logged(LogLevel::Default, "driver channel Speaker-(null) \"Wait\" can be read again"));
}

} // namespace
} // namespace halyard::linux_
