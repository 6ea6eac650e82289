#include <chrono>
#include <gmock/gmock.h>

#include "linux/drivers/SourceKinds.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr const char* kDevice = HALYARD_TEST_DATA "/drivers";

class ChannelSourcesTest : public ::testing::Test {
protected:
    // Of the captured device, or of `root`.
    static std::unique_ptr<ChannelSource> make(const std::string& text, SourceRoot& root) {
        auto made = makeChannelSource(text, root);
        EXPECT_TRUE(made.ok()) << made.failure().text;
        return made.ok() ? std::move(made).value() : nullptr;
    }
    Reading read(const std::string& text) {
        const auto source = make(text, device_);
        return source != nullptr ? source->read(now_) : Reading();
    }
    std::string refusal(const std::string& text) {
        const auto made = makeChannelSource(text, device_);
        return made.ok() ? "taken" : made.failure().text;
    }

    testing::TempTree tree_;
    SourceRoot device_{kDevice};
    SourceRoot own_{tree_.path()};
    platform::SteadyTime now_{1000s};
};

TEST_F(ChannelSourcesTest, ReadsCounters) {
    EXPECT_THAT(read("file:/sys/class/net/eth0/statistics/rx_packets").numbers,
                ElementsAre(120031));
    EXPECT_THAT(read("field:/proc/softirqs:TIMER:3").numbers, ElementsAre(112272));
    EXPECT_THAT(read("pressure:/proc/pressure/io:full").numbers, ElementsAre(1000001));
}

TEST_F(ChannelSourcesTest, AddsTheInterruptsOfAnAction) {
    EXPECT_THAT(read("irq:snd_hda_intel:card0").numbers, ElementsAre(4521 + 17 + 100 + 200));
    EXPECT_THAT(read("irq:dma-audio").numbers, ElementsAre(9001));
    EXPECT_EQ(read("irq:dma").status, ReadStatus::Absent);
}

TEST_F(ChannelSourcesTest, ReadsTheIdleStatesOfAProcessor) {
    const Reading reading = read("cpuidle:/sys/devices/system/cpu/cpu0/cpuidle");
    ASSERT_EQ(reading.status, ReadStatus::Read);
    EXPECT_THAT(reading.shape->states, ElementsAre("POLL", "C1_ACPI", "C2_ACPI"));
    EXPECT_THAT(reading.numbers, ElementsAre(4711, 120, 8123456, 90210, 612345678, 51234));
}

TEST_F(ChannelSourcesTest, ReadsThePowerOfADeviceByEitherDirectory) {
    for (const char* path : {"runtime_pm:/sys/class/sound/card0/device",
                             "runtime_pm:/sys/class/sound/card0/device/power"}) {
        const Reading reading = read(path);
        ASSERT_EQ(reading.status, ReadStatus::Read);
        EXPECT_THAT(reading.shape->states, ElementsAre("active", "suspended"));
        EXPECT_THAT(reading.numbers, ElementsAre(61234, 0, 5004321, 0));
    }
}

TEST_F(ChannelSourcesTest, ReadsFrequencies) {
    const Reading processor = read("cpufreq:/sys/devices/system/cpu/cpufreq/policy0/stats");
    EXPECT_THAT(processor.shape->states, ElementsAre("600000", "1200000", "1800000"));
    EXPECT_THAT(processor.numbers, ElementsAre(123450, 15, 6780, 14, 900, 7));
    const Reading bus = read("devfreq:/sys/class/devfreq/17000010.devfreq_mif");
    EXPECT_THAT(bus.numbers, ElementsAre(5123401, 43, 23110, 37, 8800, 21));
}

TEST_F(ChannelSourcesTest, ReadsHistograms) {
    const Reading trace =
        read("tracefs_hist:/sys/kernel/tracing/events/synthetic/wakeup_latency/hist");
    EXPECT_THAT(trace.shape->bounds, ElementsAre(std::pair(10, 19), std::pair(30, 39)));
    EXPECT_THAT(trace.numbers, ElementsAre(41, 2));
    tree_.write("latency", "0 10 5\n10 20 0\n");
    EXPECT_THAT(make("histogram:/latency", own_)->read(now_).numbers, ElementsAre(5, 0));
}

TEST_F(ChannelSourcesTest, PathsMayHoldColons) {
    tree_.write("0000:00:1f.3/stat", "1 2 3\n");
    EXPECT_THAT(make("field:/0000:00:1f.3/stat:1:3", own_)->read(now_).numbers, ElementsAre(3));
}

