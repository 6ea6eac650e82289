#include "StreamTracker.h"

#include <gtest/gtest.h>

#include "StreamTrackerTesting.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {
namespace {

TEST_F(StreamTrackerTest, AStreamThatHasNotRunHasNoSession) {
    stream();
    settle();
    remove(kStream);
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, TheFirstRunOpensTheSession) {
    stream();
    state(NodeState::Running);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 7", "playback start", "volume 1 playing"}));
}

TEST_F(StreamTrackerTest, NothingIsSaidBeforeTheBurstHasSettled) {
    stream();
    state(NodeState::Running);
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, TheConfigurationNamesTheApplication) {
    stream();
    state(NodeState::Running);
    settle();
    const Contents expected{{"HostApplicationDisplayID", "Player"},
                            {"application_pid", 42},
                            {"media_role", "Music"},
                            {"node_name", "pw-play"},
                            {"stream_direction", "playback"}};
    ASSERT_EQ(sink_.configurations.size(), 1U);
    EXPECT_EQ(sink_.configurations.front(), expected);
}

TEST_F(StreamTrackerTest, ACaptureStreamRecords) {
    stream(kStream, "Stream/Input/Audio");
    link(30, kSpeaker, kStream);
    state(NodeState::Running);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 0", "record start", "volume 1 playing"}));
    EXPECT_EQ(sink_.last().contents.get<Names>("active_devices"), (Names{"out.speaker"}));
}

TEST_F(StreamTrackerTest, AVolumeMessageCarriesWhatPlaysAndWhere) {
    play();
    volume(0.064F);
    settle();
    const Contents expected{{"VQSessionVolume", 0.4},
                            {"VQSessionVolumePlayingState", 1},
                            {"VQSessionVolumeOperationProcess", "Player"},
                            {"session_selected_format", "F32LE 2ch 48000Hz"},
                            {"active_devices", Names{"out.speaker"}},
                            {"stream_muted", 0},
                            {"device_muted", 0}};
    EXPECT_EQ(sink_.last().contents, expected);
}

TEST_F(StreamTrackerTest, AnUnchangedVolumeIsToldOnce) {
    play();
    volume(1);
    settle();
    settle();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, AMutedStreamPlaysAtVolumeZero) {
    play();
    volume(1, true);
    settle();
    volume(1, false);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 0 playing", "volume 1 playing"}));
}

TEST_F(StreamTrackerTest, TheDevicesVolumeCounts) {
    play();
    volume(0.125F);
    volume(0.125F, false, kSpeaker);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 0.25 playing"}));
}

TEST_F(StreamTrackerTest, AMutedDeviceSilencesItsStreams) {
    play();
    volume(1, true, kSpeaker);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 0 playing"}));
}

TEST_F(StreamTrackerTest, OfSeveralDevicesTheLoudestCounts) {
    volume(0.125F, false, kHeadphones);
    play();
    link(32, kStream, kHeadphones);
    settle();
    EXPECT_EQ(sink_.last().contents.get<double>("VQSessionVolume"), 1.0);
}

TEST_F(StreamTrackerTest, APauseEndsTheStretchAndTheRun) {
    play();
    state(NodeState::Stopped);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop"}));
}

TEST_F(StreamTrackerTest, TheNextRunIsNoRepeatOfTheFirst) {
    play();
    const Message first = sink_.messages.front();
    state(NodeState::Stopped);
    settle();
    sink_.takeLines();
    state(NodeState::Running);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"playback start", "volume 1 playing"}));
    const Message& second = sink_.messages[sink_.messages.size() - 2];
    EXPECT_EQ(first.contents.get<std::int64_t>("stream_run"), 1);
    EXPECT_EQ(second.contents.get<std::int64_t>("stream_run"), 2);
}

TEST_F(StreamTrackerTest, AVolumeChangedInAPauseIsToldAsSilent) {
    play();
    state(NodeState::Stopped);
    settle();
    sink_.takeLines();
    volume(0.125F);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 0.5 silent"}));
}

TEST_F(StreamTrackerTest, AStopWithinABurstIsNoStop) {
    play();
    state(NodeState::Stopped);
    state(NodeState::Running);
    settle();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, ASoundShorterThanABurstIsToldWhole) {
    stream();
    state(NodeState::Running);
    state(NodeState::Stopped);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 7", "playback start", "volume 1 playing",
                                        "volume 1 silent", "playback stop"}));
}

TEST_F(StreamTrackerTest, ASoundGoneWithinABurstIsToldWhole) {
    stream();
    state(NodeState::Running);
    remove(kStream);
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1000 7", "playback start", "volume 1 playing",
                                        "volume 1 silent", "playback stop", "close 1000"}));
}

TEST_F(StreamTrackerTest, AMoveEndsTheStretchBeforeTheRouteChanges) {
    play();
    remove(30);
    remove(31);
    link(32, kStream, kHeadphones);
    settle();
    EXPECT_EQ(sink_.takeLines(),
              (Lines{"volume 1 silent", "route out.headphones", "volume 1 playing"}));
    const Message& end = sink_.messages[sink_.messages.size() - 3];
    const Message& route = sink_.messages[sink_.messages.size() - 2];
    EXPECT_EQ(end.contents.get<Names>("active_devices"), (Names{"out.speaker"}));
    EXPECT_EQ(route.contents.get<Names>("previous_devices"), (Names{"out.speaker"}));
    EXPECT_EQ(sink_.last().contents.get<Names>("active_devices"), (Names{"out.headphones"}));
}

TEST_F(StreamTrackerTest, AMoveWhilePausedChangesTheRouteAlone) {
    play();
    state(NodeState::Stopped);
    settle();
    sink_.takeLines();
    remove(30);
    remove(31);
    settle();
    link(32, kStream, kHeadphones);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"route out.headphones"}));
}

