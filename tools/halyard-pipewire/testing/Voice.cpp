#include "Voice.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <stdexcept>

#include "PipeWireHeaders.h"

namespace halyard::glitching {

namespace {

constexpr std::uint32_t kChannels = 2;
constexpr std::uint32_t kFrame = kChannels * sizeof(float);

pw_properties* toProperties(const std::map<std::string, std::string>& values) {
    pw_properties* const properties = pw_properties_new(nullptr, nullptr);
    for (const auto& [key, value] : values) {
        pw_properties_set(properties, key.c_str(), value.c_str());
    }
    return properties;
}

template <class State> Activity toActivity(State state) {
    constexpr int kPaused = 2;
    return state < kPaused ? Activity::None
                           : (state == kPaused ? Activity::Paused : Activity::Running);
}

void require(bool holds, const char* what) {
    if (!holds) {
        throw std::runtime_error(what);
    }
}

class Stream final : public Voice {
public:
    Stream(pw_core* core, const Options& options, VoiceListener& listener)
        : listener_(listener), capture_(options.capture),
          stream_(pw_stream_new(core, "sound", toProperties(options.properties))) {
        require(stream_ != nullptr, "no stream");
        pw_stream_add_listener(stream_, &hook_, &kEvents, this);
        auto flags = PW_STREAM_FLAG_AUTOCONNECT | PW_STREAM_FLAG_MAP_BUFFERS |
                     PW_STREAM_FLAG_RT_PROCESS | (options.paused ? PW_STREAM_FLAG_INACTIVE : 0);
        std::array<std::uint8_t, 1024> memory{};
        spa_pod_builder builder{};
        spa_pod_builder_init(&builder, memory.data(), memory.size());
        spa_audio_info_raw sound{};
        sound.format = SPA_AUDIO_FORMAT_F32;
        sound.rate = 48000;
        sound.channels = kChannels;
        sound.position[0] = SPA_AUDIO_CHANNEL_FL;
        sound.position[1] = SPA_AUDIO_CHANNEL_FR;
        const spa_pod* format = spa_format_audio_raw_build(&builder, SPA_PARAM_EnumFormat, &sound);
        require(pw_stream_connect(stream_, capture_ ? PW_DIRECTION_INPUT : PW_DIRECTION_OUTPUT,
                                  PW_ID_ANY, static_cast<pw_stream_flags>(flags), &format, 1) >= 0,
                "the stream does not connect");
    }
    ~Stream() override { pw_stream_destroy(stream_); }

    void setActive(bool active) override { pw_stream_set_active(stream_, active); }
    void setProperty(const std::string& key, const std::string& value) override {
        const spa_dict_item item{key.c_str(), value.c_str()};
        const spa_dict dict{0, 1, &item};
        pw_stream_update_properties(stream_, &dict);
    }
    Activity activity() const override { return toActivity(pw_stream_get_state(stream_, nullptr)); }
    std::uint32_t nodeId() const override { return pw_stream_get_node_id(stream_); }

private:
    static void onState(void* data, pw_stream_state, pw_stream_state, const char*) {
        static_cast<Stream*>(data)->listener_.activityChanged();
    }
    static void onProcess(void* data) {
        auto& self = *static_cast<Stream*>(data);
        self.listener_.cycle();
        self.transfer();
    }

    // Silence out, or whatever came in nowhere.
    void transfer() {
        pw_buffer* const buffer = pw_stream_dequeue_buffer(stream_);
        if (buffer == nullptr) {
            return;
        }
        spa_data& data = buffer->buffer->datas[0];
        if (!capture_ && data.data != nullptr) {
            const auto most = data.maxsize / kFrame;
            const auto wanted = static_cast<std::uint32_t>(buffer->requested);
            const auto frames = wanted == 0 ? most : std::min(wanted, most);
            std::memset(data.data, 0, std::size_t{frames} * kFrame);
            data.chunk->offset = 0;
            data.chunk->stride = kFrame;
            data.chunk->size = frames * kFrame;
        }
        pw_stream_queue_buffer(stream_, buffer);
    }

