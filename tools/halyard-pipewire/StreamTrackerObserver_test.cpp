// What the tracker tells of streams that run, and how it waits for what is known of
// their end.

#include <gtest/gtest.h>
#include <string>
#include <vector>

#include "StreamTrackerTesting.h"

namespace halyard::pipewire {
namespace {

class ScriptObserver final : public StreamObserver {
public:
    void runs(const StreamRun& run) override {
        lines.push_back("runs " + std::to_string(run.key) + " on " + run.device);
        last = run;
    }
    void routed(StreamKey stream, const std::string& device) override {
        lines.push_back("routed " + std::to_string(stream) + " to " + device);
    }
    void stopped(StreamKey stream) override {
        lines.push_back("stopped " + std::to_string(stream));
    }
    bool gone(StreamKey stream) override {
        lines.push_back("gone " + std::to_string(stream));
        return waits;
    }
    void settleAll() override { lines.push_back("settle all"); }
    StreamEnd closing(StreamKey stream) override {
        lines.push_back("closing " + std::to_string(stream));
        return end;
    }

    std::vector<std::string> takeLines() { return std::exchange(lines, {}); }

    std::vector<std::string> lines;
    StreamRun last;
    StreamEnd end;
    bool waits = true;
};

class StreamTrackerObserverTest : public StreamTrackerTest {
protected:
    StreamTrackerObserverTest() { tracker_.observe(observer_); }

    ScriptObserver observer_;
};

TEST_F(StreamTrackerObserverTest, ARunIsToldWithItsProgramAndDevice) {
    play();
    EXPECT_EQ(observer_.takeLines(),
              (Lines{"routed 1000 to out.speaker", "runs 1000 on out.speaker"}));
    EXPECT_EQ(observer_.last.node, kStream);
    EXPECT_EQ(observer_.last.application, "Player");
    EXPECT_EQ(observer_.last.nodeName, "pw-play");
    EXPECT_EQ(observer_.last.process, 42);
    EXPECT_FALSE(observer_.last.viaServer);
}

TEST_F(StreamTrackerObserverTest, WhatPlaysAndCapturesRunsOnTheDeviceThatItPlaysOn) {
    microphone();
    jack();
    link(30, kMicrophone, kStream);
    link(31, kStream, kSpeaker);
    settle();
    EXPECT_EQ(observer_.lines.back(), "runs 1000 on out.speaker");
}

TEST_F(StreamTrackerObserverTest, PausesAndMovesAreTold) {
    play();
    observer_.takeLines();
    remove(30);
    remove(31);
    link(32, kStream, kHeadphones);
    settle();
    state(NodeState::Stopped);
    settle();
    state(NodeState::Running);
    settle();
    EXPECT_EQ(observer_.takeLines(), (Lines{"routed 1000 to out.headphones", "stopped 1000",
                                            "runs 1000 on out.headphones"}));
}

TEST_F(StreamTrackerObserverTest, AJackProgramWithoutADeviceHasStopped) {
    jack();
    link(30, kStream, kSpeaker);
    settle();
    observer_.takeLines();
    remove(30);
    settle();
    EXPECT_EQ(observer_.takeLines(), Lines{"stopped 1000"});
}

TEST_F(StreamTrackerObserverTest, ASessionWaitsUntilItsEndIsSettled) {
    play();
    observer_.takeLines();
    remove(kStream);
    EXPECT_EQ(observer_.takeLines(), Lines{"gone 1000"});
    EXPECT_EQ(sink_.takeLines(), Lines{"volume 1 silent"});
    tracker_.settle(1000);
    EXPECT_EQ(observer_.takeLines(), Lines{"closing 1000"});
    EXPECT_EQ(sink_.takeLines(), (Lines{"playback stop", "close 1000"}));
    tracker_.settle(1000);
    EXPECT_TRUE(sink_.lines.empty()) << "once";
}

TEST_F(StreamTrackerObserverTest, ASessionThatNobodyWaitsForEndsAtOnce) {
    play();
    sink_.takeLines();
    observer_.waits = false;
    remove(kStream);
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1000"}));
}

TEST_F(StreamTrackerObserverTest, TheLastStopSaysWhatIsKnownOfTheEnd) {
    play();
    observer_.end = {.unreported = 3, .program = "died"};
    remove(kStream);
    tracker_.settle(1000);
    EXPECT_EQ(sink_.last().contents.get<std::int64_t>("glitches_unreported"), 3);
    EXPECT_EQ(sink_.last().contents.get<std::string>("stream_program"), "died");
}

TEST_F(StreamTrackerObserverTest, AJackProgramThatBeginsToPlayIsAnotherRun) {
    microphone();
    jack();
    link(30, kMicrophone, kStream);
    settle();
    observer_.takeLines();
    link(31, kStream, kSpeaker);
    settle();
    EXPECT_EQ(observer_.takeLines(),
              (Lines{"gone 1000", "routed 1001 to out.speaker", "runs 1001 on out.speaker"}));
    tracker_.settle(1000);
    EXPECT_EQ(sink_.lines.back(), "close 1000");
}

TEST_F(StreamTrackerObserverTest, ClosingAllWaitsForNobody) {
    play();
    stream(21);
    state(NodeState::Running, 21);
    settle();
    remove(21);
    sink_.takeLines();
    observer_.takeLines();
    tracker_.closeAll();
    EXPECT_EQ(observer_.lines.front(), "settle all");
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1000",
                                        "playback stop", "close 1001"}));
}

TEST_F(StreamTrackerObserverTest, ANodeIDThatIsUsedAgainMeanwhileIsAnotherSession) {
    play();
    remove(kStream);
    play();
    EXPECT_EQ(observer_.last.key, kFirstID + 1);
    EXPECT_EQ(observer_.last.node, kStream);
    tracker_.settle(kFirstID);
    EXPECT_EQ(sink_.takeLines(), (Lines{"playback stop", "close 1000"}));
    remove(kStream);
    tracker_.settle(kFirstID + 1);
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1001"}));
}

TEST_F(StreamTrackerObserverTest, ALostConnectionEndsThoseThatWaitToo) {
    play();
    remove(kStream);
    sink_.takeLines();
    observer_.takeLines();
    tracker_.handle(Disconnected{});
    EXPECT_EQ(observer_.lines.front(), "settle all");
    EXPECT_EQ(sink_.takeLines(), (Lines{"playback stop", "close 1000"}));
    tracker_.settle(kFirstID); // says nothing any more
    EXPECT_TRUE(sink_.takeLines().empty());
}

} // namespace
} // namespace halyard::pipewire
