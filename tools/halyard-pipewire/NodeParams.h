// Reads what PipeWire tells of a node as parameter objects. Pure functions.
#pragma once

#include <optional>
#include <string>

struct spa_pod;
struct spa_dict;

#include "GraphEvents.h"

namespace halyard::pipewire {

struct VolumeUpdate {
    std::optional<float> linearVolume; // of the loudest channel
    std::optional<bool> muted;
};

// Empty fields for what `props` does not say.
[[nodiscard]] VolumeUpdate readVolume(const spa_pod* props);

// "F32LE 2ch 48000Hz"; what is not raw sound by its kind, "iec958". Empty when
// it is no format.
[[nodiscard]] std::string readFormat(const spa_pod* format);

[[nodiscard]] Properties readProperties(const spa_dict* dictionary);

} // namespace halyard::pipewire
