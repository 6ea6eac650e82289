#include "StreamRoutes.h"

#include <gtest/gtest.h>
#include <string>

namespace halyard::pipewire {
namespace {

constexpr ObjectId kSpeaker = 1;
constexpr ObjectId kMicrophone = 2;
constexpr ObjectId kHeadphones = 3;
constexpr ObjectId kStream = 10;
constexpr ObjectId kFirstProgram = 100;

using Devices = std::set<std::string>;

class StreamRoutesTest : public testing::Test {
protected:
    StreamRoutesTest() {
        node(kSpeaker, "Audio/Sink", "speaker");
        node(kHeadphones, "Audio/Sink", "headphones");
        node(kMicrophone, "Audio/Source", "microphone");
        node(kStream, "Stream/Output/Audio", "stream");
    }

    void node(ObjectId id, const char* mediaClass, const char* name) {
        routes_.setNode(id, {{"media.class", mediaClass}, {"node.name", name}});
    }
    void program(ObjectId id) {
        routes_.setNode(
            id, {{"media.type", "Audio"}, {"media.category", "Duplex"}, {"node.name", "program"}});
    }
    ObjectId link(ObjectId from, ObjectId to) {
        EXPECT_TRUE(routes_.addLink({++lastLink_, from, to}));
        return lastLink_;
    }
    // The stream through `count` programs to the speaker.
    void chain(ObjectId count) {
        ObjectId last = kStream;
        for (ObjectId id = kFirstProgram; id < kFirstProgram + count; ++id) {
            program(id);
            link(last, id);
            last = id;
        }
        link(last, kSpeaker);
    }

    StreamRoutes routes_;
    ObjectId lastLink_ = 10000;
};

TEST_F(StreamRoutesTest, AStreamReachesTheDevicesItIsLinkedTo) {
    link(kStream, kSpeaker);
    const ObjectId other = link(kStream, kHeadphones);
    EXPECT_EQ(routes_.routeOf(kStream).devices, (Devices{"headphones", "speaker"}));
    routes_.remove(other);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{"speaker"});
}

TEST_F(StreamRoutesTest, OfSeveralDevicesTheFirstByNameIsThePrincipal) {
    link(kStream, kSpeaker);
    EXPECT_EQ(routes_.routeOf(kStream).principal, "speaker");
    link(kStream, kHeadphones);
    EXPECT_EQ(routes_.routeOf(kStream).principal, "headphones");
}

TEST_F(StreamRoutesTest, ADeviceLinkedTwiceStaysUntilBothLinksAreGone) {
    const ObjectId left = link(kStream, kSpeaker);
    const ObjectId right = link(kStream, kSpeaker);
    routes_.remove(left);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{"speaker"});
    routes_.remove(right);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{});
}

TEST_F(StreamRoutesTest, ADeviceThatIsGoneIsNotReached) {
    link(kStream, kSpeaker);
    routes_.remove(kSpeaker);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{});
}

TEST_F(StreamRoutesTest, SoundGoesThroughProgramsToTheDevicesBehind) {
    chain(3);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{"speaker"});
    EXPECT_EQ(routes_.routeOf(kFirstProgram + 1).devices, Devices{"speaker"});
}

TEST_F(StreamRoutesTest, ProgramsPassSoundInOneDirection) {
    program(kFirstProgram);
    link(kMicrophone, kFirstProgram);
    link(kStream, kFirstProgram);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{});
}

TEST_F(StreamRoutesTest, DevicesPassNoSoundOn) {
    link(kStream, kSpeaker);
    link(kSpeaker, kHeadphones);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{"speaker"});
}

TEST_F(StreamRoutesTest, OtherStreamsPassNoSoundOn) {
    node(11, "Stream/Input/Audio", "recorder");
    link(kStream, 11);
    link(11, kSpeaker);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{});
}