TEST_F(ChannelSourcesTest, AReadingKeepsItsShapeWhileTheFileDoes) {
    tree_.write("latency", "0 10 5\n");
    const auto source = make("histogram:/latency", own_);
    const auto shape = source->read(now_).shape;
    tree_.write("latency", "0 10 6\n");
    EXPECT_EQ(source->read(now_).shape, shape);
    tree_.write("latency", "0 20 6\n");
    EXPECT_NE(source->read(now_).shape, shape);
}

TEST_F(ChannelSourcesTest, TellsWhatIsMissingFromWhatIsBroken) {
    const auto source = make("file:/counter", own_);
    EXPECT_EQ(source->read(now_).status, ReadStatus::Absent);
    tree_.write("counter", "many\n");
    const Reading broken = source->read(now_);
    EXPECT_EQ(broken.status, ReadStatus::Failed);
    EXPECT_THAT(broken.fault, HasSubstr("counter: not in the expected format"));
    EXPECT_THAT(broken.numbers, IsEmpty());
    tree_.write("counter", "7\n");
    EXPECT_EQ(source->read(now_).status, ReadStatus::Read);
}

TEST_F(ChannelSourcesTest, IdleStatesMayComeLater) {
    const auto source = make("cpuidle:/cpuidle", own_);
    EXPECT_EQ(source->read(now_).status, ReadStatus::Absent);
    tree_.write("cpuidle/state10/time", "7");
    tree_.write("cpuidle/state10/usage", "1");
    tree_.write("cpuidle/state9/name", "POLL\n");
    tree_.write("cpuidle/state9/time", "5");
    tree_.write("cpuidle/state9/usage", "2");
    const Reading reading = source->read(now_);
    EXPECT_THAT(reading.shape->states, ElementsAre("POLL", "state10"));
    EXPECT_THAT(reading.numbers, ElementsAre(5, 2, 7, 1));
}

TEST_F(ChannelSourcesTest, IdleStatesOfOneNameAreOne) {
    for (const auto& [state, name] :
         {std::pair("state0", "C1"), {"state1", "C2"}, {"state2", "C1"}}) {
        const std::string directory = std::string("cpuidle/") + state;
        tree_.write(directory + "/name", name);
        tree_.write(directory + "/time", "10");
        tree_.write(directory + "/usage", "3");
    }
    const auto source = make("cpuidle:/cpuidle", own_);
    for (int i = 0; i < 2; ++i) {
        const Reading reading = source->read(now_);
        EXPECT_THAT(reading.shape->states, ElementsAre("C1", "C2"));
        EXPECT_THAT(reading.numbers, ElementsAre(20, 6, 10, 3));
    }
}

TEST_F(ChannelSourcesTest, RefusesSourcesThatMakeNoSense) {
    EXPECT_EQ(refusal("pie:/x"), "\"pie\" is no kind of source");
    EXPECT_EQ(refusal("file"), "needs a path that begins with \"/\"");
    EXPECT_EQ(refusal("file:relative"), "needs a path that begins with \"/\"");
    EXPECT_EQ(refusal("irq:"), "needs something behind the \":\"");
    EXPECT_EQ(refusal("field:/x"), "needs the form field:PATH:ROW:COLUMN");
    EXPECT_EQ(refusal("field:/x:1:"), "needs the form field:PATH:ROW:COLUMN");
    EXPECT_EQ(refusal("field:/x:1:0"), "COLUMN must be a number from 1 to 10000");
    EXPECT_EQ(refusal("field:/x:1:b"), "COLUMN must be a number from 1 to 10000");
    EXPECT_THAT(refusal("pressure:/x:most"), HasSubstr("pressure:PATH:some"));
}

class PcmSourceTest : public ChannelSourcesTest {
protected:
    void status(const std::string& state, const std::string& trigger, const std::string& stamp,
                int frames = 480, int owner = 10) {
        tree_.write("sub0/status",
                    "state: " + state + "\nowner_pid   : " + std::to_string(owner) +
                        "\ntrigger_time: " + trigger + ".000000000\ntstamp      : " + stamp +
                        ".000000000\nhw_ptr      : " + std::to_string(frames) + "\n");
    }
    // What the stream's counter says next.
    std::uint64_t count(ChannelSource& source) {
        const Reading reading = readAfter(source, 1s);
        EXPECT_EQ(reading.status, ReadStatus::Read) << reading.fault;
        return reading.numbers.at(0);
    }
    Reading readAfter(ChannelSource& source, std::chrono::seconds time) {
        now_ += time;
        return source.read(now_);
    }
    static std::uint64_t residency(const Reading& reading, const std::string& state) {
        return reading.numbers.at(2 * place(reading, state));
    }
    static std::uint64_t transitions(const Reading& reading, const std::string& state) {
        return reading.numbers.at(2 * place(reading, state) + 1);
    }
    static std::size_t place(const Reading& reading, const std::string& state) {
        const auto& states = reading.shape->states;
        return static_cast<std::size_t>(std::find(states.begin(), states.end(), state) -
                                        states.begin());
    }
};

