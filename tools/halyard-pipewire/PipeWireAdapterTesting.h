// What tests against a real daemon share: a sink that keeps what it is told, and a
// tracker that watches a daemon of the test's own.
#pragma once

#include <algorithm>
#include <chrono>
#include <gtest/gtest.h>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "PipeWireAdapter.h"
#include "PipeWireTesting.h"
#include "StreamTracker.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {

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
        // Devices have no ports before the session manager has seen to them.
        server_.run({"sh", "-c",
                     "until pw-link -i | grep -q headphones:playback_FR &&"
                     " pw-link -i | grep -q speaker:playback_FR; do sleep 0.02; done"});
    }

    void remember(const GraphEvent& event) {
        if (const auto* node = std::get_if<NodeChanged>(&event)) {
            nodes_[property(node->properties, "node.name")] = *node;
        }
        lost_ = lost_ || std::holds_alternative<Disconnected>(event);
    }

    // Runs the loop until `done`; false when that takes too long.
    template <class Done> bool until(Done done) {
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
        while (!done()) {
            if (std::chrono::steady_clock::now() > deadline) {
                return false;
            }
            adapter_->iterate(std::chrono::milliseconds(100));
        }
        return true;
    }

    std::string idOf(const std::string& node) { return std::to_string(nodes_[node].id); }
    std::string serialOf(const std::string& node) {
        return property(nodes_[node].properties, "object.serial");
    }
    bool stopped() const { return sink_.has(HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_STOP); }
    bool plays() const { return sink_.has(HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START); }

    testing::PrivatePipeWire server_;
    KeepingSink sink_;
    StreamTracker tracker_{sink_, 1};
    std::map<std::string, NodeChanged> nodes_;
    bool lost_ = false;
    std::unique_ptr<PipeWireAdapter> adapter_;
};

} // namespace halyard::pipewire
