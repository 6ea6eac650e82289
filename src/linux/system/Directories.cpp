#include "linux/system/Directories.h"

#include <algorithm>
#include <cstdlib>
#include <fmt/format.h>
#include <sys/stat.h>
#include <system_error>

namespace halyard::linux_ {
namespace {

// The common part of the service's directory constants.
constexpr std::string_view kAudioLogs =
    "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio";

constexpr mode_t kPrivateMode = 0750;
constexpr mode_t kRuntimeMode = 0755;

struct Place {
    std::filesystem::path Directories::*member;
    const char* managerVariable;
    const char* systemPath;
    const char* userVariable;
    const char* homeFallback; // below $HOME; null when there is none
    const char* userPath;     // below what userVariable names
};

constexpr Place kPlaces[] = {
    {&Directories::configuration, "CONFIGURATION_DIRECTORY", "/etc/halyard", "XDG_CONFIG_HOME",
     ".config", "halyard"},
    {&Directories::state, "STATE_DIRECTORY", "/var/lib/halyard", "XDG_STATE_HOME", ".local/state",
     "halyard"},
    {&Directories::runtime, "RUNTIME_DIRECTORY", "/run/halyard", "XDG_RUNTIME_DIR", nullptr,
     "halyard"},
    {&Directories::logs, "LOGS_DIRECTORY", "/var/log/halyard", "XDG_STATE_HOME", ".local/state",
     "halyard/log"},
};

std::optional<std::string> nonEmpty(const Environment& environment, const char* name) {
    std::optional<std::string> value = environment(name);
    return value && !value->empty() ? value : std::nullopt;
}

// A user's base directory that is no absolute path counts as not set.
std::optional<std::filesystem::path> absolutePath(const Environment& environment,
                                                  const char* name) {
    const auto value = nonEmpty(environment, name);
    return value && value->front() == '/' ? std::optional(std::filesystem::path(*value))
                                          : std::nullopt;
}

Failure noDirectory(std::string why) {
    return {{}, std::move(why)};
}

Result<std::filesystem::path> userDirectory(const Place& place, const Environment& environment) {
    if (const auto base = absolutePath(environment, place.userVariable)) {
        return *base / place.userPath;
    }
    if (place.homeFallback == nullptr) {
        return noDirectory(
            fmt::format("no runtime directory: neither {} nor {} is set to an absolute path",
                        place.managerVariable, place.userVariable));
    }
    if (const auto home = absolutePath(environment, "HOME")) {
        return *home / place.homeFallback / place.userPath;
    }
    return noDirectory(fmt::format("none of {}, {} and HOME is set to an absolute path",
                                   place.managerVariable, place.userVariable));
}

Result<std::filesystem::path> resolve(const Place& place, const Environment& environment,
                                      std::uint32_t uid) {
    if (const auto managed = nonEmpty(environment, place.managerVariable)) {
        // A unit with several directories gets them all, colons between.
        const std::filesystem::path first(managed->substr(0, managed->find(':')));
        if (first.is_absolute()) {
            return first;
        }
        return noDirectory(
            fmt::format("{} is no absolute path: {}", place.managerVariable, *managed));
    }
    if (uid == 0) {
        return std::filesystem::path(place.systemPath);
    }
    return userDirectory(place, environment);
}

Failure cannotMake(const std::filesystem::path& path) {
    return Failure::ofErrno("cannot make directory " + path.native());
}

// Like mkdir -p; whatever is made gets `mode`, whatever the umask says.
Result<void> makeDirectory(const std::filesystem::path& path, mode_t mode) {
    std::error_code ignored;
    if (std::filesystem::is_directory(path, ignored)) {
        return {};
    }
    if (path.has_parent_path() && path.parent_path() != path) {
        if (auto parent = makeDirectory(path.parent_path(), mode); !parent.ok()) {
            return parent;
        }
    }
    if (::mkdir(path.c_str(), mode) == 0) {
        return ::chmod(path.c_str(), mode) == 0 ? Result<void>() : cannotMake(path);
    }
    const Failure failure = cannotMake(path);
    // Somebody else may have been quicker.
    return std::filesystem::is_directory(path, ignored) ? Result<void>() : failure;
}

// Only adds to the mode: the directory may be one that others share.
Result<void> openToClients(const std::filesystem::path& path) {
    struct stat facts {};
    const bool known = ::stat(path.c_str(), &facts) == 0;
    const mode_t wanted = (facts.st_mode & 07777) | kRuntimeMode;
    if (known && ((facts.st_mode & 07777) == wanted || ::chmod(path.c_str(), wanted) == 0)) {
        return {};
    }
    return Failure::ofErrno(fmt::format("cannot open directory {} to clients", path.native()));
}

} // namespace

std::optional<std::string> processEnvironment(std::string_view name) {
    const char* const value = std::getenv(std::string(name).c_str());
    return value == nullptr ? std::nullopt : std::optional<std::string>(value);
}

Result<std::filesystem::path> resolveDirectory(std::filesystem::path Directories::*which,
                                               const Environment& environment, std::uint32_t uid) {
    const Place* const place =
        std::find_if(std::begin(kPlaces), std::end(kPlaces),
                     [which](const Place& candidate) { return candidate.member == which; });
    return resolve(*place, environment, uid);
}

Result<Directories> resolveDirectories(const Environment& environment, std::uint32_t uid) {
    Directories directories;
    for (const Place& place : kPlaces) {
        auto resolved = resolve(place, environment, uid);
        if (!resolved.ok()) {
            return resolved.failure();
        }
        directories.*place.member = std::move(resolved).value();
    }
    return directories;
}

std::filesystem::path Directories::mapped(const std::filesystem::path& path) const {
    const std::filesystem::path prefix(kAudioLogs);
    const auto [inPrefix, rest] =
        std::mismatch(prefix.begin(), prefix.end(), path.begin(), path.end());
    if (inPrefix != prefix.end() || std::find(rest, path.end(), "..") != path.end()) {
        return path;
    }
    std::filesystem::path result = logs;
    for (auto part = rest; part != path.end(); ++part) {
        result /= *part;
    }
    return result;
}

Result<void> createDirectories(const Directories& directories) {
    for (const std::filesystem::path& path : {directories.state, directories.logs}) {
        if (auto made = makeDirectory(path, kPrivateMode); !made.ok()) {
            return made;
        }
    }
    if (auto made = makeDirectory(directories.runtime, kRuntimeMode); !made.ok()) {
        return made;
    }
    return openToClients(directories.runtime);
}

} // namespace halyard::linux_