TEST_F(StreamRoutesTest, AProgramThatPlaysAndCapturesHasTheDevicesOfBoth) {
    program(kFirstProgram);
    routes_.setVolume(kSpeaker, 0.25F, false);
    link(kMicrophone, kFirstProgram);
    EXPECT_TRUE(routes_.routeOf(kFirstProgram).captures());
    EXPECT_FALSE(routes_.routeOf(kFirstProgram).plays);
    EXPECT_EQ(routes_.routeOf(kFirstProgram).volume, 1);
    link(kFirstProgram, kSpeaker);
    const Route route = routes_.routeOf(kFirstProgram);
    EXPECT_TRUE(route.captures() && route.plays);
    EXPECT_EQ(route.devices, (Devices{"microphone", "speaker"}));
    EXPECT_EQ(route.principal, "speaker");
    EXPECT_EQ(route.volume, 0.25F);
}

TEST_F(StreamRoutesTest, ASourceIsHeardAndASinkMonitored) {
    link(kMicrophone, kStream);
    EXPECT_TRUE(routes_.routeOf(kStream).hears);
    EXPECT_FALSE(routes_.routeOf(kStream).monitors);
    node(11, "Stream/Input/Audio", "recorder");
    link(kSpeaker, 11);
    EXPECT_TRUE(routes_.routeOf(11).monitors);
    EXPECT_FALSE(routes_.routeOf(11).hears);
    link(kMicrophone, 11);
    EXPECT_TRUE(routes_.routeOf(11).monitors && routes_.routeOf(11).hears);
}

TEST_F(StreamRoutesTest, TheListenerSaysWhatItTakesFromADeviceOfBothDirections) {
    node(kMicrophone, "Audio/Duplex", "headset");
    node(11, "Stream/Input/Audio", "recorder");
    link(kMicrophone, 11);
    EXPECT_TRUE(routes_.routeOf(11).hears);
    routes_.setNode(11, {{"media.class", "Stream/Input/Audio"}, {"stream.capture.sink", "true"}});
    EXPECT_TRUE(routes_.routeOf(11).monitors);
    EXPECT_FALSE(routes_.routeOf(11).hears);
}

TEST_F(StreamRoutesTest, OnlyDevicesThatAreAllMutedAreMuted) {
    link(kStream, kSpeaker);
    routes_.setVolume(kSpeaker, 0.5F, true);
    EXPECT_TRUE(routes_.routeOf(kStream).muted);
    EXPECT_EQ(routes_.routeOf(kStream).volume, 0);
    link(kStream, kHeadphones);
    EXPECT_FALSE(routes_.routeOf(kStream).muted);
    routes_.setVolume(kHeadphones, 0.5F, true);
    EXPECT_TRUE(routes_.routeOf(kStream).muted);
}

TEST_F(StreamRoutesTest, AMutedMicrophoneDoesNotMuteWhatPlays) {
    program(kFirstProgram);
    routes_.setVolume(kMicrophone, 1, true);
    link(kMicrophone, kFirstProgram);
    EXPECT_TRUE(routes_.routeOf(kFirstProgram).muted);
    link(kFirstProgram, kSpeaker);
    EXPECT_FALSE(routes_.routeOf(kFirstProgram).muted);
}

TEST_F(StreamRoutesTest, ProgramsThatFeedEachOtherEndAWalk) {
    program(kFirstProgram);
    program(kFirstProgram + 1);
    link(kFirstProgram, kFirstProgram + 1);
    link(kFirstProgram + 1, kFirstProgram);
    link(kFirstProgram + 1, kSpeaker);
    EXPECT_EQ(routes_.routeOf(kFirstProgram).devices, Devices{"speaker"});
}

TEST_F(StreamRoutesTest, AWalkGoesThroughSoManyProgramsAndNoMore) {
    chain(StreamRoutes::kMaxPassed);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{"speaker"});
    routes_.clear();
    node(kSpeaker, "Audio/Sink", "speaker");
    chain(StreamRoutes::kMaxPassed + 1);
    EXPECT_EQ(routes_.routeOf(kStream).devices, Devices{});
}

TEST_F(StreamRoutesTest, LinksBeyondTheBoundAreRefused) {
    for (std::size_t i = 0; i < StreamRoutes::kMaxLinks; ++i) {
        link(kStream, kSpeaker);
    }
    EXPECT_FALSE(routes_.addLink({1, kStream, kHeadphones}));
    EXPECT_TRUE(routes_.addLink({lastLink_, kStream, kHeadphones})) << "known already";
    EXPECT_EQ(routes_.routeOf(kStream).devices, (Devices{"headphones", "speaker"}));
}

} // namespace
} // namespace halyard::pipewire
