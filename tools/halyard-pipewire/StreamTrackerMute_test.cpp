// Who is muted, and who listens to what.

#include <gtest/gtest.h>
#include <string>

#include "StreamTrackerTesting.h"

namespace halyard::pipewire {
namespace {

class StreamTrackerMuteTest : public StreamTrackerTest {
protected:
    // Of the last message: "stream device", each 0 or 1.
    std::string mutes() const { return flag("stream_muted") + " " + flag("device_muted"); }
    // "source monitor".
    std::string captures() const { return flag("capture_source") + " " + flag("capture_monitor"); }
    std::string flag(const char* key) const {
        const Contents& contents = sink_.last().contents;
        const bool there = std::any_of(contents.begin(), contents.end(),
                                       [&](const auto& entry) { return entry.key == key; });
        return there ? std::to_string(contents.get<std::int64_t>(key)) : "-";
    }
    // Forgets the volume message that follows the start, which says no capture.
    void record(ObjectId from) {
        microphone();
        stream(kStream, "Stream/Input/Audio");
        link(30, from, kStream);
        state(NodeState::Running);
        settle();
        sink_.messages.pop_back();
    }
};

TEST_F(StreamTrackerMuteTest, MutesOfStreamAndDeviceAreToldApart) {
    play();
    volume(1, true);
    settle();
    EXPECT_EQ(mutes(), "1 0");
    volume(1, true, kSpeaker);
    settle();
    EXPECT_EQ(mutes(), "1 1");
    volume(1, false);
    settle();
    EXPECT_EQ(mutes(), "0 1");
    EXPECT_EQ(sink_.takeLines(),
              (Lines{"volume 0 playing", "volume 0 playing", "volume 0 playing"}));
}

TEST_F(StreamTrackerMuteTest, AVolumeOfZeroIsNoMute) {
    play();
    volume(0);
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 0 playing"}));
    EXPECT_EQ(mutes(), "0 0");
}

TEST_F(StreamTrackerMuteTest, AMuteThatIsKnownIsNotToldAgain) {
    play();
    volume(1, true);
    settle();
    sink_.takeLines();
    volume(0.5F, true);
    settle();
    EXPECT_TRUE(sink_.lines.empty());
}

TEST_F(StreamTrackerMuteTest, AStreamWithoutADeviceSaysNothingOfOne) {
    stream();
    state(NodeState::Running);
    settle();
    EXPECT_EQ(mutes(), "0 -");
}

TEST_F(StreamTrackerMuteTest, AMoveEndsTheStretchWithTheOldDevicesMute) {
    volume(1, true, kSpeaker);
    play();
    remove(30);
    remove(31);
    link(32, kStream, kHeadphones);
    settle();
    EXPECT_EQ(mutes(), "0 0");
    EXPECT_EQ(sink_.takeLines(),
              (Lines{"volume 0 silent", "route out.headphones", "volume 1 playing"}));
    const Message& end = sink_.messages[sink_.messages.size() - 3];
    EXPECT_EQ(end.contents.get<std::int64_t>("device_muted"), 1);
}

TEST_F(StreamTrackerMuteTest, WhoHoldsTheMicrophoneSaysSoAtTheStart) {
    record(kMicrophone);
    EXPECT_EQ(sink_.last().type, HALYARD_TYPE_START);
    EXPECT_EQ(sink_.last().contents.get<Names>("active_devices"), Names{"in.microphone"});
    EXPECT_EQ(captures(), "1 0");
}

TEST_F(StreamTrackerMuteTest, ListeningToASinkIsNotHoldingAMicrophone) {
    record(kSpeaker);
    EXPECT_EQ(captures(), "0 1");
}

TEST_F(StreamTrackerMuteTest, ARecorderOfBothSaysBoth) {
    record(kSpeaker);
    link(31, kMicrophone, kStream);
    settle();
    const Message& route = sink_.messages[sink_.messages.size() - 2];
    EXPECT_EQ(route.category, std::uint32_t{HALYARD_CATEGORY_ROUTE_CHANGE});
    EXPECT_EQ(route.contents.get<std::int64_t>("capture_source"), 1);
    EXPECT_EQ(route.contents.get<std::int64_t>("capture_monitor"), 1);
}

TEST_F(StreamTrackerMuteTest, AnotherSideOfTheSameDeviceIsAnotherRoute) {
    tracker_.handle(
        NodeChanged{kMicrophone, {{"media.class", "Audio/Duplex"}, {"node.name", "headset"}}});
    stream(kStream, "Stream/Input/Audio");
    link(30, kMicrophone, kStream);
    state(NodeState::Running);
    settle();
    sink_.takeLines();
    tracker_.handle(NodeChanged{
        kStream, {{"media.class", "Stream/Input/Audio"}, {"stream.capture.sink", "true"}}});
    settle();
    EXPECT_EQ(sink_.takeLines(), (Lines{"volume 1 silent", "route headset", "volume 1 playing"}));
    sink_.messages.pop_back();
    EXPECT_EQ(captures(), "0 1");
}

TEST_F(StreamTrackerMuteTest, WhoPlaysAloneSaysNothingOfCapture) {
    stream();
    link(30, kStream, kSpeaker);
    state(NodeState::Running);
    settle();
    sink_.messages.pop_back();
    EXPECT_EQ(captures(), "- -");
}

TEST_F(StreamTrackerMuteTest, ACallThatLetsGoOfTheMicrophoneSaysSo) {
    microphone();
    jack();
    link(30, kStream, kSpeaker);
    link(31, kMicrophone, kStream);
    settle();
    EXPECT_EQ(sink_.messages.front().contents.get<std::int64_t>("capture_source"), 1);
    remove(31);
    settle();
    sink_.messages.pop_back();
    EXPECT_EQ(sink_.last().contents.get<Names>("active_devices"), Names{"out.speaker"});
    EXPECT_EQ(captures(), "- -");
}

} // namespace
} // namespace halyard::pipewire