    static const pw_stream_events kEvents;

    VoiceListener& listener_;
    const bool capture_;
    pw_stream* stream_;
    spa_hook hook_{};
};

const pw_stream_events Stream::kEvents = [] {
    pw_stream_events events{};
    events.version = PW_VERSION_STREAM_EVENTS;
    events.state_changed = onState;
    events.process = onProcess;
    return events;
}();

class Filter final : public Voice {
public:
    Filter(pw_core* core, const Options& options, VoiceListener& listener)
        : listener_(listener), capture_(options.capture),
          filter_(pw_filter_new(core, "sound", toProperties(options.properties))) {
        require(filter_ != nullptr, "no filter");
        pw_filter_add_listener(filter_, &hook_, &kEvents, this);
        for (std::uint32_t channel = 0; channel < kChannels; ++channel) {
            addPort(channel);
        }
        const auto flags =
            PW_FILTER_FLAG_RT_PROCESS | (options.paused ? PW_FILTER_FLAG_INACTIVE : 0);
        require(pw_filter_connect(filter_, static_cast<pw_filter_flags>(flags), nullptr, 0) >= 0,
                "the filter does not connect");
    }
    ~Filter() override { pw_filter_destroy(filter_); }

    void setActive(bool active) override { pw_filter_set_active(filter_, active); }
    void setProperty(const std::string& key, const std::string& value) override {
        const spa_dict_item item{key.c_str(), value.c_str()};
        const spa_dict dict{0, 1, &item};
        pw_filter_update_properties(filter_, nullptr, &dict);
    }
    Activity activity() const override { return toActivity(pw_filter_get_state(filter_, nullptr)); }
    std::uint32_t nodeId() const override { return pw_filter_get_node_id(filter_); }

private:
    void addPort(std::uint32_t channel) {
        const std::string name = (capture_ ? "in_" : "out_") + std::to_string(channel + 1);
        ports_[channel] =
            pw_filter_add_port(filter_, capture_ ? PW_DIRECTION_INPUT : PW_DIRECTION_OUTPUT,
                               PW_FILTER_PORT_FLAG_MAP_BUFFERS, sizeof(void*),
                               toProperties({{PW_KEY_FORMAT_DSP, "32 bit float mono audio"},
                                             {PW_KEY_PORT_NAME, name}}),
                               nullptr, 0);
        require(ports_[channel] != nullptr, "no port");
    }
    static void onState(void* data, pw_filter_state, pw_filter_state, const char*) {
        static_cast<Filter*>(data)->listener_.activityChanged();
    }
    static void onProcess(void* data, spa_io_position* position) {
        auto& self = *static_cast<Filter*>(data);
        self.listener_.cycle();
        const auto frames = static_cast<std::uint32_t>(position->clock.duration);
        for (void* const port : self.ports_) {
            void* const sound = pw_filter_get_dsp_buffer(port, frames);
            if (sound != nullptr && !self.capture_) {
                std::memset(sound, 0, frames * sizeof(float));
            }
        }
    }

    static const pw_filter_events kEvents;

    VoiceListener& listener_;
    const bool capture_;
    pw_filter* filter_;
    spa_hook hook_{};
    std::array<void*, kChannels> ports_{};
};

const pw_filter_events Filter::kEvents = [] {
    pw_filter_events events{};
    events.version = PW_VERSION_FILTER_EVENTS;
    events.state_changed = onState;
    events.process = onProcess;
    return events;
}();

} // namespace

std::unique_ptr<Voice> Voice::make(pw_core* core, const Options& options, VoiceListener& listener) {
    if (options.filter) {
        return std::make_unique<Filter>(core, options, listener);
    }
    return std::make_unique<Stream>(core, options, listener);
}

} // namespace halyard::glitching