TEST_F(StreamTrackerTest, LosingAllLinksIsNoRoute) {
    play();
    remove(30);
    remove(31);
    settle();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, ANewFormatBeginsAStretch) {
    play();
    format("S16LE 2ch 44100Hz");
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "volume 1 playing"}));
    EXPECT_EQ(sink_.last().contents.get<std::string>("session_selected_format"),
              "S16LE 2ch 44100Hz");
}

TEST_F(StreamTrackerTest, TheLastMessagesStillKnowTheDeviceAndItsVolume) {
    volume(0.125F, false, kSpeaker);
    play();
    remove(30);
    remove(31);
    format("");
    state(NodeState::Stopped);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 0.5 silent", "playback stop"}));
    const Message& end = sink_.messages[sink_.messages.size() - 2];
    EXPECT_EQ(end.contents.get<Names>("active_devices"), (Names{"out.speaker"}));
    EXPECT_EQ(end.contents.get<std::string>("session_selected_format"), "F32LE 2ch 48000Hz");
}

TEST_F(StreamTrackerTest, AStreamThatGoesAwayClosesItsSession) {
    play();
    remove(kStream);
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1000"}));
}

TEST_F(StreamTrackerTest, ObjectNumbersThatComeAgainAreNewStreams) {
    play();
    remove(kStream);
    sink_.takeLines();
    stream();
    state(NodeState::Running);
    settle();
    EXPECT_EQ(sink_.lines.front(), "open 1001 7");
}

TEST_F(StreamTrackerTest, EachStreamHasItsOwnSession) {
    play();
    stream(21);
    state(NodeState::Running, 21);
    settle();
    remove(kStream);
    EXPECT_EQ(sink_.takeLines(), (Lines{"open 1001 7", "playback start", "volume 1 playing",
                                        "volume 1 silent", "playback stop", "close 1000"}));
}

TEST_F(StreamTrackerTest, ALostConnectionClosesEverySession) {
    play();
    tracker_.handle(Disconnected{});
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1000"}));
    state(NodeState::Running);
    settle();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, RestatingSaysWhatPlays) {
    play();
    tracker_.restate();
    EXPECT_EQ(sink_.takeLines(), (Lines{"playback start", "volume 1 playing"}));
    EXPECT_EQ(sink_.messages[sink_.messages.size() - 2].contents.get<std::int64_t>("stream_run"),
              1);
}

TEST_F(StreamTrackerTest, RestatingLeavesPausedStreamsAlone) {
    play();
    state(NodeState::Stopped);
    settle();
    sink_.takeLines();
    tracker_.restate();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, ClosingAllIsSaidOnce) {
    play();
    tracker_.closeAll();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1000"}));
    tracker_.closeAll();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerTest, ASessionGoesOnWhenItsNodeTurnsIntoSomethingElse) {
    play();
    tracker_.handle(NodeChanged{kStream, {{"media.class", "Stream/Output/Video"}}});
    remove(kStream);
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop", "close 1000"}));
}

TEST_F(StreamTrackerTest, AnUnpluggedDeviceStaysTheStreamsUntilItHasAnother) {
    play();
    remove(kSpeaker);
    settle();
    remove(30);
    remove(31);
    settle();
    EXPECT_TRUE(sink_.lines.empty());
    link(32, kStream, kHeadphones);
    settle();
    EXPECT_EQ(sink_.takeLines(),
              (Lines{"volume 1 silent", "route out.headphones", "volume 1 playing"}));
}

TEST_F(StreamTrackerTest, AStreamWhoseDeviceIsUnpluggedStopsWhereItPlayed) {
    play();
    remove(kSpeaker);
    state(NodeState::Stopped);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "playback stop"}));
    const Message& end = sink_.messages[sink_.messages.size() - 2];
    EXPECT_EQ(end.contents.get<Names>("active_devices"), (Names{"out.speaker"}));
}

TEST_F(StreamTrackerTest, ANewNameInMidSessionIsNotTold) {
    play();
    tracker_.handle(NodeChanged{
        kStream, {{"media.class", "Stream/Output/Audio"}, {"application.name", "Renamed"}}});
    tracker_.handle(ClientChanged{kClient, {{"application.name", "Renamed"}}});
    settle();
    EXPECT_TRUE(sink_.lines.empty());
    volume(0.125F);
    settle();
    EXPECT_EQ(sink_.last().contents.get<std::string>("VQSessionVolumeOperationProcess"), "Player");
}

TEST_F(StreamTrackerTest, ADeviceKeepsItsVolumeWhenItsPropertiesChange) {
    volume(0.125F, false, kSpeaker);
    device(kSpeaker, "out.speaker");
    play();
    EXPECT_EQ(sink_.last().contents.get<double>("VQSessionVolume"), 0.5);
}

TEST_F(StreamTrackerTest, ARenamedDeviceIsAnotherRoute) {
    play();
    device(kSpeaker, "out.living-room");
    settle();
    EXPECT_EQ(sink_.takeLines(),
              (Lines{"volume 1 silent", "route out.living-room", "volume 1 playing"}));
}

TEST_F(StreamTrackerTest, ObjectsBeyondTheBoundAreIgnoredAndCounted) {
    for (ObjectId id = 0; id < StreamTracker::kMaxObjects; ++id) {
        link(id, 1, 2);
    }
    EXPECT_EQ(tracker_.ignoredObjects(), 0U);
    link(100000, kStream, kSpeaker);
    link(0, 1, 3);
    EXPECT_EQ(tracker_.ignoredObjects(), 1U);
}

} // namespace
} // namespace halyard::pipewire
