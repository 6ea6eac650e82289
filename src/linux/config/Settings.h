// What an operator may settle, and the reader of the file that says so.
//
// Settings are plain values: parsed in one go, then shared unchanged. What the
// file leaves out has the strictest default. Reading is pure; any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "common/LogCategory.h"
#include "common/Result.h"
#include "common/Value.h"
#include "linux/config/ExportSettings.h"
#include "linux/drivers/DriverChannel.h"
#include "linux/net/Peer.h"
#include "linux/store/StoreLimits.h"
#include "platform/ClientBudget.h"
#include "platform/SessionRules.h"

namespace halyard::linux_ {

struct Settings {
    using Switches = std::map<std::string, bool, std::less<>>;

    std::map<std::string, Dictionary, std::less<>> preferences; // by domain
    std::map<std::string, Switches, std::less<>> featureFlags;  // by domain
    Switches deviceProperties;
    std::vector<std::string> wantedEvents{"com.kestrel.halyard.*"}; // shell patterns
    Access access;
    StoreLimits store;
    platform::ClientLimits clients;
    platform::SessionRules::Values sessions;
    LogLevel logLevel = LogLevel::Info;
    std::optional<std::chrono::seconds> idleExit; // none: never
    std::vector<DriverChannel> driverChannels;
    ExportSettings exporting;

    bool operator==(const Settings&) const = default;
};

// Why a file was not taken. Line and column count from 1; 0 is the file as a
// whole.
struct SettingsFailure : Failure {
    std::string file;
    std::uint32_t line = 0;
    std::uint32_t column = 0;
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
    // The dotted names of all that the tables of the file may hold.
    std::set<std::string, std::less<>> known;
    std::set<std::string, std::less<>> given; // of these, what the file has
};

inline constexpr std::size_t kMaxSettingsWarnings = 32;
// Of lists and dictionaries within a preference.
inline constexpr int kMaxPreferenceDepth = 32;

// Reads the text of a configuration file over what the files before it left: what it
// says wins, a list as a whole, preferences, switches and attributes each by its key;
// driver channels are added. All or nothing: of several mistakes the first in the file
// is told. `path` only names the file in the error.
Result<ParsedSettings, SettingsFailure> parseSettings(std::string_view text, std::string_view path,
                                                      Settings before = {});

} // namespace halyard::linux_
