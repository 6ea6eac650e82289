#include "GlitchFinder.h"

#include <gtest/gtest.h>
#include <vector>

#include "CycleTesting.h"

namespace halyard::pipewire {
namespace {

constexpr StreamKey kStream = 7;
constexpr ObjectId kNode = 47;
constexpr ObjectId kOther = 48;
constexpr Nanoseconds kStart = 1'000'000'000'000;
constexpr Nanoseconds kSecond = 1'000'000'000;

class GlitchFinderTest : public ::testing::Test {
protected:
    struct Told {
        Episode episode;
        bool over = false;
    };

    void SetUp() override {
        finder_.tell = [this](const Episode& episode, bool over) {
            told_.push_back({episode, over});
        };
        finder_.begin(kStream, kNode, kStart - 1);
        good(5);
    }
    void good(int cycles) {
        for (int i = 0; i < cycles; ++i) {
            finder_.take(graph_.cycle({{kNode}, {kOther}}));
        }
    }
    void missed(int cycles, Progress progress = Progress::Triggered) {
        for (int i = 0; i < cycles; ++i) {
            finder_.take(graph_.cycle({{kNode, progress}, {kOther}}));
        }
    }
    void due(Nanoseconds later = 0) { finder_.due(graph_.now() + later); }

    TestGraph graph_{kStart};
    GlitchFinder finder_;
    std::vector<Told> told_;
};

TEST_F(GlitchFinderTest, AStreamThatIsAlwaysDoneHasNoGlitch) {
    good(1000);
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, MissedCyclesAreCountedFromTheFirstOnesSignal) {
    const Nanoseconds first = graph_.now();
    missed(3);
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    const Episode& episode = told_[0].episode;
    EXPECT_TRUE(told_[0].over);
    EXPECT_EQ(episode.stream, kStream);
    EXPECT_EQ(episode.driver, TestGraph::kDriver);
    EXPECT_EQ(episode.cycles, 3U);
    EXPECT_EQ(episode.missing, 3 * kLength);
    EXPECT_EQ(episode.cycleLength, kLength);
    EXPECT_EQ(episode.start, first + 80'000);
    EXPECT_EQ(episode.end, episode.start + 3 * kLength);
    EXPECT_EQ(episode.lateCycles, 0U);
    EXPECT_FALSE(episode.inferred);
}

TEST_F(GlitchFinderTest, ACycleThatIsToldTwiceCountsOnce) {
    Cycle cycle = graph_.cycle({{kNode, Progress::Awake}});
    Cycle before = cycle;
    before.driver.signal = before.driver.previousSignal;
    finder_.take(before);
    finder_.take(cycle);
    finder_.take(cycle);
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 1U);
}

TEST_F(GlitchFinderTest, TwoGlitchesWithin200MillisecondsAreOne) {
    missed(1);
    good(9); // 180 ms
    missed(1);
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 2U);
    EXPECT_EQ(told_[0].episode.missing, 2 * kLength);
}

TEST_F(GlitchFinderTest, TwoGlitchesFartherApartAreTwoInOnePortion) {
    missed(1);
    good(10); // 200 ms
    missed(1);
    good(12);
    due();
    EXPECT_EQ(told_.size(), 2U);
}

TEST_F(GlitchFinderTest, WhatAnEpisodeIsWaitsForRecordsThatComeLate) {
    missed(1);
    due(GlitchFinder::kPatience - kMillisecond);
    EXPECT_TRUE(told_.empty());
    due(GlitchFinder::kPatience + kLength);
    EXPECT_EQ(told_.size(), 1U);
}

TEST_F(GlitchFinderTest, ALongOneIsToldAfterTenSecondsAndAtItsEnd) {
    missed(501);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_FALSE(told_[0].over);
    EXPECT_EQ(told_[0].episode.held, told_[0].episode.end - told_[0].episode.start);
    missed(100);
    due();
    EXPECT_EQ(told_.size(), 1U);
    good(12);
    due();
    ASSERT_EQ(told_.size(), 2U);
    EXPECT_TRUE(told_[1].over);
    EXPECT_EQ(told_[1].episode.start, told_[0].episode.start);
    EXPECT_EQ(told_[1].episode.cycles, 601U);
}

TEST_F(GlitchFinderTest, TheStartOfAStreamIsNoGlitch) {
    finder_.begin(8, 60, graph_.now());
    for (int i = 0; i < 5; ++i) {
        finder_.take(graph_.cycle({{kNode}, {60, Progress::Triggered}}));
    }
    finder_.take(graph_.cycle({{kNode}, {60}}));
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, AMoveToAnotherDeviceIsNoGlitch) {
    for (int i = 0; i < 3; ++i) {
        Cycle cycle = graph_.cycle({{kNode, Progress::Triggered}});
        cycle.driver.id = 30;
        finder_.take(cycle);
    }
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, AMoveInTheMiddleOfAGlitchKeepsWhatHeldItUp) {
    missed(4);
    for (int i = 0; i < 15; ++i) {
        Cycle cycle = graph_.cycle({{kNode}});
        cycle.driver.id = 30;
        finder_.take(cycle);
    }
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 4U);
    EXPECT_EQ(told_[0].episode.held, 4 * kLength);
}

