#include "linux/config/Settings.h"

#include <algorithm>
#include <fmt/format.h>
#include <limits>
#include <span>

#include "linux/config/Quantities.h"
#include "linux/config/TomlValue.h"
#include "linux/drivers/SourceKinds.h"

namespace halyard::linux_ {
namespace {

// The library walks nested tables by recursion, and each dot of a key nests by
// one; far more than any configuration has, far less than a stack holds.
constexpr std::size_t kMaxKeyDots = 8192;

constexpr std::pair<std::string_view, LogLevel> kLevels[] = {{"debug", LogLevel::Debug},
                                                             {"info", LogLevel::Info},
                                                             {"default", LogLevel::Default},
                                                             {"error", LogLevel::Error}};

template <class T> using Names = std::span<const std::pair<std::string_view, T>>;

bool isSource(std::string_view text) {
    const std::size_t colon = text.find(':');
    return colon != std::string_view::npos && colon > 0 && colon + 1 < text.size();
}

// Walks the parsed file and fills a Settings. Goes on after a mistake, so that
// the one told is the first of the file, whatever order the walk has.
class SettingsReader {
public:
    explicit SettingsReader(std::string_view path) : path_(path) {}

    Result<ParsedSettings, SettingsFailure> read(const toml::table& root);

private:
    // `name` is the dotted path of the key, for messages.
    using Read = void (SettingsReader::*)(const toml::node& node, const std::string& name);
    struct Key {
        std::string_view name;
        Read read;
    };

    void fail(const toml::node& where, std::string message);
    void warn(const toml::source_region& where, std::string message);

    // Each tells the mistake when there is one.
    const toml::table* table(const toml::node& node, const std::string& name);
    std::optional<std::string> text(const toml::node& node, const std::string& name);
    template <class T>
    void readNamed(const toml::node& node, const std::string& name, Names<T> names, T& into);
    void readTexts(const toml::node& node, const std::string& name, bool orIds,
                   std::vector<std::string>& into);
    void readSwitches(const toml::node& node, const std::string& name, Settings::Switches& into);
    void readSection(const toml::node& node, const std::string& name, std::span<const Key> keys);

    void readPreferences(const toml::node& node, const std::string& name);
    void readFeatureFlags(const toml::node& node, const std::string& name);
    void readMaxBytes(const toml::node& node, const std::string& name);
    std::optional<std::chrono::seconds> duration(const toml::node& node, const std::string& name);
    void readSyncInterval(const toml::node& node, const std::string& name);
    void readUploadLimit(const toml::node& node, const std::string& name);
    void readChannels(const toml::node& node, const std::string& name);
    void readChannel(const toml::node& node, const std::string& name);
    void checkChannel(const toml::node& node, const std::string& name);
    void checkDomain(const toml::key& domain, const toml::table& preferences);

    void readDeviceProperties(const toml::node& node, const std::string& name) {
        readSwitches(node, name, settings().deviceProperties);
    }
    void readAnalytics(const toml::node& node, const std::string& name) {
        static constexpr Key kKeys[] = {{"wanted", &SettingsReader::readWanted}};
        readSection(node, name, kKeys);
    }
    void readWanted(const toml::node& node, const std::string& name) {
        readTexts(node, name, false, settings().wantedEvents);
    }
    void readAccess(const toml::node& node, const std::string& name) {
        static constexpr Key kKeys[] = {
            {"users", &SettingsReader::readAccessList<&Access::users>},
            {"groups", &SettingsReader::readAccessList<&Access::groups>},
            {"admin_users", &SettingsReader::readAccessList<&Access::adminUsers>},
            {"readers", &SettingsReader::readReaders}};
        readSection(node, name, kKeys);
    }
    void readReaders(const toml::node& node, const std::string& name) {
        if (auto group = text(node, name)) {
            settings().access.readers = std::move(*group);
        }
    }
    template <std::vector<std::string> Access::*list>
    void readAccessList(const toml::node& node, const std::string& name) {
        readTexts(node, name, true, settings().access.*list);
    }
    void readStore(const toml::node& node, const std::string& name) {
        static constexpr Key kKeys[] = {{"max_bytes", &SettingsReader::readMaxBytes},
                                        {"max_age", &SettingsReader::readMaxAge},
                                        {"sync_interval", &SettingsReader::readSyncInterval}};
        readSection(node, name, kKeys);
    }
    void readSessions(const toml::node& node, const std::string& name) {
        static constexpr Key kKeys[] = {{"upload_limit", &SettingsReader::readUploadLimit},
                                        {"recount", &SettingsReader::readRecount}};
        readSection(node, name, kKeys);
    }
    void readRecount(const toml::node& node, const std::string& name) {
        if (const auto value = node.value_exact<bool>()) {
            settings().sessions.recount = *value;
        } else {
            fail(node, fmt::format("{} must be true or false", name));
        }
    }
    void readMaxAge(const toml::node& node, const std::string& name) {
        settings().store.maxAge = duration(node, name).value_or(settings().store.maxAge);
    }
    void readService(const toml::node& node, const std::string& name) {
        static constexpr Key kKeys[] = {{"idle_exit", &SettingsReader::readIdleExit}};
        readSection(node, name, kKeys);
    }
    void readIdleExit(const toml::node& node, const std::string& name) {
        settings().idleExit = duration(node, name);
    }
    void readLog(const toml::node& node, const std::string& name) {
        static constexpr Key kKeys[] = {{"level", &SettingsReader::readLevel}};
        readSection(node, name, kKeys);
    }
    void readLevel(const toml::node& node, const std::string& name) {
        readNamed<LogLevel>(node, name, kLevels, settings().logLevel);
    }
    void readDrivers(const toml::node& node, const std::string& name) {
        static constexpr Key kKeys[] = {{"channel", &SettingsReader::readChannels}};
        readSection(node, name, kKeys);
    }
    template <auto member> void readChannelText(const toml::node& node, const std::string& name) {
        if (auto read = text(node, name)) {
            channel_.*member = std::move(*read);
        }
    }
    void readChannelFormat(const toml::node& node, const std::string& name) {
        channelHasFormat_ = true;
        readNamed<ChannelFormat>(node, name, kChannelFormats, channel_.format);
    }

