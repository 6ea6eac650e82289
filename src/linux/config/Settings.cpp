#include "linux/config/Settings.h"

#include <algorithm>
#include <fmt/format.h>

#include "linux/config/Quantities.h"
#include "linux/config/SettingsSections.h"
#include "linux/config/TomlValue.h"

namespace halyard::linux_ {
namespace {

// The library walks nested tables by recursion, and each dot of a key nests by
// one; far more than any configuration has, far less than a stack holds.
constexpr std::size_t kMaxKeyDots = 8192;

constexpr std::pair<std::string_view, LogLevel> kLevels[] = {{"debug", LogLevel::Debug},
                                                             {"info", LogLevel::Info},
                                                             {"default", LogLevel::Default},
                                                             {"error", LogLevel::Error}};

template <class T> using Key = TomlReader::Key<T>;
using SessionValues = platform::SessionRules::Values;

// Preferences are whatever their readers make of them, so a doubtful one is
// kept; but its writer should know.
void checkDomain(TomlReader& reader, const toml::key& domain, const toml::table& preferences) {
    const bool onlyTables = std::all_of(preferences.begin(), preferences.end(),
                                        [](const auto& entry) { return entry.second.is_table(); });
    if (onlyTables && !preferences.empty() && domain.str().find('.') == std::string_view::npos) {
        reader.warn(domain.source(),
                    fmt::format("preferences.{} holds only tables: a domain with dots "
                                "needs quotes",
                                domain.str()));
    }
    if (domain.str() != kLogSubsystem) {
        return;
    }
    const toml::node* const deviceName = preferences.get("device_name");
    if (deviceName != nullptr && !deviceName->is_string()) {
        reader.warn(deviceName->source(), "device_name should be a text");
    }
    const toml::node* const disable = preferences.get("disable_reporting");
    if (disable != nullptr && !disable->is_boolean()) {
        reader.warn(disable->source(), "disable_reporting should be true or false");
    }
}

void readPreferences(TomlReader& reader, const NamedNode& at, Settings& into) {
    const toml::table* const domains = reader.table(at);
    if (domains == nullptr) {
        return;
    }
    for (const auto& [domain, element] : *domains) {
        const std::string path = fmt::format("{}.\"{}\"", at.name, domain.str());
        const toml::table* const preferences = reader.table({element, path});
        if (preferences == nullptr) {
            continue;
        }
        checkDomain(reader, domain, *preferences);
        // The domain's own table is one level more.
        if (const auto values = valueOfToml(*preferences, kMaxPreferenceDepth + 1)) {
            into.preferences[std::string(domain.str())].merge(values->dictionary());
        } else {
            reader.fail(element, fmt::format("{} nests deeper than {}", path, kMaxPreferenceDepth));
        }
    }
}

void readFeatureFlags(TomlReader& reader, const NamedNode& at, Settings& into) {
    const toml::table* const domains = reader.table(at);
    if (domains == nullptr) {
        return;
    }
    for (const auto& [domain, flags] : *domains) {
        reader.readSwitches({flags, join(at.name, domain.str())},
                            into.featureFlags[std::string(domain.str())]);
    }
}

void readDeviceProperties(TomlReader& reader, const NamedNode& at, Settings& into) {
    reader.readSwitches(at, into.deviceProperties);
}

std::optional<std::chrono::seconds> duration(TomlReader& reader, const NamedNode& at) {
    const auto read = parseDuration(at.node.value_exact<std::string>().value_or(""));
    if (!read) {
        reader.fail(at.node, fmt::format("{} must be a duration such as \"7d\", \"12h\", \"30m\" "
                                         "or \"45s\", at most \"36500d\"",
                                         at.name));
    } else if (*read < std::chrono::seconds(1)) {
        reader.fail(at.node, fmt::format("{} must be at least \"1s\"", at.name));
    }
    return read;
}

void readSyncInterval(TomlReader& reader, const NamedNode& at, StoreLimits& into) {
    const auto interval = parseInterval(at.node.value_exact<std::string>().value_or(""));
    if (!interval || *interval < StoreLimits::kLeastSyncInterval ||
        *interval > StoreLimits::kLargestSyncInterval) {
        reader.fail(at.node,
                    fmt::format("{} must be a duration from \"50ms\" to \"10m\"", at.name));
    } else {
        into.syncInterval = *interval;
    }
}

void readMaxBytes(TomlReader& reader, const NamedNode& at, StoreLimits& into) {
    reader.readSize(at, StoreLimits::kLeastBytes, into.maxBytes);
}

void readUploadLimit(TomlReader& reader, const NamedNode& at, SessionValues& into) {
    const auto limit = at.node.value_exact<std::int64_t>();
    if (limit && *limit >= 0) {
        into.uploadLimit = *limit;
    } else {
        reader.fail(at.node, fmt::format("{} must be a number, 0 or more", at.name));
    }
}

void readMaxAge(TomlReader& reader, const NamedNode& at, StoreLimits& into) {
    into.maxAge = duration(reader, at).value_or(into.maxAge);
}

void readIdleExit(TomlReader& reader, const NamedNode& at, Settings& into) {
    into.idleExit = duration(reader, at);
}

void readLevel(TomlReader& reader, const NamedNode& at, Settings& into) {
    reader.readNamed<LogLevel>(at, kLevels, into.logLevel);
}

template <std::vector<std::string> Access::*list>
void readIds(TomlReader& reader, const NamedNode& at, Access& into) {
    reader.readIds(at, into.*list);
}

template <std::size_t platform::ClientLimits::*limit>
void readLimitBytes(TomlReader& reader, const NamedNode& at, platform::ClientLimits& into) {
    reader.readSize(at, 0, into.*limit);
}

template <std::size_t platform::ClientLimits::*limit>
void readLimitCount(TomlReader& reader, const NamedNode& at, platform::ClientLimits& into) {
    const auto count = at.node.value_exact<std::int64_t>();
    if (count && *count > 0) {
        into.*limit = static_cast<std::size_t>(*count);
    } else {
        reader.fail(at.node, fmt::format("{} must be a number, 1 or more", at.name));
    }
}

constexpr Key<Settings> kAnalyticsKeys[] = {{"wanted", &readInto<&Settings::wantedEvents>}};
constexpr Key<Settings> kLogKeys[] = {{"level", &readLevel}};
constexpr Key<Settings> kServiceKeys[] = {{"idle_exit", &readIdleExit}};
constexpr Key<Access> kAccessKeys[] = {{"users", &readIds<&Access::users>},
                                       {"groups", &readIds<&Access::groups>},
                                       {"admin_users", &readIds<&Access::adminUsers>},
                                       {"readers", &readInto<&Access::readers>}};
constexpr Key<StoreLimits> kStoreKeys[] = {
    {"max_bytes", &readMaxBytes}, {"max_age", &readMaxAge}, {"sync_interval", &readSyncInterval}};
constexpr Key<SessionValues> kSessionsKeys[] = {{"upload_limit", &readUploadLimit},
                                                {"recount", &readInto<&SessionValues::recount>}};
using Limits = platform::ClientLimits;
constexpr Key<Limits> kLimitsKeys[] = {{"memory", &readLimitBytes<&Limits::memory>},
                                       {"sessions", &readLimitCount<&Limits::sessions>},
                                       {"connections", &readLimitCount<&Limits::connections>},
                                       {"configuration", &readLimitBytes<&Limits::configuration>},
                                       {"summary", &readLimitBytes<&Limits::summary>},
                                       {"copies", &readLimitBytes<&Limits::copies>}};

// A section whose keys are the settings' own, and one that is a value among them.
template <auto& keys> void readKeys(TomlReader& reader, const NamedNode& at, Settings& into) {
    reader.readSection<Settings>(at, keys, into);
}
template <auto member, auto& keys>
void readPart(TomlReader& reader, const NamedNode& at, Settings& into) {
    using Part = std::remove_reference_t<decltype(into.*member)>;
    reader.readSection<Part>(at, keys, into.*member);
}

constexpr Key<Settings> kSections[] = {
    {"preferences", &readPreferences},
    {"feature_flags", &readFeatureFlags},
    {"device_properties", &readDeviceProperties},
    {"analytics", &readKeys<kAnalyticsKeys>},
    {"access", &readPart<&Settings::access, kAccessKeys>},
    {"store", &readPart<&Settings::store, kStoreKeys>},
    {"sessions", &readPart<&Settings::sessions, kSessionsKeys>},
    {"limits", &readPart<&Settings::clients, kLimitsKeys>},
    {"log", &readKeys<kLogKeys>},
    {"service", &readKeys<kServiceKeys>},
    {"drivers", &readDrivers},
    {"export", &readExport},
};

// The line where there are too many dots within keys; runs of dots, which no
// key has, do not count.
std::optional<std::uint32_t> lineOfTooManyDots(std::string_view text) {
    std::size_t dots = 0;
    std::uint32_t line = 1;
    for (std::size_t i = 0; i < text.size(); ++i) {
        line += text[i] == '\n' ? 1 : 0;
        dots += text[i] == '.' && (i == 0 || text[i - 1] != '.') ? 1 : 0;
        if (dots > kMaxKeyDots) {
            return line;
        }
    }
    return std::nullopt;
}

} // namespace

Result<ParsedSettings, SettingsFailure> parseSettings(std::string_view text, std::string_view path,
                                                      Settings before) {
    const auto refused = [&](std::string why, std::uint32_t line, std::uint32_t column) {
        return SettingsFailure{{{}, std::move(why)}, std::string(path), line, column};
    };
    if (const auto line = lineOfTooManyDots(text)) {
        return refused(fmt::format("more than {} dots in one file", kMaxKeyDots), *line, 1);
    }
    try {
        const toml::table root = toml::parse(text, std::string_view());
        TomlReader reader(path);
        reader.readSection<Settings>({root, ""}, kSections, before);
        return reader.finish(std::move(before));
    } catch (const toml::parse_error& error) {
        const toml::source_position at = error.source().begin;
        return refused(std::string(error.description()), at.line, at.column);
    }
}

} // namespace halyard::linux_
