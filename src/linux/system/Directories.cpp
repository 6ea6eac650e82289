#include "linux/system/Directories.h"

#include <algorithm>
#include <cerrno>
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

std::variant<std::filesystem::path, std::string> userDirectory(const Place& place,
                                                               const Environment& environment) {
    if (const auto base = absolutePath(environment, place.userVariable)) {
        return *base / place.userPath;
    }
    if (place.homeFallback == nullptr) {
        return fmt::format("no runtime directory: neither {} nor {} is set to an absolute path",
                           place.managerVariable, place.userVariable);
    }
    if (const auto home = absolutePath(environment, "HOME")) {
        return *home / place.homeFallback / place.userPath;
    }
    return fmt::format("none of {}, {} and HOME is set to an absolute path", place.managerVariable,
                       place.userVariable);
}

std::variant<std::filesystem::path, std::string>
resolve(const Place& place, const Environment& environment, std::uint32_t uid) {
    if (const auto managed = nonEmpty(environment, place.managerVariable)) {
        // A unit with several directories gets them all, colons between.
        const std::filesystem::path first(managed->substr(0, managed->find(':')));
        if (first.is_absolute()) {
            return first;
        }
        return fmt::format("{} is no absolute path: {}", place.managerVariable, *managed);
    }
    if (uid == 0) {
        return std::filesystem::path(place.systemPath);
    }
    return userDirectory(place, environment);
}

std::string failure(const std::filesystem::path& path) {
    return fmt::format("cannot make directory {}: {}", path.native(),
                       std::generic_category().message(errno));
}

// Like mkdir -p; whatever is made gets `mode`, whatever the umask says.
std::optional<std::string> makeDirectory(const std::filesystem::path& path, mode_t mode) {
    std::error_code ignored;
    if (std::filesystem::is_directory(path, ignored)) {
        return std::nullopt;
    }
    if (path.has_parent_path() && path.parent_path() != path) {
        if (auto problem = makeDirectory(path.parent_path(), mode)) {
            return problem;
        }
    }
    if (::mkdir(path.c_str(), mode) == 0) {
        return ::chmod(path.c_str(), mode) == 0 ? std::nullopt : std::optional(failure(path));
    }
    // Somebody else may have been quicker.
    const int why = errno;
    if (std::filesystem::is_directory(path, ignored)) {
        return std::nullopt;
    }
    errno = why;
    return failure(path);
}

// Only adds to the mode: the directory may be one that others share.
std::optional<std::string> openToClients(const std::filesystem::path& path) {
    struct stat facts {};
    const bool known = ::stat(path.c_str(), &facts) == 0;
    const mode_t wanted = (facts.st_mode & 07777) | kRuntimeMode;
    if (known && ((facts.st_mode & 07777) == wanted || ::chmod(path.c_str(), wanted) == 0)) {
        return std::nullopt;
    }
    return fmt::format("cannot open directory {} to clients: {}", path.native(),
                       std::generic_category().message(errno));
}

} // namespace

std::optional<std::string> processEnvironment(std::string_view name) {
    const char* const value = std::getenv(std::string(name).c_str());
    return value == nullptr ? std::nullopt : std::optional<std::string>(value);
}

std::variant<Directories, std::string> resolveDirectories(const Environment& environment,
                                                          std::uint32_t uid) {
    Directories directories;
    for (const Place& place : kPlaces) {
        auto resolved = resolve(place, environment, uid);
        if (auto* const problem = std::get_if<std::string>(&resolved)) {
            return std::move(*problem);
        }
        directories.*place.member = std::get<std::filesystem::path>(std::move(resolved));
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

std::optional<std::string> createDirectories(const Directories& directories) {
    for (const std::filesystem::path& path : {directories.state, directories.logs}) {
        if (auto problem = makeDirectory(path, kPrivateMode)) {
            return problem;
        }
    }
    if (auto problem = makeDirectory(directories.runtime, kRuntimeMode)) {
        return problem;
    }
    return openToClients(directories.runtime);
}

} // namespace halyard::linux_
