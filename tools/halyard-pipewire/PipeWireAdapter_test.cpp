// Against a real daemon; skipped where PipeWire is not installed.

#include "PipeWireAdapter.h"

#include <algorithm>
#include <csignal>
#include <gtest/gtest.h>
#include <map>
#include <string>
#include <vector>

#include "PipeWireTesting.h"
#include "StreamTracker.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {
namespace {

using namespace std::chrono_literals;

class KeepingSink final : public SessionSink {
public:
    void open(std::int64_t, std::uint16_t service, const Contents& configuration) override {
        opened.push_back(configuration.get<std::string>("HostApplicationDisplayID") + "/" +
                         std::to_string(service));
        configurations.push_back(configuration);
    }
    void send(std::int64_t, const Message& message) override { messages.push_back(message); }
    void close(std::int64_t) override { ++closed; }

    bool has(std::uint32_t category, std::uint16_t type) const {
        return std::any_of(messages.begin(), messages.end(), [&](const Message& message) {
            return message.category == category && message.type == type;
        });
    }
    bool hasVolume(double volume, std::int64_t playing) const {
        return std::any_of(messages.begin(), messages.end(), [&](const Message& message) {
            return message.contents.get<double>("VQSessionVolume") == volume &&
                   message.contents.get<std::int64_t>("VQSessionVolumePlayingState") == playing;
        });
    }

    std::vector<std::string> opened;
    std::vector<Contents> configurations;
    std::vector<Message> messages;
    int closed = 0;
};

class PipeWireAdapterTest : public ::testing::Test {
protected:
    void SetUp() override {
        if (!testing::PrivatePipeWire::installed()) {
            GTEST_SKIP() << "pipewire, wireplumber, pw-play and wpctl are not installed";
        }
        server_.start();
        adapter_ = std::make_unique<PipeWireAdapter>(PipeWireAdapter::Options{},
                                                     [this](const GraphEvent& event) {
                                                         remember(event);
                                                         tracker_.handle(event);
                                                     });
        ASSERT_TRUE(until([this] { return nodes_.contains("out.headphones"); }));
    }

    void remember(const GraphEvent& event) {
        if (const auto* node = std::get_if<NodeChanged>(&event)) {
            nodes_[property(node->properties, "node.name")] = *node;
        }
        lost_ = lost_ || std::holds_alternative<Disconnected>(event);
    }

    // Runs the loop until `done`; false when that takes too long.
    template <class Done> bool until(Done done) {
        const auto deadline = std::chrono::steady_clock::now() + 20s;
        while (!done()) {
            if (std::chrono::steady_clock::now() > deadline) {
                return false;
            }
            adapter_->iterate(100ms);
        }
        return true;
    }

    std::string idOf(const std::string& node) { return std::to_string(nodes_[node].id); }
    std::string serialOf(const std::string& node) {
        return property(nodes_[node].properties, "object.serial");
    }
    bool plays() const { return sink_.has(HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START); }

    testing::PrivatePipeWire server_;
    KeepingSink sink_;
    StreamTracker tracker_{sink_, 1};
    std::map<std::string, NodeChanged> nodes_;
    bool lost_ = false;
    std::unique_ptr<PipeWireAdapter> adapter_;
};

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
    EXPECT_EQ(sink_.messages[0].contents.get<Names>("active_devices"), Names{"out.speaker"});
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
