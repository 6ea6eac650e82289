#include "NodeParams.h"

#include <algorithm>
#include <array>
#include <fmt/core.h>
#include <string_view>

#include "PipeWireHeaders.h"

namespace halyard::pipewire {

namespace {

std::string shortName(const spa_type_info* types, std::uint32_t type) {
    const char* const name = spa_debug_type_find_name(types, type);
    if (name == nullptr) {
        return "unknown";
    }
    const std::string_view text = name;
    return std::string(text.substr(text.rfind(':') + 1));
}

std::optional<float> loudestChannel(const spa_pod* channels) {
    std::array<float, SPA_AUDIO_MAX_CHANNELS> volumes{};
    const std::uint32_t count =
        spa_pod_copy_array(channels, SPA_TYPE_Float, volumes.data(), volumes.size());
    if (count == 0) {
        return std::nullopt;
    }
    return *std::max_element(volumes.begin(), volumes.begin() + count);
}

} // namespace

VolumeUpdate readVolume(const spa_pod* props) {
    VolumeUpdate update;
    if (props == nullptr || !spa_pod_is_object(props)) {
        return update;
    }
    if (const spa_pod_prop* mute = spa_pod_find_prop(props, nullptr, SPA_PROP_mute)) {
        bool muted = false;
        if (spa_pod_get_bool(&mute->value, &muted) == 0) {
            update.muted = muted;
        }
    }
    if (const spa_pod_prop* channels = spa_pod_find_prop(props, nullptr, SPA_PROP_channelVolumes)) {
        update.linearVolume = loudestChannel(&channels->value);
    }
    const spa_pod_prop* const single = spa_pod_find_prop(props, nullptr, SPA_PROP_volume);
    float volume = 1;
    if (!update.linearVolume && single != nullptr &&
        spa_pod_get_float(&single->value, &volume) == 0) {
        update.linearVolume = volume;
    }
    return update;
}

std::string readFormat(const spa_pod* format) {
    std::uint32_t type = 0;
    std::uint32_t subtype = 0;
    if (format == nullptr || spa_format_parse(format, &type, &subtype) < 0 ||
        type != SPA_MEDIA_TYPE_audio) {
        return {};
    }
    if (subtype != SPA_MEDIA_SUBTYPE_raw) {
        return shortName(spa_type_media_subtype, subtype);
    }
    spa_audio_info_raw raw{};
    if (spa_format_audio_raw_parse(format, &raw) < 0) {
        return {};
    }
    return fmt::format("{} {}ch {}Hz", shortName(spa_type_audio_format, raw.format), raw.channels,
                       raw.rate);
}

Properties readProperties(const spa_dict* dictionary) {
    Properties properties;
    if (dictionary != nullptr) {
        for (std::uint32_t i = 0; i < dictionary->n_items; ++i) {
            const spa_dict_item& item = dictionary->items[i];
            if (item.key != nullptr && item.value != nullptr) {
                properties.insert_or_assign(item.key, item.value);
            }
        }
    }
    return properties;
}

} // namespace halyard::pipewire
