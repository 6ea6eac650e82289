#include "StreamFacts.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <string_view>
#include <utility>

#include "halyard/halyard.h"

namespace halyard::pipewire {

namespace {

struct RoleService {
    std::string_view role;
    std::uint16_t playback;
    std::uint16_t capture;
};

// PipeWire's own roles, those that its PulseAudio server makes of that system's,
// and those in use on cars and phones. Compared without regard to case.
constexpr std::array kRoles = {
    RoleService{"Accessibility", HALYARD_SERVICE_NON_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
    RoleService{"Alarm", HALYARD_SERVICE_ALARMS, HALYARD_SERVICE_GENERIC},
    RoleService{"Alert", HALYARD_SERVICE_ALERTS, HALYARD_SERVICE_GENERIC},
    RoleService{"Animation", HALYARD_SERVICE_NON_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
    RoleService{"Assistant", HALYARD_SERVICE_PARLO, HALYARD_SERVICE_PARLO},
    RoleService{"Communication", HALYARD_SERVICE_TELEPHONY, HALYARD_SERVICE_TELEPHONY},
    RoleService{"Emergency", HALYARD_SERVICE_ALERTS, HALYARD_SERVICE_GENERIC},
    RoleService{"Event", HALYARD_SERVICE_SYSTEM_SOUNDS, HALYARD_SERVICE_GENERIC},
    RoleService{"Game", HALYARD_SERVICE_NON_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
    RoleService{"Haptics", HALYARD_SERVICE_HAPTICS, HALYARD_SERVICE_GENERIC},
    RoleService{"Movie", HALYARD_SERVICE_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
    RoleService{"Multimedia", HALYARD_SERVICE_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
    RoleService{"Music", HALYARD_SERVICE_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
    RoleService{"Navigation", HALYARD_SERVICE_NON_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
    RoleService{"Notification", HALYARD_SERVICE_ALERTS, HALYARD_SERVICE_GENERIC},
    RoleService{"Phone", HALYARD_SERVICE_TELEPHONY, HALYARD_SERVICE_TELEPHONY},
    RoleService{"Ringtone", HALYARD_SERVICE_ALERTS, HALYARD_SERVICE_GENERIC},
    RoleService{"Test", HALYARD_SERVICE_TEST, HALYARD_SERVICE_TEST},
    RoleService{"Video", HALYARD_SERVICE_LONG_FORM_AUDIO, HALYARD_SERVICE_GENERIC},
};

char lower(char letter) {
    return letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter - 'A' + 'a') : letter;
}

bool equalIgnoringCase(std::string_view left, std::string_view right) {
    return std::equal(left.begin(), left.end(), right.begin(), right.end(),
                      [](char a, char b) { return lower(a) == lower(b); });
}

bool isTrue(const Properties& properties, std::string_view key) {
    const std::string value = property(properties, key);
    return value == "true" || value == "1";
}

// The first of these that somebody gives, in the order of the list.
using Source = std::pair<const Properties*, std::string_view>;
std::string firstOf(std::initializer_list<Source> sources) {
    for (const auto& [properties, key] : sources) {
        if (std::string value = property(*properties, key); !value.empty()) {
            return value;
        }
    }
    return {};
}

// A program in a sandbox knows itself by a number that means another process
// outside.
bool isSandboxed(const Properties& client) {
    const std::string access = property(client, "pipewire.access");
    return access == "flatpak" || access == "portal" ||
           client.contains("pipewire.access.portal.app_id");
}

std::optional<std::int64_t> positiveNumber(std::string_view text) {
    std::int64_t number = 0;
    const char* const end = text.data() + text.size();
    const auto [stop, error] = std::from_chars(text.data(), end, number);
    if (error != std::errc() || stop != end || number <= 0) {
        return std::nullopt;
    }
    return number;
}

} // namespace

std::string property(const Properties& properties, std::string_view key) {
    const auto found = properties.find(key);
    return found == properties.end() ? std::string() : found->second;
}

std::optional<Direction> reportedDirection(const Properties& node) {
    if (isTrue(node, "stream.monitor") || node.contains("node.link-group")) {
        return std::nullopt;
    }
    const std::string mediaClass = property(node, "media.class");
    if (mediaClass == "Stream/Output/Audio") {
        return Direction::Playback;
    }
    if (mediaClass == "Stream/Input/Audio") {
        return Direction::Capture;
    }
    return std::nullopt;
}

bool passesSound(const Properties& node) {
    return !node.contains("media.class") && property(node, "media.type") == "Audio" &&
           property(node, "media.category") == "Duplex" && !node.contains("node.link-group");
}

bool isWatched(const Properties& node) {
    return property(node, "media.class").starts_with("Stream/") || isDevice(node) ||
           passesSound(node);
}

bool isDevice(const Properties& node) {
    return property(node, "media.class").starts_with("Audio/");
}

bool givesMonitor(const Properties& device, const Properties& listener) {
    const std::string mediaClass = property(device, "media.class");
    if (mediaClass.starts_with("Audio/Sink") || mediaClass.starts_with("Audio/Source")) {
        return mediaClass.starts_with("Audio/Sink");
    }
    return isTrue(listener, "stream.capture.sink"); // it has both kinds of ports
}

std::uint16_t serviceTypeOf(const Properties& node, Direction direction) {
    const std::string role = property(node, "media.role");
    const auto known = std::find_if(kRoles.begin(), kRoles.end(), [&](const RoleService& entry) {
        return equalIgnoringCase(entry.role, role);
    });
    if (known != kRoles.end()) {
        return direction == Direction::Playback ? known->playback : known->capture;
    }
    // Desktop sound themes name the event, and often no role.
    if (direction == Direction::Playback && node.contains("event.id")) {
        return HALYARD_SERVICE_SYSTEM_SOUNDS;
    }
    return HALYARD_SERVICE_GENERIC;
}

std::string applicationName(const Properties& node, const Properties& client) {
    const std::string name = firstOf({{&node, "application.name"},
                                      {&client, "application.name"},
                                      {&node, "application.process.binary"},
                                      {&client, "application.process.binary"},
                                      {&node, "node.name"}});
    return name.empty() ? "Unknown" : name;
}

std::string processName(const Properties& node, const Properties& client) {
    return firstOf(
        {{&node, "application.process.binary"}, {&client, "application.process.binary"}});
}

bool viaServer(const Properties& node, const Properties& client) {
    return firstOf({{&node, "client.api"}, {&client, "client.api"}}) == "pipewire-pulse";
}

std::optional<std::int64_t> processId(const Properties& node, const Properties& client) {
    const std::string said =
        firstOf({{&node, "application.process.id"}, {&client, "application.process.id"}});
    const bool numbersAreOurs = !isSandboxed(client);
    if (viaServer(node, client)) {
        const bool near =
            firstOf({{&node, "pulse.server.type"}, {&client, "pulse.server.type"}}) != "tcp";
        return near && numbersAreOurs ? positiveNumber(said) : std::nullopt;
    }
    if (property(client, "pipewire.access") == "portal") {
        return std::nullopt; // the socket is the portal's, and so is its process
    }
    const auto known = positiveNumber(property(client, "pipewire.sec.pid"));
    return known || !numbersAreOurs ? known : positiveNumber(said);
}

std::optional<double> bufferSeconds(const Properties& node, const std::string& format) {
    const auto bytes = positiveNumber(property(node, "pulse.attr.tlength"));
    std::array<char, 32> encoding{};
    unsigned channels = 0;
    unsigned rate = 0;
    if (!bytes ||
        std::sscanf(format.c_str(), "%31s %uch %uHz", encoding.data(), &channels, &rate) != 3) {
        return std::nullopt;
    }
    // "S24_32LE" is 32 bits wide; "ALAW" is 8.
    const std::string_view name = encoding.data();
    const std::size_t last = name.find_last_of("0123456789");
    const std::size_t before =
        last == std::string_view::npos ? last : name.find_last_not_of("0123456789", last);
    const std::size_t first = before == std::string_view::npos ? 0 : before + 1;
    const auto bits =
        last == std::string_view::npos ? 8 : positiveNumber(name.substr(first, last + 1 - first));
    const double second = static_cast<double>(bits.value_or(8)) / 8 * channels * rate;
    return second > 0 ? std::optional(static_cast<double>(*bytes) / second) : std::nullopt;
}

double perceivedVolume(float linearVolume) {
    if (!(linearVolume > 0)) {
        return 0;
    }
    // Four digits: what a slider can set, without the noise of the cube.
    const double volume = std::min(1.0, std::cbrt(static_cast<double>(linearVolume)));
    return std::round(volume * 10000) / 10000;
}

} // namespace halyard::pipewire
