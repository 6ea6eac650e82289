// What sources do while some of their files are missing or broken.
#include <gmock/gmock.h>

#include "linux/drivers/SourceKinds.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

using ::testing::ElementsAre;

class SourceFaultsTest : public ::testing::Test {
protected:
    static std::unique_ptr<ChannelSource> make(const std::string& text, SourceRoot& root) {
        return makeChannelSource(text, root).value();
    }

    testing::TempTree tree_;
    SourceRoot own_{tree_.path()};
    platform::SteadyTime now_{std::chrono::seconds(1000)};
};

TEST_F(SourceFaultsTest, InterruptsThatCannotBeReadAreTold) {
    tree_.write("sys/kernel/irq/1/actions", "snd\n");
    const auto source = make("irq:snd", own_);
    EXPECT_EQ(source->read(now_).status, ReadStatus::Absent);
    tree_.write("sys/kernel/irq/1/per_cpu_count", "1,x\n");
    EXPECT_EQ(source->read(now_).status, ReadStatus::Failed);
    tree_.write("sys/kernel/irq/1/per_cpu_count", "1,2\n");
    EXPECT_THAT(source->read(now_).numbers, ElementsAre(3));
}

TEST_F(SourceFaultsTest, IdleStatesAreLookedForAgainWhenOneHasGone) {
    for (const char* state : {"state0", "state1", "state", "state2x", "other3"}) {
        tree_.write(std::string("cpuidle/") + state + "/time", "7");
        tree_.write(std::string("cpuidle/") + state + "/usage", "1");
    }
    const auto source = make("cpuidle:/cpuidle", own_);
    EXPECT_THAT(source->read(now_).shape->states, ElementsAre("state0", "state1"));
    std::filesystem::remove_all(tree_ / "cpuidle/state1");
    EXPECT_EQ(source->read(now_).status, ReadStatus::Absent);
    const Reading reading = source->read(now_);
    EXPECT_THAT(reading.shape->states, ElementsAre("state0"));
    EXPECT_THAT(reading.numbers, ElementsAre(7, 1));
}

TEST_F(SourceFaultsTest, PowerNeedsBothTimesAndNoNegativeOne) {
    tree_.write("power/runtime_active_time", "5\n");
    const auto source = make("runtime_pm:/", own_);
    EXPECT_EQ(source->read(now_).status, ReadStatus::Absent);
    tree_.write("power/runtime_suspended_time", "-1\n");
    EXPECT_EQ(source->read(now_).status, ReadStatus::Failed);
    tree_.write("power/runtime_suspended_time", "0\n");
    EXPECT_THAT(source->read(now_).numbers, ElementsAre(5, 0, 0, 0));
}

TEST_F(SourceFaultsTest, FrequenciesNeedNoTableOfTransitions) {
    tree_.write("time_in_state", "6 1\n12 2\n");
    const auto source = make("cpufreq:/", own_);
    EXPECT_THAT(source->read(now_).numbers, ElementsAre(10, 0, 20, 0));
    tree_.write("trans_table", "too large\n");
    EXPECT_THAT(source->read(now_).numbers, ElementsAre(10, 0, 20, 0));
    tree_.write("trans_table", "From : To\n : 12\n12: 5\n");
    EXPECT_THAT(source->read(now_).numbers, ElementsAre(10, 0, 20, 5));
}

} // namespace
} // namespace halyard::linux_
