// Where the exporter finds the daemon's store and configuration, and keeps its own place.
//
// Any thread.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>

#include "linux/system/Directories.h"

namespace halyard::exporting {

struct Places {
    std::filesystem::path store;         // the daemon's state directory
    std::filesystem::path configuration; // the daemon's
    std::filesystem::path own;           // of export.db
};

// `state`: the daemon's state directory where it was named. Without that it is the
// system's where there is one, else that of an ordinary user; the configuration goes with
// it. Its own is STATE_DIRECTORY, else beside the others.
Result<Places> placesOf(const std::optional<std::string>& state,
                        const linux_::Environment& environment, std::uint32_t uid,
                        const std::filesystem::path& system = "/var/lib/halyard");

} // namespace halyard::exporting
