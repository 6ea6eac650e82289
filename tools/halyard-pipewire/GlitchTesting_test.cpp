// That the player, the control group and the hog do what the tests of glitches
// rely on. Against a real daemon; skipped where PipeWire is not installed.

#include "GlitchTesting.h"

#include <algorithm>
#include <csignal>
#include <fstream>
#include <gtest/gtest.h>
#include <iterator>
#include <sched.h>
#include <sstream>
#include <string>
#include <vector>

namespace halyard::testing {
namespace {

using namespace std::chrono_literals;

constexpr std::int64_t kMillisecond = 1'000'000;

class GlitchPlayerTest : public ::testing::Test {
protected:
    void SetUp() override {
        if (!PrivatePipeWire::installed()) {
            GTEST_SKIP() << "pipewire, wireplumber, pw-play and wpctl are not installed";
        }
        server_.start();
    }

    static std::string text(const GlitchPlayer& player, const std::string& name) {
        std::ifstream file("/proc/" + std::to_string(player.pid()) + "/task/" +
                           std::to_string(player.dataThread()) + '/' + name);
        return {std::istreambuf_iterator<char>(file), {}};
    }
    // Of its data thread: 0 is the time on processors, 1 the wait for one.
    static std::int64_t schedule(const GlitchPlayer& player, int index) {
        std::istringstream numbers(text(player, "schedstat"));
        std::int64_t value = 0;
        for (int skipped = -1; skipped < index; ++skipped) {
            numbers >> value;
        }
        return value;
    }
    static long majorFaults(const GlitchPlayer& player) {
        const std::string stat = text(player, "stat");
        std::istringstream fields(stat.substr(stat.rfind(')') + 2));
        const std::vector<std::string> values{std::istream_iterator<std::string>(fields), {}};
        return std::stol(values.at(9));
    }
    static std::int64_t length(const Episode& episode) {
        return episode.monotonicAfter - episode.monotonicBefore;
    }

    // Four, of whatever else plays on the same device.
    void letCyclesPass() { GlitchPlayer(speaker_).command("sleep 0 4"); }

