// Against a real daemon; skipped where PipeWire is not installed.

#include "PipeWireAdapterTesting.h"

#include <csignal>
#include <gtest/gtest.h>
#include <string>

namespace halyard::pipewire {
namespace {

using namespace std::chrono_literals;

TEST_F(PipeWireAdapterTest, APlayersStreamIsASession) {
    auto player = server_.play("Music");
    ASSERT_TRUE(until([this] { return plays(); }));
    EXPECT_EQ(sink_.opened, std::vector<std::string>{"test-player/7"});
    EXPECT_GT(sink_.configurations[0].get<std::int64_t>("application_pid"), 0);
    const Contents& start = sink_.messages[0].contents;
    EXPECT_EQ(start.get<Names>("active_devices"), Names{"out.speaker"});
    EXPECT_EQ(start.get<std::string>("session_selected_format"), "S16LE 2ch 48000Hz");
    EXPECT_TRUE(sink_.hasVolume(1, 1));

    player.kill();
    ASSERT_TRUE(until([this] { return sink_.closed == 1; }));
    EXPECT_TRUE(sink_.hasVolume(1, 0));
    EXPECT_TRUE(sink_.has(HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_STOP));
}

TEST_F(PipeWireAdapterTest, VolumeAndMuteAreHeardOfStreamAndDevice) {
    const auto player = server_.play("Music");
    ASSERT_TRUE(until([this] { return plays(); }));
    server_.run({"wpctl", "set-volume", idOf("pw-play"), "0.4"});
    EXPECT_TRUE(until([this] { return sink_.hasVolume(0.4, 1); }));
    server_.run({"wpctl", "set-volume", idOf("out.speaker"), "0.5"});
    EXPECT_TRUE(until([this] { return sink_.hasVolume(0.2, 1); }));
    server_.run({"wpctl", "set-mute", idOf("pw-play"), "1"});
    EXPECT_TRUE(until([this] { return sink_.hasVolume(0, 1); }));
}

TEST_F(PipeWireAdapterTest, AMoveToAnotherDeviceChangesTheRouteOnce) {
    const auto player = server_.play("Music");
    ASSERT_TRUE(until([this] { return plays(); }));
    server_.run(
        {"pw-metadata", idOf("pw-play"), "target.object", serialOf("out.headphones"), "Spa:Id"});
    ASSERT_TRUE(until([this] { return sink_.has(HALYARD_CATEGORY_ROUTE_CHANGE, 3); }));
    const Message& last = sink_.messages.back();
    EXPECT_EQ(last.category, std::uint32_t{HALYARD_CATEGORY_VOLUME});
    EXPECT_EQ(last.contents.get<Names>("active_devices"), Names{"out.headphones"});
    EXPECT_FALSE(sink_.has(HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_STOP));
}

TEST_F(PipeWireAdapterTest, ARecorderRecords) {
    const auto recorder = server_.record();
    ASSERT_TRUE(until([this] { return sink_.has(HALYARD_CATEGORY_RECORD, HALYARD_TYPE_START); }));
    EXPECT_EQ(sink_.opened, std::vector<std::string>{"test-recorder/0"});
    const Contents& start = sink_.messages[0].contents;
    EXPECT_EQ(start.get<Names>("active_devices"), Names{"out.speaker"});
    EXPECT_EQ(start.get<std::int64_t>("capture_monitor"), 1);
    EXPECT_EQ(start.get<std::int64_t>("capture_source"), 0);
}

TEST_F(PipeWireAdapterTest, ADaemonThatComesBackIsFoundAgain) {
    auto player = server_.play("Communication");
    ASSERT_TRUE(until([this] { return plays(); }));
    server_.stop();
    player.kill();
    ASSERT_TRUE(until([this] { return lost_; }));
    EXPECT_EQ(sink_.closed, 1);
    EXPECT_FALSE(adapter_->connected());

    nodes_.clear();
    server_.start();
    ASSERT_TRUE(until([this] { return nodes_.contains("out.speaker"); }));
    const auto again = server_.play("Communication");
    ASSERT_TRUE(until([this] { return sink_.opened.size() == 2; }));
    EXPECT_EQ(sink_.opened[1], "test-player/2");
}

TEST_F(PipeWireAdapterTest, PostedWorkRunsInTheLoop) {
    bool ran = false;
    adapter_->post([&] { ran = true; });
    EXPECT_FALSE(ran);
    EXPECT_TRUE(until([&] { return ran; }));
}

TEST_F(PipeWireAdapterTest, ASignalEndsTheLoop) {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGUSR1);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    adapter_->quitOnSignal(SIGUSR1);
    raise(SIGUSR1); // to this thread, which keeps it for the loop
    adapter_->run();
}

} // namespace
} // namespace halyard::pipewire
