// How many built-in channels there are of each kind, and which devices have none.
#include "linux/drivers/BuiltInChannels.h"

#include <gmock/gmock.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class BuiltInChannelKindsTest : public ::testing::Test {
protected:
    std::vector<std::string> sources() const {
        std::vector<std::string> result;
        for (const auto& channel : builtInChannels(SourceRoot{tree_.path()})) {
            result.push_back(channel.source);
        }
        return result;
    }
    std::vector<std::string> names() const {
        std::vector<std::string> result;
        for (const auto& channel : builtInChannels(SourceRoot{tree_.path()})) {
            result.push_back(channel.name);
        }
        return result;
    }
    // Device 0 to `count` - 1; "#" in the path is the number.
    void devices(int count, const std::string& path, const std::string& text) {
        for (int number = 0; number < count; ++number) {
            std::string each = path;
            each.replace(each.find('#'), 1, std::to_string(number));
            tree_.write(each, text);
        }
    }

    testing::TempTree tree_;
};

TEST_F(BuiltInChannelKindsTest, CardsAreBounded) {
    devices(9, "sys/class/sound/card#/device/power/runtime_status", "active\n");
    EXPECT_EQ(sources().size(), 8U);
}

TEST_F(BuiltInChannelKindsTest, StreamsAreBoundedForEachDirection) {
    devices(9, "proc/asound/card0/pcm#p/sub0/status", "closed\n");
    EXPECT_EQ(sources().size(), 8U * 4);
    devices(9, "proc/asound/card0/pcm#c/sub0/status", "closed\n");
    EXPECT_EQ(sources().size(), 16U * 4);
}

TEST_F(BuiltInChannelKindsTest, ProcessorsAreBoundedAndInTheOrderOfTheirNumbers) {
    devices(17, "sys/devices/system/cpu/cpu#/cpuidle/state0/time", "1\n");
    tree_.write("sys/devices/system/cpu/cpuidle/cpuidle/state0/time", "1\n");
    const auto found = names();
    ASSERT_EQ(found.size(), 16U);
    EXPECT_EQ(found[2], "cpu2");
    EXPECT_EQ(found[15], "cpu15");
}

TEST_F(BuiltInChannelKindsTest, FrequenciesAreBoundedForEachKind) {
    devices(9, "sys/devices/system/cpu/cpufreq/policy#/stats/time_in_state", "1 1\n");
    EXPECT_EQ(sources().size(), 8U);
    devices(9, "sys/class/devfreq/bus#/trans_stat", "\n");
    EXPECT_EQ(sources().size(), 16U);
}

TEST_F(BuiltInChannelKindsTest, LinksAreBounded) {
    devices(9, "sys/class/net/eth#/device/uevent", "\n");
    EXPECT_EQ(sources().size(), 8U * 8);
}

TEST_F(BuiltInChannelKindsTest, InterruptsOfAudioAreBoundedAndCountOnceEach) {
    devices(3, "sys/kernel/irq/#/actions", "snd,ttyS0\n");
    EXPECT_THAT(sources(), ElementsAre("irq:snd"));
    for (int number = 3; number < 19; ++number) {
        tree_.write("sys/kernel/irq/" + std::to_string(number) + "/actions",
                    "hda" + std::to_string(number));
    }
    EXPECT_EQ(sources().size(), 16U);
}

TEST_F(BuiltInChannelKindsTest, EveryNameOfAudioCounts) {
    tree_.write("sys/kernel/irq/1/actions",
                "usb-audio,fe80.i2s,sof-pci,codec1,pcm5,soundwire0,hda_x,nvme,eth0");
    EXPECT_EQ(sources().size(), 7U);
}

TEST_F(BuiltInChannelKindsTest, HapticsAreBoundedOverBothKinds) {
    devices(9, "sys/class/input/input#/capabilities/ff", "1\n");
    devices(9, "sys/class/input/input#/device/power/runtime_status", "active\n");
    EXPECT_EQ(sources().size(), 8U);
}

TEST_F(BuiltInChannelKindsTest, AVibratorMayBeALight) {
    tree_.write("sys/class/leds/vibrator0/device/power/runtime_status", "suspended\n");
    tree_.write("sys/class/leds/caps/device/power/runtime_status", "suspended\n");
    EXPECT_THAT(names(), ElementsAre("vibrator0"));
}

TEST_F(BuiltInChannelKindsTest, ADeviceWhosePowerNobodyManagesHasNoChannel) {
    tree_.write("sys/class/sound/card0/device/power/runtime_status", "unsupported\n");
    tree_.write("sys/class/sound/card1/device/uevent", "\n");
    tree_.write("sys/class/input/input1/capabilities/ff", "0 0\n");
    tree_.write("sys/class/input/input1/device/power/runtime_status", "active\n");
    EXPECT_THAT(names(), IsEmpty());
}

} // namespace
} // namespace halyard::linux_