TEST_F(PcmSourceTest, ReadsTheFrames) {
    EXPECT_THAT(read("alsa_frames:/proc/asound/card0/pcm0p/sub0").numbers, ElementsAre(360112));
    EXPECT_THAT(read("alsa_frames:/proc/asound/card0/pcm0c/sub0").numbers, ElementsAre(0));
}

TEST_F(PcmSourceTest, FramesStayWhenTheStreamIsClosed) {
    const auto source = make("alsa_frames:/sub0", own_);
    status("RUNNING", "500", "504", 1000);
    EXPECT_EQ(count(*source), 1000U);
    status("RUNNING", "500", "505", 1480);
    EXPECT_EQ(count(*source), 1480U);
    tree_.write("sub0/status", "closed\n");
    EXPECT_EQ(count(*source), 1480U);
    status("PREPARED", "0", "0", 0);
    EXPECT_EQ(count(*source), 1480U);
    status("RUNNING", "600", "601", 2000);
    EXPECT_EQ(count(*source), 3480U);
}

TEST_F(PcmSourceTest, FramesOfARestartedStreamAddUp) {
    const auto source = make("alsa_frames:/sub0", own_);
    status("RUNNING", "500", "504", 1000);
    EXPECT_EQ(count(*source), 1000U);
    status("RUNNING", "510", "511", 480); // It went back.
    EXPECT_EQ(count(*source), 1480U);
    status("XRUN", "512", "512", 500);
    EXPECT_EQ(count(*source), 1500U);
    status("RUNNING", "520", "521", 700); // No xrun goes on.
    EXPECT_EQ(count(*source), 2200U);
    status("RUNNING", "530", "531", 800, 11); // Somebody else's.
    EXPECT_EQ(count(*source), 3000U);
}

TEST_F(PcmSourceTest, FramesOfAPausedStreamGoOn) {
    const auto source = make("alsa_frames:/sub0", own_);
    status("RUNNING", "500", "504", 1000);
    EXPECT_EQ(count(*source), 1000U);
    status("PAUSED", "505", "506", 1200);
    EXPECT_EQ(count(*source), 1200U);
    status("RUNNING", "507", "508", 1300);
    EXPECT_EQ(count(*source), 1300U);
    status("RUNNING", "510", "511", 1400); // Paused between two reads.
    EXPECT_EQ(count(*source), 1400U);
}

TEST_F(PcmSourceTest, AReadThatFailsLosesNothing) {
    const auto source = make("alsa_frames:/sub0", own_);
    status("RUNNING", "500", "504", 1000);
    EXPECT_EQ(count(*source), 1000U);
    tree_.write("sub0/status", "?\n");
    EXPECT_EQ(readAfter(*source, 1s).status, ReadStatus::Failed);
    status("RUNNING", "500", "506", 1480);
    EXPECT_EQ(count(*source), 1480U);
}

TEST_F(PcmSourceTest, AStreamWhoseDeviceHasGoneBeginsAnew) {
    for (const char* kind : {"alsa_frames", "alsa_xruns", "alsa_restarts"}) {
        const auto source = make(std::string(kind) + ":/sub0", own_);
        status("RUNNING", "500", "504", 1000);
        const std::uint64_t atFirst = count(*source);
        status("XRUN", "505", "506", 1480);
        count(*source);
        status("RUNNING", "507", "508", 480);
        count(*source);
        status("RUNNING", "509", "510", 240);
        EXPECT_GT(count(*source), atFirst) << kind;
        std::filesystem::remove(tree_ / "sub0/status");
        EXPECT_EQ(readAfter(*source, 1s).status, ReadStatus::Absent);
        status("RUNNING", "600", "601", 1000);
        EXPECT_EQ(count(*source), atFirst) << kind;
    }
}

TEST_F(PcmSourceTest, AStateLastsFromReadToRead) {
    tree_.write("sub0/status", "closed\n");
    const auto source = make("alsa_states:/sub0", own_);
    source->read(now_);
    status("PREPARED", "0", "0");
    readAfter(*source, 3s);
    const Reading reading = readAfter(*source, 2s);
    EXPECT_EQ(residency(reading, "CLOSED"), 3'000'000U);
    EXPECT_EQ(residency(reading, "PREPARED"), 2'000'000U);
    EXPECT_EQ(transitions(reading, "PREPARED"), 1U);
}

