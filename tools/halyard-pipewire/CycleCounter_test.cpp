#include "CycleCounter.h"

#include <gtest/gtest.h>

#include "CycleTesting.h"

namespace halyard::pipewire {
namespace {

class CycleCounterTest : public ::testing::Test {
protected:
    void SetUp() override { device("out.speaker", "Audio/Sink"); }
    void device(const char* name, const char* mediaClass) {
        counter_.handle(
            NodeChanged{TestGraph::kDriver, {{"node.name", name}, {"media.class", mediaClass}}});
    }
    const DeviceCycles& only() {
        EXPECT_EQ(counter_.statistics().devices().size(), 1U);
        return counter_.statistics().devices().at(0);
    }

    TestGraph graph_{1'000'000'000'000};
    CycleCounter counter_;
};

TEST_F(CycleCounterTest, CountsCyclesAndThoseThatSomebodyMissed) {
    counter_.take(graph_.cycle({{47}, {48}}));
    counter_.take(graph_.cycle({{47}, {48, Progress::Awake}}));
    counter_.take(graph_.cycle({{47, Progress::Triggered}, {48}}));
    EXPECT_EQ(only().device, "out.speaker");
    EXPECT_TRUE(only().isSink);
    EXPECT_EQ(only().cycles, 3U);
    EXPECT_EQ(only().missed, 2U);
}

TEST_F(CycleCounterTest, ACycleThatIsToldTwiceCountsOnce) {
    const Cycle cycle = graph_.cycle({{47, Progress::Awake}});
    Cycle before = cycle;
    before.driver.signal = before.driver.previousSignal;
    counter_.take(before);
    counter_.take(cycle);
    counter_.take(cycle);
    EXPECT_EQ(only().cycles, 1U);
}

TEST_F(CycleCounterTest, MeasuresHowLongADeviceWaitedWorkedAndTook) {
    counter_.take(graph_.cycle({{47}}, 80'000)); // woke 80 us after its time, worked 1 ms
    counter_.take(graph_.cycle({{47}}, 80'000));
    CycleHistogram wait;
    CycleHistogram busy;
    CycleHistogram cycle;
    for (int i = 0; i < 2; ++i) {
        wait.add(80e-6);
        busy.add(1e-3);
    }
    cycle.add(20e-3); // there is none before the first
    EXPECT_EQ(only().wait.text(), wait.text());
    EXPECT_EQ(only().busy.text(), busy.text());
    EXPECT_EQ(only().cycle.text(), cycle.text());
}

TEST_F(CycleCounterTest, ASourceIsNoSink) {
    device("in.microphone", "Audio/Source/Virtual");
    counter_.take(graph_.cycle({{47}}));
    EXPECT_FALSE(only().isSink);
}

TEST_F(CycleCounterTest, WhatIsNoDeviceIsNotCounted) {
    counter_.handle(ObjectRemoved{TestGraph::kDriver});
    counter_.take(graph_.cycle({{47}}));
    EXPECT_TRUE(counter_.statistics().devices().empty());
}

} // namespace
} // namespace halyard::pipewire
