// What the tests of the tracker share: a sink that writes down what it is told, and
// a graph of devices and streams that is scripted event by event.
#pragma once

#include <fmt/core.h>
#include <gtest/gtest.h>
#include <string>
#include <utility>
#include <vector>

#include "StreamTracker.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {

inline constexpr std::int64_t kFirstID = 1000;
inline constexpr ObjectId kClient = 5;
inline constexpr ObjectId kSpeaker = 10;
inline constexpr ObjectId kHeadphones = 11;
inline constexpr ObjectId kMicrophone = 12;
inline constexpr ObjectId kStream = 20;

// Writes down what the tracker does: "open 1000 7", "Volume 0.4 playing", ...
class ScriptSink final : public SessionSink {
public:
    void open(std::int64_t id, std::uint16_t service, const Contents& configuration) override {
        lines.push_back("open " + std::to_string(id) + " " + std::to_string(service));
        configurations.push_back(configuration);
    }
    void send(std::int64_t, const Message& message) override {
        lines.push_back(textOf(message));
        messages.push_back(message);
    }
    void close(std::int64_t id) override { lines.push_back("close " + std::to_string(id)); }

    std::vector<std::string> takeLines() { return std::exchange(lines, {}); }
    const Message& last() const { return messages.back(); }

    std::vector<std::string> lines;
    std::vector<Contents> configurations;
    std::vector<Message> messages;

private:
    static std::string textOf(const Message& message) {
        switch (message.category) {
        case HALYARD_CATEGORY_VOLUME:
            return "volume " + fmt::format("{}", message.contents.get<double>("VQSessionVolume")) +
                   (message.contents.get<std::int64_t>("VQSessionVolumePlayingState") != 0
                        ? " playing"
                        : " silent");
        case HALYARD_CATEGORY_ROUTE_CHANGE:
            return "route " + devices(message);
        default:
            return (message.category == HALYARD_CATEGORY_RECORD ? "record " : "playback ") +
                   std::string(message.type == HALYARD_TYPE_START ? "start" : "stop");
        }
    }
    static std::string devices(const Message& message) {
        std::string text;
        for (const std::string& name : message.contents.get<Names>("active_devices")) {
            text += (text.empty() ? "" : "+") + name;
        }
        return text;
    }
};

using Lines = std::vector<std::string>;

class StreamTrackerTest : public testing::Test {
protected:
    StreamTrackerTest() {
        device(kSpeaker, "out.speaker");
        device(kHeadphones, "out.headphones");
        tracker_.handle(ClientChanged{
            kClient, {{"application.name", "Player"}, {"application.process.id", "42"}}});
    }

    void device(ObjectId id, const char* name) {
        tracker_.handle(NodeChanged{id, {{"media.class", "Audio/Sink"}, {"node.name", name}}});
    }
    void stream(ObjectId id = kStream, const char* mediaClass = "Stream/Output/Audio") {
        tracker_.handle(NodeChanged{id,
                                    {{"media.class", mediaClass},
                                     {"media.role", "Music"},
                                     {"node.name", "pw-play"},
                                     {"client.id", std::to_string(kClient)}}});
    }
    // The node of a JACK program, which runs at once.
    void jack(ObjectId id = kStream) {
        tracker_.handle(NodeChanged{id,
                                    {{"media.type", "Audio"},
                                     {"media.category", "Duplex"},
                                     {"media.role", "DSP"},
                                     {"node.name", "synth"},
                                     {"client.id", std::to_string(kClient)}}});
        state(NodeState::Running, id);
    }
    void microphone() {
        tracker_.handle(NodeChanged{
            kMicrophone, {{"media.class", "Audio/Source"}, {"node.name", "in.microphone"}}});
    }
    void state(NodeState state, ObjectId id = kStream) {
        tracker_.handle(NodeStateChanged{id, state});
    }
    void volume(float linear, bool muted = false, ObjectId id = kStream) {
        tracker_.handle(NodeVolumeChanged{id, linear, muted});
    }
    void format(const char* text) { tracker_.handle(NodeFormatChanged{kStream, text}); }
    void link(ObjectId id, ObjectId from, ObjectId to) { tracker_.handle(LinkAdded{id, from, to}); }
    void remove(ObjectId id) { tracker_.handle(ObjectRemoved{id}); }
    void settle() { tracker_.handle(Settled{}); }

    // A stream that plays to the speaker at full volume; forgets how it began.
    void play() {
        stream();
        format("F32LE 2ch 48000Hz");
        link(30, kStream, kSpeaker);
        link(31, kStream, kSpeaker);
        state(NodeState::Running);
        settle();
        sink_.takeLines();
    }

    ScriptSink sink_;
    StreamTracker tracker_{sink_, kFirstID};
};

} // namespace halyard::pipewire