TEST_F(GlitchFinderTest, TheLastCyclesBeforeAStopAreNoGlitch) {
    missed(2);
    finder_.end(kStream, graph_.now());
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, TheLastLongCycleBeforeAStopIsNoGlitch) {
    graph_ = TestGraph(graph_.now());
    for (int i = 0; i < 6; ++i) {
        Cycle cycle = graph_.cycle({{kNode, i < 5 ? Progress::Finished : Progress::Triggered}});
        cycle.frames = 8192; // 171 ms
        cycle.nextClock = 0;
        cycle.clock = cycle.driver.signal + (i < 5 ? 0 : cycle.length());
        finder_.take(cycle);
        graph_.skip(cycle.length() - kLength);
    }
    finder_.end(kStream, graph_.now());
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, TheLastCyclesOfAProgramThatDiedAreOne) {
    missed(2);
    finder_.end(kStream, graph_.now(), true);
    due(10 * kSecond);
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 2U);
}

TEST_F(GlitchFinderTest, AGlitchBeforeAStopIsToldAfterIt) {
    missed(10); // longer than an end takes
    finder_.end(kStream, graph_.now());
    due(10 * kSecond);
    EXPECT_EQ(told_.size(), 1U);
}

TEST_F(GlitchFinderTest, RecordsOfAnEndedStreamStillCount) {
    const Nanoseconds stop = graph_.now() + 20 * kLength;
    finder_.end(kStream, stop);
    EXPECT_TRUE(finder_.pending(kStream, stop));
    missed(6);
    good(16);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_FALSE(finder_.pending(kStream, stop));
}

TEST_F(GlitchFinderTest, RecordsAreWaitedForAfterTheLastStreamStopped) {
    const Nanoseconds stop = graph_.now() + 10 * kLength;
    EXPECT_TRUE(finder_.waiting(stop));
    finder_.end(kStream, stop);
    missed(8);
    EXPECT_TRUE(finder_.waiting(stop + 2 * GlitchFinder::kPatience)); // to be told
    due(2 * GlitchFinder::kPatience);
    EXPECT_EQ(told_.size(), 1U);
    EXPECT_TRUE(finder_.waiting(stop + GlitchFinder::kPatience - 1));
    EXPECT_FALSE(finder_.waiting(stop + GlitchFinder::kPatience));
}

TEST_F(GlitchFinderTest, ANodeIDThatIsUsedAgainIsAnotherStreams) {
    finder_.end(kStream, graph_.now());
    const Nanoseconds again = graph_.now() + 4 * kLength;
    finder_.begin(8, kNode, again);
    good(5);
    missed(1);
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.stream, 8);
}

TEST_F(GlitchFinderTest, WhatHeldAStreamUpIsMeasuredUntilItWakesAgain) {
    missed(1, Progress::Awake);
    missed(1, Progress::Triggered);
    const Nanoseconds signal = graph_.now() + 80'000;
    finder_.take(graph_.cycle({{kNode, Progress::Finished, 8 * kMillisecond}, {kOther}}));
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    const Episode& episode = told_[0].episode;
    EXPECT_EQ(episode.held, signal + 8 * kMillisecond - episode.start);
    // It began 50 us after the first signal.
    EXPECT_NEAR(episode.busyCycles, (40 + 8 - 0.05) / 20, 1e-9);
    EXPECT_NEAR(episode.othersCycles, 0.1 / 20, 1e-9);
}

