// What an operator may settle, and the reader of the file that says so.
//
// Settings are plain values: parsed in one go, then shared unchanged. What the
// file leaves out has the strictest default. Reading is pure; any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "common/LogCategory.h"
#include "common/Value.h"
#include "linux/Quantities.h"

namespace halyard::linux_ {

enum class ChannelFormat : std::uint8_t { Simple, State, Histogram };

// A statistics channel beside the built-in ones. At least one of group and
// subgroup is there.
struct DriverChannel {
    std::optional<std::string> group;
    std::optional<std::string> subgroup;
    std::string driver;
    std::string name; // not empty
    std::string unit;
    ChannelFormat format = ChannelFormat::Simple;
    std::string source; // "SCHEME:REST", neither part empty

    bool operator==(const DriverChannel&) const = default;
};

// Names, or numeric ids in decimal, of those who are let in beside the daemon's
// own user and root.
struct Access {
    std::vector<std::string> users;
    std::vector<std::string> groups;
    std::vector<std::string> adminUsers;

    bool operator==(const Access&) const = default;
};

struct StoreSettings {
    static constexpr std::uint64_t kLeastBytes = 256 * kKiB;

    std::uint64_t maxBytes = 256 * kMiB;
    std::chrono::seconds maxAge = std::chrono::hours(7 * 24);

    bool operator==(const StoreSettings&) const = default;
};

struct Settings {
    using Switches = std::map<std::string, bool, std::less<>>;

    std::map<std::string, Dictionary, std::less<>> preferences; // by domain
    std::map<std::string, Switches, std::less<>> featureFlags;  // by domain
    Switches deviceProperties;
    std::vector<std::string> wantedEvents{"com.kestrel.halyard.*"}; // shell patterns
    Access access;
    StoreSettings store;
    LogLevel logLevel = LogLevel::Info;
    std::vector<DriverChannel> driverChannels;

    bool operator==(const Settings&) const = default;
};

// Why a file was not taken. Line and column count from 1; 0 is the file as a
// whole.
struct SettingsError {
    std::string file;
    std::uint32_t line = 0;
    std::uint32_t column = 0;
    std::string message;

    bool operator==(const SettingsError&) const = default;
};

// Something that has no effect, though its writer must have meant one.
struct SettingsWarning {
    std::uint32_t line = 0;
    std::string message;

    bool operator==(const SettingsWarning&) const = default;
};

struct ParsedSettings {
    Settings settings;
    std::vector<SettingsWarning> warnings; // by line, at most kMaxSettingsWarnings
    std::size_t warningsLeftOut = 0;
};

inline constexpr std::size_t kMaxSettingsWarnings = 32;
inline constexpr std::size_t kMaxDriverChannels = 1024;
// Of lists and dictionaries within a preference.
inline constexpr int kMaxPreferenceDepth = 32;

// Reads the text of halyard.toml. All or nothing: of several mistakes the first
// in the file is told. `path` only names the file in the error.
[[nodiscard]] std::variant<ParsedSettings, SettingsError> parseSettings(std::string_view text,
                                                                        std::string_view path);

} // namespace halyard::linux_
