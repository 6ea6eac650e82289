#include "linux/drivers/LinuxHWReport.h"

#include <algorithm>
#include <gmock/gmock.h>

#include "linux/drivers/BuiltInChannels.h"
#include "linux/drivers/LinuxHWReportFixture.h"
#include "linux/drivers/SourceKinds.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kDevice = HALYARD_TEST_DATA "/drivers";

// Group, subgroup, driver and name of each channel, and its source.
std::vector<std::string> builtIn(const std::filesystem::path& root) {
    std::vector<std::string> result;
    for (const auto& each : builtInChannels(SourceRoot{root})) {
        result.push_back(each.group.value_or("-") + "/" + each.subgroup.value_or("-") + "/" +
                         each.driver + "/" + each.name + " = " + each.source);
    }
    return result;
}

TEST(BuiltInChannelsTest, ADeviceHasChannelsInEveryGroup) {
    const auto all = builtIn(kDevice);
    for (const char* channel :
         {"KestrelZR4QLX/-/snd_hda_intel/card0 Power = runtime_pm:/sys/class/sound/card0/device",
          "Speaker/-/PCH/pcm0p Frames = alsa_frames:/proc/asound/card0/pcm0p/sub0",
          "Speaker/-/PCH/pcm0p State = alsa_states:/proc/asound/card0/pcm0p/sub0",
          "CPUIdle/QLX/acpi_idle/cpu0 = cpuidle:/sys/devices/system/cpu/cpu0/cpuidle",
          "Haptics/Stats/drv2625/drv2625 haptics = runtime_pm:/sys/class/input/input5/device",
          "StateTransitionTimes_ms/-/cpufreq-dt/policy0 = "
          "cpufreq:/sys/devices/system/cpu/cpufreq/policy0/stats",
          "StateTransitionTimes_ms/-//17000010.devfreq_mif = "
          "devfreq:/sys/class/devfreq/17000010.devfreq_mif",
          "Rx/-/PCH/pcm0c Xruns = alsa_xruns:/proc/asound/card0/pcm0c/sub0",
          "Rx/-/macb/eth0 dropped = file:/sys/class/net/eth0/statistics/rx_dropped",
          "Tx/-/macb/eth0 errors = file:/sys/class/net/eth0/statistics/tx_errors",
          "Interrupts/HWAudio2//snd_hda_intel:card0 = irq:snd_hda_intel:card0",
          "Pressure/HWAudio2//io full = pressure:/proc/pressure/io:full"}) {
        EXPECT_THAT(all, Contains(channel));
    }
    EXPECT_EQ(all.size(), 29U);
}

TEST(BuiltInChannelsTest, LikeDevicesAreNumbered) {
    const testing::TempTree tree;
    for (const auto& [input, name] :
         {std::pair("input3", "Pad"), {"input4", "Pad"}, {"input5", "Pad2"}, {"input20", "Pad"}}) {
        const std::string device = std::string("sys/class/input/") + input;
        tree.write(device + "/capabilities/ff", "1\n");
        tree.write(device + "/name", std::string(name) + "\n");
        tree.write(device + "/device/power/runtime_status", "active\n");
    }
    const std::string source = " = runtime_pm:/sys/class/input/";
    EXPECT_THAT(builtIn(tree.path()),
                ElementsAre("Haptics/Stats//Pad" + source + "input3/device",
                            "Haptics/Stats//Pad 2" + source + "input4/device",
                            "Haptics/Stats//Pad2 2" + source + "input5/device",
                            "Haptics/Stats//Pad 3" + source + "input20/device"));
}

TEST(BuiltInChannelsTest, ASystemWithoutDevicesHasNone) {
    const testing::TempTree tree;
    EXPECT_THAT(builtIn(tree.path()), IsEmpty());
}

TEST(BuiltInChannelsTest, EveryBuiltInSourceIsUnderstood) {
    for (const char* path : {kDevice, "/"}) {
        SourceRoot root{path};
        for (const auto& channel : builtInChannels(root)) {
            ASSERT_TRUE(makeChannelSource(channel.source, root).ok()) << channel.source;
            EXPECT_EQ(findSourceKind(channel.source)->format, channel.format) << channel.source;
        }
    }
}

TEST(BuiltInChannelsTest, EveryChannelOfTheDeviceIsRead) {
    SourceRoot root{kDevice};
    for (const auto& channel : builtInChannels(root)) {
        auto made = makeChannelSource(channel.source, root);
        const Reading reading = made.value()->read({});
        EXPECT_EQ(reading.status, ReadStatus::Read) << channel.source << reading.fault;
    }
}

