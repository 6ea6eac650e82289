#include "linux/config/Configuration.h"

#include <fmt/format.h>
#include <utility>

#include "linux/config/SettingsFiles.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

void logWarnings(const LoadedSettings::File& file) {
    for (const SettingsWarning& warning : file.warnings) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "{}:{}: {}", file.path.native(), warning.line,
                       warning.message);
    }
    if (file.warningsLeftOut > 0) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "{}: {} more warnings", file.path.native(),
                       file.warningsLeftOut);
    }
}

} // namespace

Configuration::Configuration(const std::filesystem::path& directory)
    : directory_(directory), settings_(std::make_shared<const Settings>()) {}

std::shared_ptr<const Settings> Configuration::settings() const {
    const MutexLock lock(mutex_);
    return settings_;
}

Configuration::Outcome Configuration::reload() {
    const MutexLock lock(reloading_);
    auto loaded = loadSettings(directory_);
    if (!loaded.ok()) {
        return refuse(loaded.failure());
    }
    std::size_t dropIns = 0;
    for (const LoadedSettings::File& file : loaded.value().files) {
        logWarnings(file);
        dropIns += file.isDropIn ? 1 : 0;
    }
    return putInForce(std::move(loaded.value().settings), dropIns);
}

Configuration::Outcome Configuration::refuse(const SettingsFailure& failure) {
    HY_LOG_ERROR(HYReportingPlatformCategory, "{}:{}:{}: {}; {} in force", failure.file,
                 failure.line, failure.column, failure.message(),
                 taken_ ? "the last good configuration stays" : "the defaults are");
    return Outcome::Refused;
}

Configuration::Outcome Configuration::putInForce(Settings settings, std::size_t dropIns) {
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
    HY_LOG_INFO(HYReportingPlatformCategory, "configuration of {}{} is in force",
                (directory_ / kSettingsFile).native(),
                dropIns == 0 ? "" : fmt::format(" and {} of {}", dropIns, kDropInFolder));
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
