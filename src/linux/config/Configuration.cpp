#include "linux/config/Configuration.h"

#include <utility>

#include "linux/system/SmallFile.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

bool isMissing(const Failure& failure) {
    return failure.code == std::errc::no_such_file_or_directory ||
           failure.code == std::errc::not_a_directory;
}

void logWarnings(const std::string& file, const ParsedSettings& parsed) {
    for (const SettingsWarning& warning : parsed.warnings) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "{}:{}: {}", file, warning.line,
                       warning.message);
    }
    if (parsed.warningsLeftOut > 0) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "{}: {} more warnings", file,
                       parsed.warningsLeftOut);
    }
}

} // namespace

Configuration::Configuration(const std::filesystem::path& directory)
    : file_(directory / kFileName), settings_(std::make_shared<const Settings>()) {}

std::shared_ptr<const Settings> Configuration::settings() const {
    const MutexLock lock(mutex_);
    return settings_;
}

Configuration::Outcome Configuration::reload() {
    const MutexLock lock(reloading_);
    const auto text = readSmallFile(file_, kMaxFileBytes);
    if (!text.ok()) {
        return isMissing(text.failure()) ? putInForce(Settings()) : refuse({text.failure(), file_});
    }
    auto parsed = parseSettings(text.value(), file_.native());
    if (!parsed.ok()) {
        return refuse(parsed.failure());
    }
    logWarnings(file_, parsed.value());
    return putInForce(std::move(parsed.value().settings));
}

Configuration::Outcome Configuration::refuse(const SettingsFailure& failure) {
    HY_LOG_ERROR(HYReportingPlatformCategory, "{}:{}:{}: {}; {} in force", failure.file,
                 failure.line, failure.column, failure.message(),
                 taken_ ? "the last good configuration stays" : "the defaults are");
    return Outcome::Refused;
}

Configuration::Outcome Configuration::putInForce(Settings settings) {
    taken_ = true;
    const std::shared_ptr<const Settings> before = this->settings();
    if (*before == settings) {
        return Outcome::Unchanged;
    }
    const auto after = std::make_shared<const Settings>(std::move(settings));
    {
        const MutexLock lock(mutex_);
        settings_ = after;
    }
    for (const Observer& observer : observers_) {
        observer(*before, *after);
    }
    // Last, so that the log's own level holds for it.
    HY_LOG_INFO(HYReportingPlatformCategory, "configuration of {} is in force", file_.native());
    return Outcome::Changed;
}

void Configuration::observe(Observer observer) {
    const MutexLock lock(reloading_);
    observers_.push_back(std::move(observer));
}

Value Configuration::value(std::string_view key, std::string_view domain) const {
    const std::shared_ptr<const Settings> now = settings();
    const auto found = now->preferences.find(domain);
    return found == now->preferences.end() ? Value() : found->second[key];
}

bool Configuration::isEnabled(std::string_view domain, std::string_view flag) const {
    const std::shared_ptr<const Settings> now = settings();
    const auto flags = now->featureFlags.find(domain);
    if (flags == now->featureFlags.end()) {
        return false;
    }
    const auto found = flags->second.find(flag);
    return found != flags->second.end() && found->second;
}

std::optional<bool> Configuration::boolean(std::string_view name) const {
    const std::shared_ptr<const Settings> now = settings();
    const auto found = now->deviceProperties.find(name);
    return found == now->deviceProperties.end() ? std::nullopt : std::optional(found->second);
}

} // namespace halyard::linux_
