// Streams whose direction and devices are what they are linked to.

#include <gtest/gtest.h>

#include "StreamTrackerTesting.h"

namespace halyard::pipewire {
namespace {

using StreamTrackerJackTest = StreamTrackerTest;

TEST_F(StreamTrackerJackTest, AJackProgramHasNoSessionUntilItIsLinkedToADevice) {
    jack();
    settle();
    EXPECT_TRUE(sink_.lines.empty());
    link(30, kStream, kSpeaker);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 0", "playback start", "volume 1 playing"}));
    EXPECT_EQ(sink_.last().contents.get<Names>("active_devices"), (Names{"out.speaker"}));
}

TEST_F(StreamTrackerJackTest, AJackProgramThatLosesItsDeviceStopsAndStartsAgain) {
    jack();
    link(30, kStream, kSpeaker);
    settle();
    sink_.takeLines();
    remove(30);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop"}));
    link(31, kStream, kSpeaker);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"playback start", "volume 1 playing"}));
}

TEST_F(StreamTrackerJackTest, AJackProgramThatRunsUnlinkedIsNoRun) {
    jack();
    link(30, kStream, kSpeaker);
    settle();
    remove(30);
    settle();
    sink_.takeLines();
    state(NodeState::Stopped);
    state(NodeState::Running);
    settle();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerJackTest, AJackProgramLinkedToAMicrophoneAloneRecords) {
    microphone();
    jack();
    link(30, kMicrophone, kStream);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 0", "record start", "volume 1 playing"}));
}

TEST_F(StreamTrackerJackTest, AJackProgramOfBothDirectionsPlaysOnAllItsDevices) {
    microphone();
    jack();
    link(30, kMicrophone, kStream);
    link(31, kStream, kSpeaker);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 0", "playback start", "volume 1 playing"}));
    EXPECT_EQ(sink_.last().contents.get<Names>("active_devices"),
              (Names{"in.microphone", "out.speaker"}));
}

TEST_F(StreamTrackerJackTest, AJackProgramThatBeginsToPlayBeginsAnotherSession) {
    microphone();
    jack();
    link(30, kMicrophone, kStream);
    settle();
    sink_.takeLines();
    link(31, kStream, kSpeaker);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "record stop", "close 1000",
                                        "open 1001 0", "playback start", "volume 1 playing"}));
}

TEST_F(StreamTrackerJackTest, ProgramsThatFeedEachOtherAllPlay) {
    jack(kStream);
    jack(21);
    link(30, kStream, 21);
    link(31, 21, kSpeaker);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 0", "playback start", "volume 1 playing",
                                        "open 1001 0", "playback start", "volume 1 playing"}));
    EXPECT_EQ(sink_.messages.front().contents.get<Names>("active_devices"), (Names{"out.speaker"}));
}

TEST_F(StreamTrackerJackTest, AJackProgramThatEndsClosesItsSession) {
    jack();
    link(30, kStream, kSpeaker);
    settle();
    sink_.takeLines();
    remove(30);
    remove(kStream);
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1000"}));
}

} // namespace
} // namespace halyard::pipewire