TEST_F(LinuxHWReportTest, ListsByGroupAndSubgroupAnAbsentOneMatchingAny) {
    DriverChannel both = channel("both", "file:/x");
    both.subgroup = "QLX";
    DriverChannel subgroupOnly = channel("subgroup", "file:/x");
    subgroupOnly.group.reset();
    subgroupOnly.subgroup = "QLX";
    auto& all = library({channel("group", "file:/x"), both, subgroupOnly});
    const auto count = [&](std::optional<std::string> group, std::optional<std::string> subgroup) {
        const Listing listed = all.copyChannelsInGroup(group, subgroup);
        EXPECT_FALSE(listed.error);
        return all.getChannelCount(*listed.value);
    };
    EXPECT_EQ(count("Speaker", std::nullopt), 2);
    EXPECT_EQ(count(std::nullopt, "QLX"), 2);
    EXPECT_EQ(count("Speaker", "QLX"), 1);
    EXPECT_EQ(count("speaker", std::nullopt), 0);
    EXPECT_EQ(count(std::nullopt, std::nullopt), 3);
}

TEST_F(LinuxHWReportTest, ReportsWhatChangedBetweenTwoSets) {
    tree_.write("a", "10\n");
    tree_.write("b", "5\n");
    library({channel("A", "file:/a"), channel("B", "file:/b")});
    subscribe();
    const auto before = sample();
    tree_.write("a", "14\n");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("A=4", "B=0"));
}

TEST_F(LinuxHWReportTest, WithoutAPreviousSetThereAreNoChannels) {
    tree_.write("a", "10\n");
    library({channel("A", "file:/a")});
    subscribe();
    EXPECT_THAT(delta(nullptr, *sample()), IsEmpty());
}

TEST_F(LinuxHWReportTest, AChannelOfTheSameNameReplacesTheOneBefore) {
    tree_.write("a", "1\n");
    tree_.write("b", "2\n");
    tree_.write("proc/pressure/cpu", "some avg10=0.00 total=5\n");
    DriverChannel pressure = channel("cpu some", "file:/b");
    pressure.group = "Pressure";
    pressure.subgroup = "HWAudio2";
    auto& all = library({channel("A", "file:/a"), channel("A", "file:/b"), pressure});
    EXPECT_EQ(all.getChannelCount(*all.copyChannelsInGroup({}, {}).value), 2);
    subscribe();
    const auto before = sample();
    tree_.write("a", "100\n");
    tree_.write("b", "3\n");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("A=1"));
}

TEST_F(LinuxHWReportTest, AChannelThatMakesNoSenseIsLeftOutAndTold) {
    auto& all = library({channel("A", "pie:/a"), channel("B", "file:/b", ChannelFormat::State),
                         channel("C", "file:/c")});
    const Listing listed = all.copyChannelsInGroup("Speaker", std::nullopt);
    EXPECT_EQ(all.getChannelCount(*listed.value), 1);
    ASSERT_TRUE(listed.error);
    EXPECT_EQ(listed.error->code, 22);
    EXPECT_FALSE(all.copyChannelsInGroup("Rx", std::nullopt).error);
    EXPECT_TRUE(logged(LogLevel::Error, "driver channel Speaker-(null) \"A\" is left out: its "
                                        "source \"pie:/a\" \"pie\" is no kind of source"));
    EXPECT_TRUE(logged(LogLevel::Error, "driver channel Speaker-(null) \"B\" is left out: its "
                                        "source \"file:/b\" gives the format simple, not state"));
}

TEST_F(LinuxHWReportTest, AFileThatGoesCostsItsChannelAndIsToldOnceAnEpisode) {
    tree_.write("a", "1\n");
    tree_.write("b", "1\n");
    library({channel("A", "file:/a"), channel("B", "file:/b")});
    subscribe();
    const auto before = sample();
    tree_.write("a", "one\n");
    sample();
    tree_.write("b", "4\n");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("B=3"));
    const std::string path = (tree_ / "a").native();
    EXPECT_EQ(platform_.log.count("driver channel Speaker-(null) \"A\" cannot be read: " + path +
                                  ": not in the expected format"),
              1U);
    tree_.write("a", "2\n");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("A=1", "B=3"));
    EXPECT_TRUE(logged(LogLevel::Default, "driver channel Speaker-(null) \"A\" can be read again"));
}