TEST_F(PcmSourceTest, StatesBeginAnewWhenTheDeviceHasGone) {
    status("PREPARED", "0", "0");
    const auto source = make("alsa_states:/sub0", own_);
    source->read(now_);
    EXPECT_EQ(residency(readAfter(*source, 2s), "PREPARED"), 2'000'000U);
    std::filesystem::remove(tree_ / "sub0/status");
    EXPECT_EQ(readAfter(*source, 1s).status, ReadStatus::Absent);
    status("PREPARED", "0", "0");
    EXPECT_EQ(residency(readAfter(*source, 1s), "PREPARED"), 0U);
    EXPECT_EQ(residency(readAfter(*source, 3s), "PREPARED"), 3'000'000U);
}

TEST_F(PcmSourceTest, ARunningStreamTellsSinceWhen) {
    tree_.write("sub0/status", "closed\n");
    const auto source = make("alsa_states:/sub0", own_);
    source->read(now_);
    status("RUNNING", "500", "504");
    const Reading reading = readAfter(*source, 10s);
    EXPECT_EQ(residency(reading, "RUNNING"), 4'000'000U);
    EXPECT_EQ(residency(reading, "CLOSED"), 6'000'000U);
}

TEST_F(PcmSourceTest, CountsTheXrunsThatAreSeen) {
    status("RUNNING", "500", "504");
    const auto source = make("alsa_xruns:/sub0", own_);
    EXPECT_THAT(source->read(now_).numbers, ElementsAre(0));
    status("XRUN", "505", "506");
    EXPECT_THAT(readAfter(*source, 1s).numbers, ElementsAre(1));
    EXPECT_THAT(readAfter(*source, 1s).numbers, ElementsAre(1));
}

TEST_F(PcmSourceTest, CountsWhatItsOwnerTriggersAgain) {
    status("RUNNING", "500", "504");
    const auto source = make("alsa_restarts:/sub0", own_);
    EXPECT_THAT(source->read(now_).numbers, ElementsAre(0));
    EXPECT_THAT(readAfter(*source, 1s).numbers, ElementsAre(0));
    status("RUNNING", "506", "507");
    EXPECT_THAT(readAfter(*source, 1s).numbers, ElementsAre(1));
}

TEST_F(PcmSourceTest, NothingElseIsARestart) {
    const auto source = make("alsa_restarts:/sub0", own_);
    status("RUNNING", "500", "504");
    count(*source);
    status("PAUSED", "505", "506");
    EXPECT_EQ(count(*source), 0U);
    status("RUNNING", "507", "508", 480, 11); // Somebody else's.
    EXPECT_EQ(count(*source), 0U);
    status("RUNNING", "509", "510", 480, 11);
    EXPECT_EQ(count(*source), 1U);
}

TEST_F(PcmSourceTest, EachXrunCountsOnceAndTheFirstLookIsNone) {
    const auto source = make("alsa_xruns:/sub0", own_);
    status("XRUN", "500", "504");
    EXPECT_EQ(count(*source), 0U);
    for (const std::uint64_t expected : {1U, 2U}) {
        status("RUNNING", "505", "506");
        count(*source);
        status("XRUN", "507", "508");
        EXPECT_EQ(count(*source), expected);
    }
}

TEST_F(PcmSourceTest, ARestartedStreamHasRunAllTheTime) {
    status("RUNNING", "500", "504");
    const auto source = make("alsa_states:/sub0", own_);
    source->read(now_);
    status("RUNNING", "506", "507");
    const Reading reading = readAfter(*source, 3s);
    EXPECT_EQ(residency(reading, "RUNNING"), 3'000'000U);
    EXPECT_EQ(transitions(reading, "RUNNING"), 1U);
}

TEST_F(PcmSourceTest, NoStreamHasRunLongerThanTheTimeBetweenTwoReads) {
    tree_.write("sub0/status", "closed\n");
    const auto source = make("alsa_states:/sub0", own_);
    source->read(now_);
    status("RUNNING", "500", "600");
    const Reading late = readAfter(*source, 2s);
    EXPECT_EQ(residency(late, "RUNNING"), 2'000'000U);
    EXPECT_EQ(residency(late, "CLOSED"), 0U);
    status("PAUSED", "601", "602");
    readAfter(*source, 0s);
    status("RUNNING", "700", "600"); // Its clock went back.
    EXPECT_EQ(residency(readAfter(*source, 5s), "PAUSED"), 5'000'000U);
}

TEST_F(PcmSourceTest, AStateThatNobodyKnowsHasNoResidency) {
    status("PREPARED", "0", "0");
    const auto source = make("alsa_states:/sub0", own_);
    source->read(now_);
    status("DREAMING", "0", "0");
    EXPECT_EQ(residency(readAfter(*source, 2s), "PREPARED"), 2'000'000U);
    EXPECT_EQ(residency(readAfter(*source, 2s), "PREPARED"), 2'000'000U);
}

} // namespace
} // namespace halyard::linux_