    Settings& settings() { return result_.settings; }

    const std::string path_;
    ParsedSettings result_;
    std::optional<SettingsFailure> failure_; // the first of the file so far
    DriverChannel channel_;                  // the one that is being read
    bool channelHasFormat_ = false;
};

std::string join(const std::string& parent, std::string_view key) {
    return parent.empty() ? std::string(key) : fmt::format("{}.{}", parent, key);
}

Result<ParsedSettings, SettingsFailure> SettingsReader::read(const toml::table& root) {
    static constexpr Key kKeys[] = {{"preferences", &SettingsReader::readPreferences},
                                    {"feature_flags", &SettingsReader::readFeatureFlags},
                                    {"device_properties", &SettingsReader::readDeviceProperties},
                                    {"analytics", &SettingsReader::readAnalytics},
                                    {"access", &SettingsReader::readAccess},
                                    {"store", &SettingsReader::readStore},
                                    {"sessions", &SettingsReader::readSessions},
                                    {"log", &SettingsReader::readLog},
                                    {"service", &SettingsReader::readService},
                                    {"drivers", &SettingsReader::readDrivers}};
    readSection(root, "", kKeys);
    if (failure_) {
        return std::move(*failure_);
    }
    auto& warnings = result_.warnings;
    std::stable_sort(warnings.begin(), warnings.end(),
                     [](const SettingsWarning& left, const SettingsWarning& right) {
                         return left.line < right.line;
                     });
    if (warnings.size() > kMaxSettingsWarnings) {
        result_.warningsLeftOut = warnings.size() - kMaxSettingsWarnings;
        warnings.resize(kMaxSettingsWarnings);
    }
    return std::move(result_);
}

void SettingsReader::fail(const toml::node& where, std::string message) {
    const toml::source_position at = where.source().begin;
    if (!failure_ || std::pair(at.line, at.column) < std::pair(failure_->line, failure_->column)) {
        failure_.emplace();
        failure_->text = std::move(message);
        failure_->file = path_;
        failure_->line = at.line;
        failure_->column = at.column;
    }
}

void SettingsReader::warn(const toml::source_region& where, std::string message) {
    result_.warnings.push_back({where.begin.line, std::move(message)});
}

const toml::table* SettingsReader::table(const toml::node& node, const std::string& name) {
    const toml::table* const table = node.as_table();
    if (table == nullptr) {
        fail(node, fmt::format("{} must be a table", name));
    }
    return table;
}

std::optional<std::string> SettingsReader::text(const toml::node& node, const std::string& name) {
    auto value = node.value_exact<std::string>();
    if (!value) {
        fail(node, fmt::format("{} must be a text", name));
    }
    return value;
}

template <class T>
void SettingsReader::readNamed(const toml::node& node, const std::string& name, Names<T> names,
                               T& into) {
    const std::string_view word = node.value_exact<std::string_view>().value_or("");
    std::string known;
    for (const auto& [candidate, value] : names) {
        if (candidate == word) {
            into = value;
            return;
        }
        known += fmt::format("{}\"{}\"", known.empty() ? "" : ", ", candidate);
    }
    fail(node, fmt::format("{} must be one of {}", name, known));
}

void SettingsReader::readTexts(const toml::node& node, const std::string& name, bool orIds,
                               std::vector<std::string>& into) {
    const std::string complaint =
        fmt::format("{} must be a list of texts{}", name, orIds ? " or numeric ids" : "");
    const toml::array* const array = node.as_array();
    if (array == nullptr) {
        fail(node, complaint);
        return;
    }
    into.clear();
    for (const toml::node& element : *array) {
        const auto id = element.value_exact<std::int64_t>();
        const auto word = element.value_exact<std::string>();
        if (word && !word->empty()) {
            into.push_back(*word);
        } else if (orIds && id && *id >= 0 && *id < std::numeric_limits<std::uint32_t>::max()) {
            into.push_back(std::to_string(*id));
        } else {
            fail(element, complaint);
        }
    }
}

void SettingsReader::readSwitches(const toml::node& node, const std::string& name,
                                  Settings::Switches& into) {
    const toml::table* const switches = table(node, name);
    if (switches == nullptr) {
        return;
    }
    for (const auto& [key, element] : *switches) {
        if (const auto value = element.value_exact<bool>()) {
            into.emplace(key.str(), *value);
        } else {
            fail(element, fmt::format("{} must be true or false", join(name, key.str())));
        }
    }
}

void SettingsReader::readSection(const toml::node& node, const std::string& name,
                                 std::span<const Key> keys) {
    const toml::table* const section = table(node, name);
    if (section == nullptr) {
        return;
    }
    for (const Key& key : keys) {
        result_.known.insert(join(name, key.name));
    }
    for (const auto& [key, element] : *section) {
        const std::string_view keyName = key.str();
        const std::string path = join(name, keyName);
        const auto known = std::find_if(keys.begin(), keys.end(),
                                        [&](const Key& each) { return each.name == keyName; });
        if (known == keys.end()) {
            warn(key.source(), fmt::format("unknown key {} has no effect", path));
        } else {
            (this->*known->read)(element, path);
        }
    }
}

void SettingsReader::readPreferences(const toml::node& node, const std::string& name) {
    const toml::table* const domains = table(node, name);
    if (domains == nullptr) {
        return;
    }
    for (const auto& [domain, element] : *domains) {
        const std::string path = fmt::format("{}.\"{}\"", name, domain.str());
        const toml::table* const preferences = table(element, path);
        if (preferences == nullptr) {
            continue;
        }
        checkDomain(domain, *preferences);
        // The domain's own table is one level more.
        if (const auto values = valueOfToml(*preferences, kMaxPreferenceDepth + 1)) {
            settings().preferences.emplace(domain.str(), values->dictionary());
        } else {
            fail(element, fmt::format("{} nests deeper than {}", path, kMaxPreferenceDepth));
        }
    }
}

// Preferences are whatever their readers make of them, so a doubtful one is
// kept; but its writer should know.
void SettingsReader::checkDomain(const toml::key& domain, const toml::table& preferences) {
    const bool onlyTables = std::all_of(preferences.begin(), preferences.end(),
                                        [](const auto& entry) { return entry.second.is_table(); });
    if (onlyTables && !preferences.empty() && domain.str().find('.') == std::string_view::npos) {
        warn(domain.source(), fmt::format("preferences.{} holds only tables: a domain with dots "
                                          "needs quotes",
                                          domain.str()));
    }
    if (domain.str() != kLogSubsystem) {
        return;
    }
    const toml::node* const deviceName = preferences.get("device_name");
    if (deviceName != nullptr && !deviceName->is_string()) {
        warn(deviceName->source(), "device_name should be a text");
    }
    const toml::node* const disable = preferences.get("disable_reporting");
    if (disable != nullptr && !disable->is_boolean()) {
        warn(disable->source(), "disable_reporting should be true or false");
    }
}

void SettingsReader::readFeatureFlags(const toml::node& node, const std::string& name) {
    const toml::table* const domains = table(node, name);
    if (domains == nullptr) {
        return;
    }
    for (const auto& [domain, flags] : *domains) {
        readSwitches(flags, join(name, domain.str()),
                     settings().featureFlags[std::string(domain.str())]);
    }
}

void SettingsReader::readMaxBytes(const toml::node& node, const std::string& name) {
    std::optional<std::uint64_t> bytes =
        parseByteSize(node.value_exact<std::string>().value_or(""));
    const auto number = node.value_exact<std::int64_t>();
    if (number && *number >= 0) {
        bytes = static_cast<std::uint64_t>(*number);
    }
    if (!bytes) {
        fail(node, fmt::format("{} must be a size such as \"256MiB\" or a number of bytes", name));
    } else if (*bytes < StoreLimits::kLeastBytes) {
        fail(node, fmt::format("{} must be at least 256KiB", name));
    } else {
        settings().store.maxBytes = *bytes;
    }
}

void SettingsReader::readUploadLimit(const toml::node& node, const std::string& name) {
    const auto limit = node.value_exact<std::int64_t>();
    if (limit && *limit >= 0) {
        settings().sessions.uploadLimit = *limit;
    } else {
        fail(node, fmt::format("{} must be a number, 0 or more", name));
    }
}

std::optional<std::chrono::seconds> SettingsReader::duration(const toml::node& node,
                                                             const std::string& name) {
    const auto read = parseDuration(node.value_exact<std::string>().value_or(""));
    if (!read) {
        fail(node, fmt::format("{} must be a duration such as \"7d\", \"12h\", \"30m\" or "
                               "\"45s\", at most \"36500d\"",
                               name));
    } else if (*read < std::chrono::seconds(1)) {
        fail(node, fmt::format("{} must be at least \"1s\"", name));
    }
    return read;
}

void SettingsReader::readSyncInterval(const toml::node& node, const std::string& name) {
    const auto interval = parseInterval(node.value_exact<std::string>().value_or(""));
    if (!interval || *interval < StoreLimits::kLeastSyncInterval ||
        *interval > StoreLimits::kLargestSyncInterval) {
        fail(node, fmt::format("{} must be a duration from \"50ms\" to \"10m\"", name));
    } else {
        settings().store.syncInterval = *interval;
    }
}

void SettingsReader::readChannels(const toml::node& node, const std::string& name) {
    const toml::array* const channels = node.as_array();
    if (channels == nullptr) {
        fail(node, fmt::format("{0} must be a list of tables, each begun by [[{0}]]", name));
        return;
    }
    if (channels->size() > kMaxDriverChannels) {
        fail(node, fmt::format("{} has more than {} entries", name, kMaxDriverChannels));
        return;
    }
    for (const toml::node& channel : *channels) {
        readChannel(channel, name);
    }
}

void SettingsReader::readChannel(const toml::node& node, const std::string& name) {
    static constexpr Key kKeys[] = {
        {"group", &SettingsReader::readChannelText<&DriverChannel::group>},
        {"subgroup", &SettingsReader::readChannelText<&DriverChannel::subgroup>},
        {"driver", &SettingsReader::readChannelText<&DriverChannel::driver>},
        {"name", &SettingsReader::readChannelText<&DriverChannel::name>},
        {"unit", &SettingsReader::readChannelText<&DriverChannel::unit>},
        {"format", &SettingsReader::readChannelFormat},
        {"source", &SettingsReader::readChannelText<&DriverChannel::source>}};
    channel_ = {};
    channelHasFormat_ = false;
    readSection(node, name, kKeys);
    if (node.is_table()) {
        checkChannel(node, name);
        settings().driverChannels.push_back(channel_);
    }
}

void SettingsReader::checkChannel(const toml::node& node, const std::string& name) {
    if (!channel_.group && !channel_.subgroup) {
        fail(node, fmt::format("{} needs a group or a subgroup", name));
    }
    if (channel_.name.empty()) {
        fail(node, fmt::format("{} needs a name", name));
    }
    if (!isSource(channel_.source)) {
        fail(node, fmt::format("{} needs a source such as \"file:/sys/...\"", name));
    }
    if (!channelHasFormat_) {
        const SourceKind* const kind = findSourceKind(channel_.source);
        channel_.format = kind != nullptr ? kind->format : ChannelFormat::Simple;
    }
}

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

Result<ParsedSettings, SettingsFailure> parseSettings(std::string_view text,
                                                      std::string_view path) {
    const auto refused = [&](std::string why, std::uint32_t line, std::uint32_t column) {
        return SettingsFailure{{{}, std::move(why)}, std::string(path), line, column};
    };
    if (const auto line = lineOfTooManyDots(text)) {
        return refused(fmt::format("more than {} dots in one file", kMaxKeyDots), *line, 1);
    }
    try {
        return SettingsReader(path).read(toml::parse(text, std::string_view()));
    } catch (const toml::parse_error& error) {
        const toml::source_position at = error.source().begin;
        return refused(std::string(error.description()), at.line, at.column);
    }
}

} // namespace halyard::linux_