TEST_F(LinuxHWReportTest, ABuiltInChannelThatCannotBeReadIsToldOnceAnEpisode) {
    tree_.write("proc/pressure/cpu", "some avg10=0.00 total=5\n");
    library({});
    subscribe("Pressure");
    const auto before = sample();
    EXPECT_THAT(platform_.log.texts(LogLevel::Default), IsEmpty());
    tree_.write("proc/pressure/cpu", "nothing\n");
    sample();
    EXPECT_THAT(delta(before.get(), *sample()), IsEmpty());
    const std::string path = (tree_ / "proc/pressure/cpu").native();
    const std::string told =
        "driver channel Pressure-HWAudio2 \"cpu some\" cannot be read: " + path +
        ": not in the expected format";
    EXPECT_THAT(platform_.log.texts(LogLevel::Default), ElementsAre(told));
    tree_.write("proc/pressure/cpu", "some avg10=0.00 total=9\n");
    EXPECT_THAT(delta(before.get(), *sample()), ElementsAre("cpu some=4"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "driver channel Pressure-HWAudio2 \"cpu some\" can be read again"));
}

TEST_F(LinuxHWReportTest, StrangeHandlesAreErrors) {
    auto& all = library({channel("A", "file:/a")});
    subscribe();
    EXPECT_EQ(all.createSamples(nullptr, subscribed_.channels.get()).error->code, 22);
    EXPECT_EQ(all.createSamples(subscribed_.subscription, nullptr).error->code, 22);
    const platform::HWReportChannels strangeChannels;
    EXPECT_EQ(all.createSubscription(strangeChannels).subscription, nullptr);
    EXPECT_EQ(all.getChannelCount(strangeChannels), 0);
    const platform::HWReportSamples strange;
    EXPECT_EQ(all.createSamplesDelta(nullptr, strange).error->code, 22);
    EXPECT_EQ(all.createSamplesDelta(&strange, *sample()).error->code, 22);
}

TEST_F(LinuxHWReportTest, EveryKindOfStatesHasItsSharesOfTheTimeBetween) {
    const auto write = [&](const std::string& milliseconds, const std::string& ticks) {
        tree_.write("power/runtime_active_time", milliseconds);
        tree_.write("power/runtime_suspended_time", "0");
        tree_.write("idle/state0/time", milliseconds + "000");
        tree_.write("idle/state0/usage", "1");
        tree_.write("time_in_state", "6 " + ticks);
        tree_.write("trans_stat", "From : To\n : 6 time(ms)\n6: 1 " + milliseconds + "\n");
        tree_.write("status", "state: PREPARED\n");
    };
    library({channel("power", "runtime_pm:/", ChannelFormat::State),
             channel("idle", "cpuidle:/idle", ChannelFormat::State),
             channel("cpu", "cpufreq:/", ChannelFormat::State),
             channel("bus", "devfreq:/", ChannelFormat::State),
             channel("pcm", "alsa_states:/", ChannelFormat::State)});
    subscribe();
    write("1000", "100");
    const auto before = sample();
    platform_.clock.advance(4s);
    write("3000", "300");
    EXPECT_THAT(states(*before, *sample()),
                ElementsAre("power active 2000 0.500000", "idle state0 2000000 0.500000",
                            "cpu 6 2000 0.500000", "bus 6 2000 0.500000",
                            "pcm PREPARED 4000000 1.000000"));
}

TEST_F(LinuxHWReportTest, IterationEndsWhenTheCallerSaysSo) {
    tree_.write("a", "1\n");
    library({channel("A", "file:/a"), channel("B", "file:/a")});
    subscribe();
    int calls = 0;
    library_->iterate(*sample(), [&](const platform::HWReportChannel&) { return ++calls; });
    EXPECT_EQ(calls, 1);
}

TEST_F(LinuxHWReportTest, ChannelsThatDifferInOneNameAreTwo) {
    DriverChannel driver = channel("A", "file:/a");
    driver.driver = "Codec";
    DriverChannel subgroup = channel("A", "file:/a");
    subgroup.subgroup = "Stats";
    DriverChannel group = channel("A", "file:/a");
    group.group = "Rx";
    auto& all = library({channel("A", "file:/a"), driver, subgroup, group, channel("B", "file:/a"),
                         channel("A", "file:/b")});
    EXPECT_EQ(all.getChannelCount(*all.copyChannelsInGroup({}, {}).value), 5);
}

TEST_F(LinuxHWReportTest, SetsOfTwoSubscriptionsHaveNoDifference) {
    auto& all = library({channel("A", "file:/a")});
    subscribe();
    const auto first = subscribed_;
    const auto before = sample();
    subscribe();
    EXPECT_EQ(all.createSamplesDelta(before.get(), *sample()).error->code, 22);
    EXPECT_EQ(all.createSamples(first.subscription, subscribed_.channels.get()).error->code, 22);
}

} // namespace
} // namespace halyard::linux_
