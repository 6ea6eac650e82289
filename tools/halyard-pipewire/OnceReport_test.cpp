#include "OnceReport.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <string>

namespace halyard::pipewire {
namespace {

constexpr ObjectId kClient = 5;
constexpr ObjectId kSpeaker = 10;
constexpr ObjectId kMicrophone = 11;
constexpr ObjectId kStream = 20;

class OnceReportTest : public testing::Test {
protected:
    void node(ObjectId id, const char* mediaClass, const char* name) {
        report_.handle(NodeChanged{id,
                                   {{"media.class", mediaClass},
                                    {"node.name", name},
                                    {"client.id", std::to_string(kClient)},
                                    {"media.name", "secret"},
                                    {"media.filename", "secret.ogg"}}});
    }
    void client(const char* name) {
        report_.handle(
            ClientChanged{kClient, {{"application.name", name}, {"pipewire.sec.pid", "42"}}});
    }
    void runs(ObjectId id) { report_.handle(NodeStateChanged{id, NodeState::Running}); }
    void cycle(ObjectId driver, ObjectId follower) {
        Cycle cycle;
        cycle.driver.id = driver;
        cycle.frames = 1024;
        cycle.rateNumerator = 1;
        cycle.rateDenominator = 48000;
        cycle.followers.push_back({.id = follower});
        report_.take(cycle);
    }
    void link(ObjectId from, ObjectId to) { report_.handle(LinkAdded{++lastLink_, from, to}); }

    OnceReport report_;
    ObjectId lastLink_ = 100;
};

TEST_F(OnceReportTest, AnEmptyGraphSaysSo) {
    EXPECT_EQ(report_.text(), "Devices: none\n\nStreams: none\n");
}

TEST_F(OnceReportTest, DevicesAndStreamsStandInColumns) {
    client("Player");
    node(kSpeaker, "Audio/Sink", "out.speaker");
    node(kStream, "Stream/Output/Audio", "pw-play");
    link(kStream, kSpeaker);
    runs(kStream);
    runs(kSpeaker);
    report_.handle(NodeVolumeChanged{kStream, 0.064F, false});
    report_.handle(NodeVolumeChanged{kSpeaker, 1, true});
    report_.handle(NodeFormatChanged{kSpeaker, "F32P 2ch 48000Hz"});
    cycle(kSpeaker, kStream);
    EXPECT_EQ(report_.text(),
              "Devices\n"
              "  NAME         KIND  STATE    VOLUME  MUTED  QUANTUM     FORMAT\n"
              "  out.speaker  Sink  running  1.00    yes    1024/48000  F32P 2ch 48000Hz\n"
              "\n"
              "Streams\n"
              "  APPLICATION  PID  DIRECTION  STATE    VOLUME  MUTED  CAPTURES  FORMAT  DEVICES\n"
              "  Player       42   playback   running  0.40    no     -         -       "
              "out.speaker\n");
}

TEST_F(OnceReportTest, WhoHearsAMicrophoneIsToldFromWhoListensToASink) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    node(kMicrophone, "Audio/Source", "in.microphone");
    node(kStream, "Stream/Input/Audio", "recorder");
    link(kSpeaker, kStream);
    EXPECT_NE(report_.text().find("monitor   -       out.speaker"), std::string::npos);
    link(kMicrophone, kStream);
    EXPECT_NE(report_.text().find("source and monitor  -       in.microphone, out.speaker"),
              std::string::npos);
}

TEST_F(OnceReportTest, AJackProgramIsShownWithAndWithoutADevice) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    report_.handle(NodeChanged{
        kStream, {{"media.type", "Audio"}, {"media.category", "Duplex"}, {"node.name", "synth"}}});
    EXPECT_NE(report_.text().find("synth        -    -          stopped"), std::string::npos);
    link(kStream, kSpeaker);
    EXPECT_NE(report_.text().find("synth        -    playback   stopped"), std::string::npos);
}

TEST_F(OnceReportTest, WhatHasStoppedIsShownAsStopped) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    runs(kSpeaker);
    EXPECT_NE(report_.text().find("Sink  running"), std::string::npos);
    report_.handle(NodeStateChanged{kSpeaker, NodeState::Stopped});
    EXPECT_NE(report_.text().find("Sink  stopped"), std::string::npos);
}

TEST_F(OnceReportTest, ADeviceThatFollowsAnotherHasThatOnesCycle) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    node(kMicrophone, "Audio/Source", "in.microphone");
    runs(kMicrophone);
    cycle(kSpeaker, kMicrophone);
    EXPECT_NE(report_.text().find("no     1024/48000"), std::string::npos);
}

TEST_F(OnceReportTest, ADeviceThatDoesNotRunHasNoCycle) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    cycle(kSpeaker, kStream);
    EXPECT_EQ(report_.text().find("1024"), std::string::npos);
}

TEST_F(OnceReportTest, ItIsCompleteWhenEachRunningDevicesCycleIsKnown) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    node(kStream, "Stream/Output/Audio", "pw-play");
    runs(kStream);
    EXPECT_TRUE(report_.complete());
    runs(kSpeaker);
    EXPECT_FALSE(report_.complete());
    cycle(kSpeaker, kStream);
    EXPECT_TRUE(report_.complete());
}

TEST_F(OnceReportTest, ACycleOfNonsenseIsShownAsItIs) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    runs(kSpeaker);
    Cycle cycle;
    cycle.driver.id = kSpeaker;
    report_.take(cycle);
    EXPECT_NE(report_.text().find("0/0"), std::string::npos);
}

TEST_F(OnceReportTest, TitlesAndFileNamesAreNotShown) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    node(kStream, "Stream/Output/Audio", "pw-play");
    EXPECT_EQ(report_.text().find("secret"), std::string::npos);
}

TEST_F(OnceReportTest, NamesAreShownWithoutControlCharacters) {
    client("\x1b[2Jevil");
    node(kSpeaker, "Audio/Sink\n", "out\n");
    node(kStream, "Stream/Output/Audio", "pw-play");
    link(kStream, kSpeaker);
    const std::string text = report_.text();
    EXPECT_NE(text.find("\\x1b[2Jevil"), std::string::npos);
    EXPECT_EQ(text.find('\x1b'), std::string::npos);
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 7);
}

TEST_F(OnceReportTest, WhatHasGoneIsNotShown) {
    node(kSpeaker, "Audio/Sink", "out.speaker");
    node(kStream, "Stream/Output/Audio", "pw-play");
    report_.handle(ObjectRemoved{kStream});
    EXPECT_NE(report_.text().find("Streams: none"), std::string::npos);
    report_.handle(Disconnected{});
    EXPECT_NE(report_.text().find("Devices: none"), std::string::npos);
}

TEST_F(OnceReportTest, LevelMetersAndVideoAreNotShown) {
    report_.handle(
        NodeChanged{kStream, {{"media.class", "Stream/Input/Audio"}, {"stream.monitor", "true"}}});
    node(kSpeaker, "Stream/Output/Video", "film");
    EXPECT_EQ(report_.text(), "Devices: none\n\nStreams: none\n");
}

TEST_F(OnceReportTest, ObjectsBeyondTheBoundAreCounted) {
    for (ObjectId id = 0; id < OnceReport::kMaxObjects + 2; ++id) {
        report_.handle(ClientChanged{id, {}});
    }
    EXPECT_NE(report_.text().find("\n2 more objects are not shown\n"), std::string::npos);
}

} // namespace
} // namespace halyard::pipewire
