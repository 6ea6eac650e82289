#include "GlitchCause.h"

#include <gtest/gtest.h>
#include <string>

namespace halyard::pipewire {
namespace {

constexpr Nanoseconds kMillisecond = 1'000'000;

// A stream that was held up for 50 ms, and whose thread did nothing unusual.
CauseFacts held() {
    CauseFacts facts;
    facts.cycleSeconds = 0.02;
    facts.missingSeconds = 0.04;
    facts.heldSeconds = 0.05;
    facts.thread = {.cpu = Range{}, .delay = Range{}, .majorFaults = Range{}};
    facts.othersCpuSeconds = 0;
    return facts;
}

std::string causeName(const CauseFacts& facts) {
    return nameOf(causeOf(facts));
}

TEST(GlitchCauseTest, AStoppedProcessComesBeforeAllElse) {
    CauseFacts facts = held();
    facts.stopped = facts.frozen = facts.gone = true;
    facts.asleepSeconds = facts.lateShare = 1;
    EXPECT_EQ(causeName(facts), "process_stopped");
    facts.stopped = false;
    EXPECT_EQ(causeName(facts), "process_frozen");
    facts.frozen = false;
    EXPECT_EQ(causeName(facts), "process_gone");
    facts.gone = false;
    EXPECT_EQ(causeName(facts), "machine_paused");
    facts.asleepSeconds = 0;
    EXPECT_EQ(causeName(facts), "driver_late");
}

TEST(GlitchCauseTest, TimeThatStoodStillForAllIsAPausedMachine) {
    CauseFacts facts = held();
    facts.lateShare = 1;
    facts.latenessSeconds = 0.5;
    facts.stoodStillSeconds = 0.45;
    EXPECT_EQ(causeName(facts), "machine_paused");
    facts.stoodStillSeconds = 0.1; // we were slow as well
    EXPECT_EQ(causeName(facts), "driver_late");
}

TEST(GlitchCauseTest, NodesThatTogetherTakeLongerThanACycleOverloadTheGraph) {
    CauseFacts facts = held();
    facts.thread.cpu = Range{0.02, 0.03};
    facts.thread.delay = Range{0.02, 0.03};
    facts.ownCycles = 1.2; // of which it ran half
    facts.othersCycles = 0.7;
    facts.largestOther = 0.7;
    facts.othersCpuSeconds = 0.03;
    EXPECT_EQ(causeName(facts), "graph_overloaded");
    facts.largestOther = 0.95; // one alone took it
    EXPECT_EQ(causeName(facts), "unknown");
}

TEST(GlitchCauseTest, WorkOfSeveralCyclesInARowIsNotThatOfOne) {
    CauseFacts facts = held();
    facts.missingSeconds = 0.1; // five cycles, of each of which it worked 12 ms
    facts.heldSeconds = 0.16;
    facts.thread.cpu = Range{0.06, 0.06};
    facts.thread.delay = Range{0.09, 0.09};
    facts.ownCycles = 2.8;
    facts.othersCycles = 0.8;
    facts.largestOther = 0.5;
    facts.othersCpuSeconds = 0.1;
    EXPECT_EQ(causeName(facts), "graph_overloaded");
    facts.thread.cpu = Range{0.11, 0.11}; // more than a cycle in each: too slow by itself
    facts.thread.delay = Range{};
    EXPECT_EQ(causeName(facts), "client_slow");
}

TEST(GlitchCauseTest, OthersThatWereOnlyPreemptedDoNotOverloadTheGraph) {
    CauseFacts facts = held();
    facts.thread.delay = Range{0.045, 0.05};
    facts.othersCycles = 1.1;
    facts.largestOther = 0.6;
    facts.othersCpuSeconds = 0.001;
    EXPECT_EQ(causeName(facts), "processor_wait");
}

TEST(GlitchCauseTest, AThreadThatWaitedForAProcessorWasDeniedOne) {
    CauseFacts facts = held();
    facts.thread.delay = Range{0.04, 0.05};
    EXPECT_EQ(causeName(facts), "processor_wait");
}

TEST(GlitchCauseTest, AThreadThatRanWasSlow) {
    CauseFacts facts = held();
    facts.thread.cpu = Range{0.045, 0.05};
    facts.ownCycles = 2.4;
    EXPECT_EQ(causeName(facts), "client_slow");
}

TEST(GlitchCauseTest, AThreadThatDidNeitherWasBlocked) {
    EXPECT_EQ(causeName(held()), "client_blocked");
}

TEST(GlitchCauseTest, ABlockedThreadThatFaultedWaitedForMemory) {
    CauseFacts facts = held();
    facts.thread.majorFaults = Range{3, 3};
    EXPECT_EQ(causeName(facts), "memory");
}

TEST(GlitchCauseTest, FaultsOfAThreadThatRanAreNoReason) {
    CauseFacts facts = held();
    facts.thread.cpu = Range{0.045, 0.05};
    facts.thread.majorFaults = Range{3, 3};
    EXPECT_EQ(causeName(facts), "client_slow");
}

TEST(GlitchCauseTest, WhatIsNotCertainIsUnknown) {
    CauseFacts facts = held();
    facts.thread.cpu = Range{0.01, 0.03}; // may have run most of it, or little
    EXPECT_EQ(causeName(facts), "unknown");
    facts = held();
    facts.thread.cpu = Range{0.02, 0.02};
    facts.thread.delay = Range{0.015, 0.015};
    EXPECT_EQ(causeName(facts), "unknown");
}

TEST(GlitchCauseTest, AShortSilenceOfAThreadThatHadNotBegunIsNotItsFault) {
    CauseFacts facts = held();
    facts.heldSeconds = 0.003;
    EXPECT_EQ(causeName(facts), "unknown");
    facts.woke = true;
    EXPECT_EQ(causeName(facts), "client_blocked");
}

TEST(GlitchCauseTest, WhatWasNotMeasuredIsUnknown) {
    CauseFacts facts = held();
    facts.thread = {};
    EXPECT_EQ(causeName(facts), "unknown");
    facts = held();
    facts.heldSeconds = 0;
    EXPECT_EQ(causeName(facts), "unknown");
}

// A thread that runs 1 ms of each 50, and once 11.
History<ThreadSample> workingThread() {
    History<ThreadSample> history;
    Nanoseconds cpu = 0;
    for (int i = 0; i <= 40; ++i) {
        cpu += (i == 20 ? 11 : 1) * kMillisecond;
        history.add({.at = i * 50 * kMillisecond, .cpu = cpu, .delay = 0, .majorFaults = 0});
    }
    return history;
}

TEST(GlitchCauseTest, WhatIsUsualIsNotMovedByAGlitchNowAndThen) {
    const UsualRates usual = usualRates(workingThread(), 2000 * kMillisecond);
    EXPECT_NEAR(usual.cpu.least, 0.02, 1e-9);
    EXPECT_NEAR(usual.cpu.most, 0.02, 1e-9);
    EXPECT_EQ(usual.majorFaults.most, 0);
}

TEST(GlitchCauseTest, ExcessIsWhatGoesBeyondTheUsual) {
    const UsualRates usual{.cpu = {0.02, 0.06}, .delay = {}, .majorFaults = {}};
    const ThreadSample before{.at = 0, .cpu = 0, .delay = 0, .majorFaults = 4};
    const ThreadSample after{.at = 100 * kMillisecond,
                             .cpu = 52 * kMillisecond,
                             .delay = 3 * kMillisecond,
                             .majorFaults = 6};
    const ThreadExcess excess = excessOf(usual, before, after);
    EXPECT_NEAR(excess.cpu->least, 0.046, 1e-9);
    EXPECT_NEAR(excess.cpu->most, 0.050, 1e-9);
    EXPECT_NEAR(excess.delay->least, 0.003, 1e-9);
    EXPECT_EQ(excess.majorFaults->least, 2);
}

TEST(GlitchCauseTest, AWaitThatIsNotOverCountsUpToNow) {
    ThreadSample last;
    const auto look = [&](Nanoseconds at, char state, Nanoseconds cpu, Nanoseconds delay) {
        ThreadSample sample{.at = at, .cpu = cpu, .delay = delay, .state = state};
        countWaiting(sample, last);
        return *sample.delay;
    };
    EXPECT_EQ(look(100, 'S', 5, 7), 7);
    EXPECT_EQ(look(150, 'S', 5, 7), 7); // it sleeps
    EXPECT_EQ(look(200, 'R', 6, 7), 7);
    EXPECT_EQ(look(250, 'R', 6, 7), 57);
    EXPECT_EQ(look(900, 'R', 6, 7), 707);
    EXPECT_EQ(look(950, 'R', 8, 720), 720); // counted now
}

TEST(GlitchCauseTest, AnExcessOfWhatWasNotReadIsUnknown) {
    const ThreadExcess excess = excessOf({}, {.at = 0}, {.at = 1, .cpu = 1});
    EXPECT_FALSE(excess.cpu);
    EXPECT_FALSE(excess.delay);
}

} // namespace
} // namespace halyard::pipewire