TEST_F(GlitchFinderTest, ALateDriverIsEverybodysGlitch) {
    finder_.begin(8, kOther, graph_.now());
    good(2);
    const Nanoseconds begin = graph_.now();
    // It slept for 200 ms, and wakes for all those cycles at once.
    for (int i = 0; i < 10; ++i) {
        finder_.take(graph_.cycle({{kNode, Progress::Triggered}, {kOther}},
                                  200 * kMillisecond - i * (kLength - 100'000)));
    }
    good(15);
    due();
    ASSERT_EQ(told_.size(), 2U);
    for (const Told& told : told_) {
        EXPECT_EQ(told.episode.cycles, 10U);
        EXPECT_EQ(told.episode.lateCycles, 10U);
        EXPECT_EQ(told.episode.start, begin);
        EXPECT_EQ(told.episode.lateness, 200 * kMillisecond);
    }
}

TEST_F(GlitchFinderTest, CyclesThatALateDriverPassesOverAreMissed) {
    const Nanoseconds begin = graph_.now();
    graph_.skip(2 * kLength);
    finder_.take(graph_.cycle({{kNode, Progress::Triggered}}, 60 * kMillisecond));
    good(15);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 3U);
    EXPECT_EQ(told_[0].episode.lateCycles, 3U);
    EXPECT_EQ(told_[0].episode.start, begin);
    EXPECT_EQ(told_[0].episode.end, begin + 3 * kLength);
}

TEST_F(GlitchFinderTest, ACycleThatALateDriverTellsTwiceCountsOnce) {
    for (int i = 0; i < 3; ++i) {
        const Nanoseconds late = 60 * kMillisecond - i * (kLength - 100'000);
        Cycle cycle = graph_.cycle({{kNode, Progress::Triggered}}, late);
        finder_.take(cycle);
        cycle.driver.signal += 10'000; // done meanwhile, and the clock stays
        cycle.clock -= kLength;
        cycle.nextClock -= kLength;
        cycle.followers[0].progress = Progress::Finished;
        finder_.take(cycle);
    }
    good(15);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 3U);
    EXPECT_EQ(told_[0].episode.missing, 3 * kLength);
}

TEST_F(GlitchFinderTest, ADriverThatIsALittleLateHurtsNobodyWhoIsDone) {
    finder_.take(graph_.cycle({{kNode}, {kOther}}, 25 * kMillisecond));
    good(15);
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, ALongerCycleIsNoLateDriver) {
    Cycle cycle = graph_.cycle({{kNode}, {kOther}});
    cycle.frames = 64; // what was asked for, while the old length still runs
    finder_.take(cycle);
    good(12);
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, WhatTheServerCountsWithoutARecordIsACycle) {
    for (std::uint32_t count : {3U, 3U, 4U, 4U}) {
        Cycle cycle = graph_.cycle({{kNode}});
        cycle.followers[0].missedSoFar = count;
        finder_.take(cycle);
    }
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 1U);
}

TEST_F(GlitchFinderTest, ANodeThatTakesNoPartMissesNothing) {
    finder_.take(graph_.cycle({{kNode, Progress::Inactive}, {kOther}}));
    finder_.take(graph_.cycle({{kNode, Progress::NotTriggered}, {kOther}}));
    good(12);
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

TEST_F(GlitchFinderTest, ANodeThatWaitsForAnotherMissesWithIt) {
    finder_.take(graph_.cycle({{kNode, Progress::NotTriggered}, {kOther, Progress::Awake}}));
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_TRUE(told_[0].episode.waitedForOthers);
    EXPECT_EQ(told_[0].episode.held, 0);
}

TEST_F(GlitchFinderTest, WhatIsInferredIsSaidToBe) {
    finder_.infer(kStream, graph_.now(), kLength);
    good(12);
    due();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_TRUE(told_[0].episode.inferred);
    EXPECT_EQ(told_[0].episode.cycles, 1U);
}

TEST_F(GlitchFinderTest, AFlushTellsWhatIsOpen) {
    missed(8);
    finder_.flush();
    ASSERT_EQ(told_.size(), 1U);
    EXPECT_EQ(told_[0].episode.cycles, 8U);
    EXPECT_EQ(told_[0].episode.held, told_[0].episode.end - told_[0].episode.start);
    EXPECT_EQ(finder_.episode(kStream), nullptr);
}

TEST_F(GlitchFinderTest, StreamsBeyondTheBoundAreIgnoredAndCounted) {
    GlitchFinder finder;
    for (std::size_t i = 0; i < GlitchFinder::kMaxStreams; ++i) {
        const auto key = static_cast<StreamKey>(i + 1);
        ASSERT_TRUE(finder.begin(key, static_cast<ObjectId>(i), kStart));
    }
    EXPECT_FALSE(finder.begin(1'000'000, 9, kStart));
    EXPECT_EQ(finder.ignoredStreams(), 1U);
    EXPECT_TRUE(finder.begin(1, 0, kStart));
    finder.forget(1);
    EXPECT_TRUE(finder.begin(1'000'000, 9, kStart));
}

TEST_F(GlitchFinderTest, AForgottenStreamsEpisodeIsForgotten) {
    missed(3);
    finder_.forget(kStream);
    good(12);
    due(10 * kSecond);
    EXPECT_TRUE(told_.empty());
}

} // namespace
} // namespace halyard::pipewire
