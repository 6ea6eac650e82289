// Where the daemon keeps what: the four directories, resolved once at start.
//
// Any thread.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "common/Result.h"

namespace halyard::linux_ {

// None when the variable is not set.
using Environment = std::function<std::optional<std::string>(std::string_view name)>;

// The process's own environment.
[[nodiscard]] std::optional<std::string> processEnvironment(std::string_view name);

struct Directories {
    std::filesystem::path configuration;
    std::filesystem::path state;
    std::filesystem::path runtime;
    std::filesystem::path logs;

    bool operator==(const Directories&) const = default;

    // Where a path that the service's own constants name is on this system:
    // below `logs` when it is one of the audio logs, else what it was.
    [[nodiscard]] std::filesystem::path mapped(const std::filesystem::path& path) const;
};

// One of them alone, for who needs no more: as resolveDirectories has it.
Result<std::filesystem::path> resolveDirectory(std::filesystem::path Directories::*which,
                                               const Environment& environment, std::uint32_t uid);

// Each directory as the service manager set it; else, for root (`uid` 0), the
// system's; else the user's own. An unset and an empty variable are the same.
Result<Directories> resolveDirectories(const Environment& environment, std::uint32_t uid);

// Makes state, runtime and logs directory where they are missing; the
// configuration is the operator's. The runtime directory is 0755, or gets what
// it lacks of that: who may connect is not decided by its mode.
Result<void> createDirectories(const Directories& directories);

} // namespace halyard::linux_
