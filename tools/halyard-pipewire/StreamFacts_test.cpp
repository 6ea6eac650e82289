#include "StreamFacts.h"

#include <gtest/gtest.h>
#include <limits>

#include "halyard/halyard.h"

namespace halyard::pipewire {
namespace {

std::uint16_t playbackService(const char* role) {
    return serviceTypeOf({{"media.role", role}}, Direction::Playback);
}

TEST(StreamFactsTest, PlaybackAndCaptureStreamsReport) {
    EXPECT_EQ(reportedDirection({{"media.class", "Stream/Output/Audio"}}), Direction::Playback);
    EXPECT_EQ(reportedDirection({{"media.class", "Stream/Input/Audio"}}), Direction::Capture);
}

TEST(StreamFactsTest, DevicesVideoAndMidiDoNotReport) {
    EXPECT_EQ(reportedDirection({{"media.class", "Audio/Sink"}}), std::nullopt);
    EXPECT_EQ(reportedDirection({{"media.class", "Stream/Input/Video"}}), std::nullopt);
    EXPECT_EQ(reportedDirection({{"media.class", "Midi/Bridge"}}), std::nullopt);
    EXPECT_EQ(reportedDirection({}), std::nullopt);
}

TEST(StreamFactsTest, LevelMetersDoNotReport) {
    EXPECT_EQ(
        reportedDirection({{"media.class", "Stream/Input/Audio"}, {"stream.monitor", "true"}}),
        std::nullopt);
}

TEST(StreamFactsTest, EndsOfLoopbacksDoNotReport) {
    EXPECT_EQ(
        reportedDirection({{"media.class", "Stream/Output/Audio"}, {"node.link-group", "loop-1"}}),
        std::nullopt);
}

const Properties kJackNode = {{"media.type", "Audio"},
                              {"media.category", "Duplex"},
                              {"media.role", "DSP"},
                              {"node.name", "synth"}};

TEST(StreamFactsTest, JackProgramsPassSound) {
    EXPECT_TRUE(passesSound(kJackNode));
    EXPECT_EQ(reportedDirection(kJackNode), std::nullopt);
    EXPECT_FALSE(isDevice(kJackNode));
}

TEST(StreamFactsTest, FiltersVideoAndStreamsPassNoSound) {
    const auto with = [](const char* key, const char* value) {
        Properties node = kJackNode;
        node[key] = value;
        return node;
    };
    EXPECT_FALSE(passesSound(with("media.category", "Filter")));
    EXPECT_FALSE(passesSound(with("media.type", "Video")));
    EXPECT_FALSE(passesSound(with("media.class", "Stream/Output/Audio")));
    EXPECT_FALSE(passesSound(with("node.link-group", "filter-1")));
}

TEST(StreamFactsTest, StreamsDevicesAndJackProgramsAreWatched) {
    EXPECT_TRUE(isWatched(kJackNode));
    EXPECT_TRUE(isWatched({{"media.class", "Stream/Input/Audio"}}));
    EXPECT_TRUE(isWatched({{"media.class", "Audio/Sink"}}));
    EXPECT_FALSE(isWatched({{"media.class", "Video/Source"}}));
    EXPECT_FALSE(isWatched({{"node.name", "Dummy-Driver"}}));
}

TEST(StreamFactsTest, SinksSourcesAndTheirVirtualKindsAreDevices) {
    EXPECT_TRUE(isDevice({{"media.class", "Audio/Sink"}}));
    EXPECT_TRUE(isDevice({{"media.class", "Audio/Source/Virtual"}}));
    EXPECT_FALSE(isDevice({{"media.class", "Stream/Output/Audio"}}));
    EXPECT_FALSE(isDevice({}));
}

TEST(StreamFactsTest, RolesOfPlaybackMapToServices) {
    EXPECT_EQ(playbackService("Music"), HALYARD_SERVICE_LONG_FORM_AUDIO);
    EXPECT_EQ(playbackService("Movie"), HALYARD_SERVICE_LONG_FORM_AUDIO);
    EXPECT_EQ(playbackService("Notification"), HALYARD_SERVICE_ALERTS);
    EXPECT_EQ(playbackService("Communication"), HALYARD_SERVICE_TELEPHONY);
    EXPECT_EQ(playbackService("Event"), HALYARD_SERVICE_SYSTEM_SOUNDS);
    EXPECT_EQ(playbackService("Game"), HALYARD_SERVICE_NON_LONG_FORM_AUDIO);
    EXPECT_EQ(playbackService("Alarm"), HALYARD_SERVICE_ALARMS);
    EXPECT_EQ(playbackService("Test"), HALYARD_SERVICE_TEST);
}

TEST(StreamFactsTest, RolesAreComparedWithoutRegardToCase) {
    EXPECT_EQ(playbackService("music"), HALYARD_SERVICE_LONG_FORM_AUDIO);
    EXPECT_EQ(playbackService("PHONE"), HALYARD_SERVICE_TELEPHONY);
}

TEST(StreamFactsTest, UnknownAndAbsentRolesAreGeneric) {
    EXPECT_EQ(playbackService("Production"), HALYARD_SERVICE_GENERIC);
    EXPECT_EQ(playbackService("Musi"), HALYARD_SERVICE_GENERIC);
    EXPECT_EQ(serviceTypeOf({}, Direction::Playback), HALYARD_SERVICE_GENERIC);
}

TEST(StreamFactsTest, AThemedEventWithoutARoleIsASystemSound) {
    EXPECT_EQ(serviceTypeOf({{"event.id", "bell"}}, Direction::Playback),
              HALYARD_SERVICE_SYSTEM_SOUNDS);
}

TEST(StreamFactsTest, CaptureIsGenericUnlessTwoSpeak) {
    EXPECT_EQ(serviceTypeOf({{"media.role", "Music"}}, Direction::Capture),
              HALYARD_SERVICE_GENERIC);
    EXPECT_EQ(serviceTypeOf({{"media.role", "Communication"}}, Direction::Capture),
              HALYARD_SERVICE_TELEPHONY);
}

TEST(StreamFactsTest, TheNodesApplicationNameComesFirst) {
    const Properties node = {{"application.name", "Player"}, {"node.name", "pw-play"}};
    EXPECT_EQ(applicationName(node, {{"application.name", "client"}}), "Player");
}

TEST(StreamFactsTest, TheApplicationNameFallsBackStepByStep) {
    const Properties node = {{"application.process.binary", "bin"}, {"node.name", "node"}};
    EXPECT_EQ(applicationName(node, {{"application.name", "client"}}), "client");
    EXPECT_EQ(applicationName(node, {}), "bin");
    EXPECT_EQ(applicationName({{"node.name", "node"}}, {}), "node");
    EXPECT_EQ(applicationName({{"application.name", ""}}, {}), "Unknown");
}

TEST(StreamFactsTest, TheKernelKnowsANativeProgramsProcess) {
    EXPECT_EQ(processId({}, {{"application.process.id", "3"}, {"pipewire.sec.pid", "42"}}), 42);
    EXPECT_EQ(processId({}, {{"client.api", "alsa"}, {"pipewire.sec.pid", "42"}}), 42);
    EXPECT_EQ(processId({{"client.api", "jack"}}, {{"pipewire.sec.pid", "42"}}), 42);
}

TEST(StreamFactsTest, AProcessThatTheKernelDoesNotSeeIsTheOneThatIsNamed) {
    EXPECT_EQ(processId({}, {{"application.process.id", "7"}}), 7);
    EXPECT_EQ(processId({}, {{"application.process.id", "7"}, {"pipewire.sec.pid", "0"}}), 7);
}

TEST(StreamFactsTest, AServersProcessIsNotTheProgramsOwn) {
    const Properties server = {{"client.api", "pipewire-pulse"}, {"pipewire.sec.pid", "7"}};
    EXPECT_TRUE(viaServer({}, server));
    EXPECT_EQ(processId({{"application.process.id", "42"}}, server), 42);
    EXPECT_EQ(processId({}, server), std::nullopt);
}

TEST(StreamFactsTest, NativeAndJackProgramsSpeakForThemselves) {
    EXPECT_FALSE(viaServer({}, {}));
    EXPECT_FALSE(viaServer({{"client.api", "jack"}}, {{"client.api", "jack"}}));
}

TEST(StreamFactsTest, AProcessOfAnotherMachineIsNone) {
    const Properties node = {{"client.api", "pipewire-pulse"},
                             {"pulse.server.type", "tcp"},
                             {"application.process.id", "42"}};
    EXPECT_EQ(processId(node, {}), std::nullopt);
}

TEST(StreamFactsTest, ANumberFromWithinASandboxIsNone) {
    const Properties native = {{"pipewire.access", "flatpak"}, {"application.process.id", "3"}};
    EXPECT_EQ(processId({}, native), std::nullopt);
    Properties seen = native;
    seen["pipewire.sec.pid"] = "42";
    EXPECT_EQ(processId({}, seen), 42);
    Properties served = seen;
    served["client.api"] = "pipewire-pulse";
    EXPECT_EQ(processId({}, served), std::nullopt);
}

TEST(StreamFactsTest, ThePortalsProcessIsNotTheProgramsOwn) {
    const Properties client = {{"pipewire.access", "portal"}, {"pipewire.sec.pid", "42"}};
    EXPECT_EQ(processId({}, client), std::nullopt);
}

TEST(StreamFactsTest, AProcessIdThatIsNoNumberIsNone) {
    EXPECT_EQ(processId({{"application.process.id", "12x"}}, {}), std::nullopt);
    EXPECT_EQ(processId({{"application.process.id", "-3"}}, {}), std::nullopt);
    EXPECT_EQ(processId({{"application.process.id", "99999999999999999999"}}, {}), std::nullopt);
}

TEST(StreamFactsTest, VolumesAreTheCubeRootWithinZeroAndOne) {
    EXPECT_DOUBLE_EQ(perceivedVolume(0.064F), 0.4);
    EXPECT_DOUBLE_EQ(perceivedVolume(0), 0);
    EXPECT_DOUBLE_EQ(perceivedVolume(1), 1);
    EXPECT_DOUBLE_EQ(perceivedVolume(3.375F), 1);
    EXPECT_DOUBLE_EQ(perceivedVolume(-1), 0);
    EXPECT_DOUBLE_EQ(perceivedVolume(std::numeric_limits<float>::quiet_NaN()), 0);
}

} // namespace
} // namespace halyard::pipewire
