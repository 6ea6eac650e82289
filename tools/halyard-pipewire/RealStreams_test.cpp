// What programs of several kinds do with a real daemon, and what comes of it;
// skipped where the programs are not installed.

#include <algorithm>
#include <fmt/ranges.h>
#include <gtest/gtest.h>
#include <string>
#include <unistd.h>

#include "LookOnce.h"
#include "PipeWireAdapterTesting.h"

namespace halyard::pipewire {
namespace {

class RealStreamsTest : public PipeWireAdapterTest {
protected:
    testing::Child spawn(const std::vector<std::string>& arguments) {
        return {arguments, server_.folder() / "program.log"};
    }
    // Devices before and after each change of route.
    std::vector<std::string> routes() const {
        std::vector<std::string> result;
        for (const Message& message : sink_.messages) {
            if (message.category == HALYARD_CATEGORY_ROUTE_CHANGE) {
                const auto before = message.contents.get<Names>("previous_devices");
                const auto after = message.contents.get<Names>("active_devices");
                result.push_back(
                    fmt::format("{} > {}", fmt::join(before, "+"), fmt::join(after, "+")));
            }
        }
        return result;
    }
    bool playsOn(const std::string& device) const {
        const Contents& last = sink_.messages.back().contents;
        return last.get<Names>("active_devices") == Names{device} &&
               last.get<std::int64_t>("VQSessionVolumePlayingState") == 1;
    }
    std::ptrdiff_t count(std::uint16_t type) const {
        return std::count_if(
            sink_.messages.begin(), sink_.messages.end(), [&](const Message& message) {
                return message.category == HALYARD_CATEGORY_PLAYBACK && message.type == type;
            });
    }
    static bool hasJack() {
        return access("/usr/bin/pw-jack", X_OK) == 0 &&
               access("/usr/bin/jack_simple_client", X_OK) == 0;
    }
};

// Its node runs with and without a device, and it links itself to the default one.
TEST_F(RealStreamsTest, AJackProgramPlaysWhileItIsLinked) {
    if (!hasJack()) {
        GTEST_SKIP() << "pw-jack and jack_simple_client are not installed";
    }
    auto program = spawn({"pw-jack", "jack_simple_client"});
    ASSERT_TRUE(until([this] { return plays(); }));
    EXPECT_EQ(sink_.opened, std::vector<std::string>{"jack_simple_client/0"});
    EXPECT_EQ(sink_.configurations[0].get<std::int64_t>("application_pid"), program.pid());
    EXPECT_EQ(sink_.messages[0].contents.get<Names>("active_devices"), Names{"out.speaker"});

    server_.run({"pw-link", "-d", "jack_simple_client:output1", "out.speaker:playback_FL"});
    server_.run({"pw-link", "-d", "jack_simple_client:output2", "out.speaker:playback_FR"});
    ASSERT_TRUE(until([this] { return stopped(); }));
    EXPECT_EQ(sink_.closed, 0);
    program.kill();
    EXPECT_TRUE(until([this] { return sink_.closed == 1; }));
}

TEST_F(RealStreamsTest, APulseProgramIsNamedWithItsOwnProcess) {
    if (!testing::PrivatePipeWire::pulseInstalled()) {
        GTEST_SKIP() << "pipewire-pulse and paplay are not installed";
    }
    server_.startPulse();
    const auto program = spawn({"paplay", server_.folder() / "silence.wav"});
    ASSERT_TRUE(until([this] { return plays(); }));
    EXPECT_EQ(sink_.opened, std::vector<std::string>{"paplay/0"});
    EXPECT_EQ(sink_.configurations[0].get<std::int64_t>("application_pid"), program.pid());
}

TEST_F(RealStreamsTest, WhoRecordsFromTheMicrophoneHoldsIt) {
    const auto program =
        spawn({"pw-record", "--target=in.microphone", server_.folder() / "recording.wav"});
    ASSERT_TRUE(until([this] { return sink_.has(HALYARD_CATEGORY_RECORD, HALYARD_TYPE_START); }));
    const Contents& start = sink_.messages[0].contents;
    EXPECT_EQ(start.get<Names>("active_devices"), Names{"in.microphone"});
    EXPECT_EQ(start.get<std::int64_t>("capture_source"), 1);
    EXPECT_EQ(start.get<std::int64_t>("capture_monitor"), 0);
}

TEST_F(RealStreamsTest, AStreamOfAnUnpluggedDeviceGoesOnOnAnother) {
    const auto player = server_.play("Music");
    ASSERT_TRUE(until([this] { return plays(); }));
    server_.run({"pw-cli", "destroy", idOf("out.speaker")});
    ASSERT_TRUE(until([this] { return playsOn("out.headphones"); }));
    EXPECT_EQ(routes(), (std::vector<std::string>{"out.speaker > out.headphones"}));
    EXPECT_EQ(sink_.opened.size(), 1U);
    EXPECT_EQ(sink_.closed, 0);
}

TEST_F(RealStreamsTest, AStreamWhoseLastDeviceIsUnpluggedStops) {
    const auto player = server_.play("Music");
    ASSERT_TRUE(until([this] { return plays(); }));
    server_.run({"pw-cli", "destroy", idOf("out.headphones")});
    server_.run({"pw-cli", "destroy", idOf("out.speaker")});
    EXPECT_TRUE(until([this] { return stopped(); }));
    EXPECT_EQ(sink_.messages.back().type, HALYARD_TYPE_STOP);
}

TEST_F(RealStreamsTest, AStreamFollowsTheDefaultDevice) {
    const auto player = spawn({"pw-play", server_.folder() / "silence.wav"});
    ASSERT_TRUE(until([this] { return plays(); }));
    server_.run({"wpctl", "set-default", idOf("out.headphones")});
    ASSERT_TRUE(until([this] { return playsOn("out.headphones"); }));
    EXPECT_EQ(routes(), (std::vector<std::string>{"out.speaker > out.headphones"}));
    EXPECT_FALSE(stopped());
}

// A tenth of a second each, a hundred at a time.
TEST_F(RealStreamsTest, NoneOfManyShortStreamsIsMissed) {
    constexpr int kStreams = 100;
    const std::string sound = server_.folder() / "short.wav";
    // The header says that there is more; players stop where the file does.
    server_.run({"sh", "-c", "head -c 19244 $0/silence.wav >" + sound, server_.folder()});
    auto programs =
        spawn({"sh", "-c", "for i in $(seq 100); do pw-play " + sound + " & done; wait"});
    EXPECT_TRUE(until([this] { return sink_.closed == kStreams; })) << sink_.closed;
    EXPECT_EQ(sink_.opened, std::vector<std::string>(kStreams, "pw-play/7"));
    EXPECT_EQ(count(HALYARD_TYPE_START), kStreams);
    EXPECT_EQ(count(HALYARD_TYPE_STOP), kStreams);
    EXPECT_EQ(programs.wait(), 0);
}

TEST_F(RealStreamsTest, ALookShowsWhoPlaysWhere) {
    const auto player = server_.play("Music");
    ASSERT_TRUE(until([this] { return plays(); }));
    const Look look = lookOnce("", std::chrono::seconds(1));
    EXPECT_TRUE(look.answered);
    EXPECT_NE(look.text.find("out.headphones  Sink"), std::string::npos);
    EXPECT_NE(look.text.find("test-player"), std::string::npos);
    EXPECT_NE(look.text.find("/48000  F32P 2ch 48000Hz"), std::string::npos) << look.text;
    EXPECT_NE(look.text.find("S16LE 2ch 48000Hz  out.speaker\n"), std::string::npos);
    EXPECT_EQ(look.text.find("silence"), std::string::npos) << "a file's name";
}

TEST_F(RealStreamsTest, ALookAtADaemonThatIsNotThereSaysSo) {
    const Look look = lookOnce("no-such-daemon", std::chrono::milliseconds(1));
    EXPECT_FALSE(look.answered);
    EXPECT_NE(look.text.find("no PipeWire answers"), std::string::npos);
}

} // namespace
} // namespace halyard::pipewire