    PrivatePipeWire server_;
    const std::vector<std::string> speaker_{"--target=out.speaker"};
};

TEST_F(GlitchPlayerTest, SaysWhichThreadAndNodeItPlaysWith) {
    const GlitchPlayer player(speaker_);
    EXPECT_NE(player.dataThread(), player.pid());
    EXPECT_FALSE(text(player, "comm").empty());
    server_.run({"wpctl", "inspect", std::to_string(player.node())});
}

TEST_F(GlitchPlayerTest, ItsDataThreadIsOfARealTimeClassUnlessItIsToBeOrdinary) {
    if (!ProcessorHog::allowed()) {
        GTEST_SKIP() << "no real-time class for this user";
    }
    const GlitchPlayer player(speaker_);
    const GlitchPlayer ordinary({"--target=out.speaker", "--ordinary"});
    EXPECT_NE(sched_getscheduler(player.dataThread()), SCHED_OTHER);
    EXPECT_EQ(sched_getscheduler(ordinary.dataThread()), SCHED_OTHER);
}

TEST_F(GlitchPlayerTest, BurnsProcessorTimeInAsManyCyclesAsItIsTold) {
    GlitchPlayer player(speaker_);
    const auto before = schedule(player, 0);
    const Episode episode = player.command("burn 10 3");
    EXPECT_GE(length(episode), 30 * kMillisecond);
    EXPECT_GE(episode.realtimeAfter, episode.realtimeBefore);
    EXPECT_GE(schedule(player, 0) - before, 3 * kMillisecond); // others may run as well
}

TEST_F(GlitchPlayerTest, SleepsWithoutFaults) {
    GlitchPlayer player(speaker_);
    const auto before = majorFaults(player);
    EXPECT_GE(length(player.command("sleep 30")), 30 * kMillisecond);
    EXPECT_EQ(majorFaults(player), before);
}

TEST_F(GlitchPlayerTest, WaitsForPages) {
    if (!GlitchPlayer::canFault()) {
        GTEST_SKIP() << "takes the right to mount a file system";
    }
    GlitchPlayer player(speaker_);
    const auto before = majorFaults(player);
    EXPECT_GE(length(player.command("fault 30 2")), 60 * kMillisecond);
    EXPECT_EQ(majorFaults(player), before + 2);
}

TEST_F(GlitchPlayerTest, PausesAndResumes) {
    GlitchPlayer player(speaker_);
    player.command("pause");
    player.send("sleep 1");
    letCyclesPass();
    EXPECT_FALSE(player.answered());
    const Episode either = player.command("resume");
    const Episode other = player.answer();
    EXPECT_GT(std::max(length(either), length(other)), kMillisecond);
}

TEST_F(GlitchPlayerTest, EndsAsItIsTold) {
    const auto statusAfter = [this](const char* command) {
        GlitchPlayer player(speaker_);
        player.command(command);
        return player.process().wait();
    };
    EXPECT_EQ(statusAfter("stop"), 0);
    EXPECT_EQ(statusAfter("exit 3"), 3);
    EXPECT_EQ(statusAfter("die"), -1);
    EXPECT_EQ(statusAfter("abort"), -1);
}

TEST_F(GlitchPlayerTest, ItsCyclesAreAsLongAsTheQuantumThatIsForced) {
    GlitchPlayer player(speaker_);
    server_.forceQuantum(4096);
    player.command("sleep 1 3"); // the next is of the new length
    constexpr std::int64_t kFourOfAThousandFrames = 86 * kMillisecond;
    EXPECT_GT(length(player.command("sleep 1 5")), 2 * kFourOfAThousandFrames); // of about 4
}

TEST_F(GlitchPlayerTest, RecordsTheMicrophone) {
    GlitchPlayer recorder({"--capture", "--target=in.microphone"});
    EXPECT_GE(length(recorder.command("sleep 5")), 5 * kMillisecond);
}

TEST_F(GlitchPlayerTest, AFilterRunsBeforeAndAfterItIsLinked) {
    GlitchPlayer player({"--filter", "--name=jack-like"});
    EXPECT_GE(length(player.command("sleep 5")), 5 * kMillisecond);
    server_.run({"pw-link", "jack-like:out_1", "out.speaker:playback_FL"});
    EXPECT_GE(length(player.command("sleep 5")), 5 * kMillisecond);
}

TEST_F(GlitchPlayerTest, HasManyQuietStreams) {
    const GlitchPlayer players({"--target=out.speaker", "--streams=20", "--paused"});
    EXPECT_EQ(players.dataThread(), 0);
    EXPECT_GT(players.node(), 0U);
}

TEST_F(GlitchPlayerTest, AnswersOnlyAfterItMayRunAgain) {
    GlitchPlayer player(speaker_);
    player.process().signal(SIGSTOP);
    player.send("sleep 1");
    letCyclesPass();
    EXPECT_FALSE(player.answered());
    EXPECT_NE(text(player, "stat").find(" T "), std::string::npos);
    player.process().signal(SIGCONT);
    EXPECT_GT(length(player.answer()), kMillisecond);
}

class FreezableGroupTest : public GlitchPlayerTest,
                           public ::testing::WithParamInterface<FreezableGroup::Version> {};

TEST_P(FreezableGroupTest, HoldsWhatIsInItUntilItThaws) {
    const auto group = FreezableGroup::make(GetParam());
    if (group == nullptr) {
        GTEST_SKIP() << "no such control groups here, or not ours to change";
    }
    GlitchPlayer player(speaker_);
    group->add(player.pid());
    group->freeze();
    player.send("sleep 1");
    letCyclesPass();
    EXPECT_FALSE(player.answered());
    group->thaw();
    EXPECT_GT(length(player.answer()), kMillisecond);
}

INSTANTIATE_TEST_SUITE_P(Versions, FreezableGroupTest,
                         ::testing::Values(FreezableGroup::Version::One,
                                           FreezableGroup::Version::Two),
                         [](const auto& version) {
                             return version.param == FreezableGroup::Version::One ? "One" : "Two";
                         });

TEST_F(GlitchPlayerTest, WaitsForAProcessorThatAHogHas) {
    if (!ProcessorHog::allowed()) {
        GTEST_SKIP() << "no real-time class for this user, or one processor";
    }
    GlitchPlayer player(speaker_);
    ASSERT_TRUE(pin(player.dataThread(), 1));
    const auto before = schedule(player, 1);
    const Episode episode = ProcessorHog(1, 100ms).wait();
    EXPECT_GE(length(episode), 100 * kMillisecond);
    player.command("sleep 1"); // it runs again
    EXPECT_GE(schedule(player, 1) - before, 30 * kMillisecond);
}

} // namespace
} // namespace halyard::testing
