// What programs of several kinds do with a real daemon, and what comes of it;
// skipped where the programs are not installed.

#include <cstdlib>
#include <gtest/gtest.h>
#include <string>
#include <unistd.h>

#include "LookOnce.h"
#include "PipeWireAdapterTesting.h"

namespace halyard::pipewire {
namespace {

class RealStreamsTest : public PipeWireAdapterTest {
protected:
    static testing::Child spawn(const std::vector<std::string>& arguments) {
        return {arguments, std::string(std::getenv("XDG_RUNTIME_DIR")) + "/program.log"};
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
    EXPECT_GT(sink_.configurations[0].get<std::int64_t>("application_pid"), 0);
    EXPECT_EQ(sink_.messages[0].contents.get<Names>("active_devices"), Names{"out.speaker"});

    server_.run({"pw-link", "-d", "jack_simple_client:output1", "out.speaker:playback_FL"});
    server_.run({"pw-link", "-d", "jack_simple_client:output2", "out.speaker:playback_FR"});
    ASSERT_TRUE(until([this] { return stopped(); }));
    EXPECT_EQ(sink_.closed, 0);
    program.kill();
    EXPECT_TRUE(until([this] { return sink_.closed == 1; }));
}

TEST_F(RealStreamsTest, ALookShowsWhoPlaysWhere) {
    const auto player = server_.play("Music");
    ASSERT_TRUE(until([this] { return plays(); }));
    const Look look = lookOnce("", std::chrono::seconds(1));
    EXPECT_TRUE(look.answered);
    EXPECT_NE(look.text.find("out.headphones  Sink"), std::string::npos);
    EXPECT_NE(look.text.find("test-player"), std::string::npos);
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
