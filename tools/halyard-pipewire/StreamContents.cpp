#include "StreamContents.h"

#include "halyard/halyard.h"

namespace halyard::pipewire {

namespace {

constexpr const char* kFormat = "session_selected_format";
constexpr const char* kActiveDevices = "active_devices";
constexpr const char* kPreviousDevices = "previous_devices";
// From what is captured: what a device hears, or what others play on one.
constexpr const char* kCaptureSource = "capture_source";
constexpr const char* kCaptureMonitor = "capture_monitor";
constexpr const char* kVolume = "VQSessionVolume";
constexpr const char* kPlayingState = "VQSessionVolumePlayingState";
constexpr const char* kVolumeProcess = "VQSessionVolumeOperationProcess";
constexpr const char* kStreamMuted = "stream_muted";
constexpr const char* kDeviceMuted = "device_muted";
// Counts a session's runs, so that the second start is no repeat of the first.
constexpr const char* kRun = "stream_run";
constexpr const char* kUnreported = "glitches_unreported";
// What became of a stream's program when the stream went.
constexpr const char* kProgram = "stream_program";

Names listOf(const std::set<std::string>& names) {
    return Names(names.begin(), names.end());
}

void addText(Contents& contents, const char* key, const std::string& text) {
    if (!text.empty()) {
        contents.add(key, text);
    }
}

void addWhere(Contents& contents, const Surroundings& surroundings) {
    addText(contents, kFormat, surroundings.format);
    if (!surroundings.devices.empty()) {
        contents.add(kActiveDevices, listOf(surroundings.devices));
    }
}

void addCapture(Contents& contents, const Surroundings& surroundings) {
    if (surroundings.hears || surroundings.monitors) {
        contents.add(kCaptureSource, std::int64_t{surroundings.hears});
        contents.add(kCaptureMonitor, std::int64_t{surroundings.monitors});
    }
}

} // namespace

std::uint32_t categoryOf(Direction direction) {
    return direction == Direction::Playback ? HALYARD_CATEGORY_PLAYBACK : HALYARD_CATEGORY_RECORD;
}

Contents configurationOf(const Properties& node, const Properties& client, Direction direction) {
    Contents configuration;
    configuration.add("HostApplicationDisplayID", applicationName(node, client));
    if (const auto pid = processId(node, client)) {
        configuration.add("application_pid", *pid);
    }
    addText(configuration, "application_binary", processName(node, client));
    addText(configuration, "media_role", property(node, "media.role"));
    addText(configuration, "node_name", property(node, "node.name"));
    configuration.add("stream_direction",
                      direction == Direction::Playback ? "playback" : "capture");
    return configuration;
}

Contents startContents(std::int64_t run, const Surroundings& surroundings) {
    Contents contents{{kRun, run}};
    addWhere(contents, surroundings);
    addCapture(contents, surroundings);
    return contents;
}

Contents stopContents(std::int64_t run, const StreamEnd& end) {
    Contents contents{{kRun, run}};
    if (end.unreported != 0) {
        contents.add(kUnreported, static_cast<std::int64_t>(end.unreported));
    }
    if (end.program != nullptr) {
        contents.add(kProgram, std::string(end.program));
    }
    return contents;
}

Contents routeContents(const std::set<std::string>& previous, const Surroundings& surroundings) {
    Contents contents{{kPreviousDevices, listOf(previous)}};
    addWhere(contents, surroundings);
    addCapture(contents, surroundings);
    return contents;
}

Contents volumeContents(double volume, bool playing, const std::string& process,
                        const Surroundings& surroundings) {
    Contents contents{
        {kVolume, volume}, {kPlayingState, std::int64_t{playing}}, {kVolumeProcess, process}};
    addWhere(contents, surroundings);
    contents.add(kStreamMuted, std::int64_t{surroundings.streamMuted});
    if (!surroundings.devices.empty()) {
        contents.add(kDeviceMuted, std::int64_t{surroundings.devicesMuted});
    }
    return contents;
}

} // namespace halyard::pipewire
