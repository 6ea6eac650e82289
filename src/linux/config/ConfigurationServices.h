// The configuration file as the platform offers it: preferences, feature flags,
// device properties, and the notifications of what changes.
//
// Made, offered and followed on the thread that runs `context`; the pieces may be
// used from any.
#pragma once

#include <asio/io_context.hpp>
#include <filesystem>
#include <memory>
#include <utility>

#include "linux/config/Configuration.h"
#include "linux/config/ConfigurationWatch.h"
#include "linux/config/PreferenceNotifications.h"
#include "linux/config/SettingsFiles.h"
#include "linux/system/NotificationCenter.h"
#include "platform/Platform.h"

namespace halyard::linux_ {

struct ConfigurationServices {
    explicit ConfigurationServices(std::filesystem::path folder)
        : directory(std::move(folder)), configuration(directory) {}

    // Reads the file now and again whenever it changes. The watch comes first, so
    // that a change after the first reading is told. Borrows `context`.
    void follow(asio::io_context& context) {
        watch = std::make_unique<ConfigurationWatch>(context, std::filesystem::absolute(directory),
                                                     kSettingsFile, kDropInFolder,
                                                     [this] { (void)configuration.reload(); });
        (void)configuration.reload();
    }
    // From now on a preference that changes posts its notification.
    void announceChanges() { announceChangedPreferences(configuration, notifications); }

    void offerTo(platform::Platform& platform) {
        platform.preferences = &configuration;
        platform.featureFlags = &configuration;
        platform.deviceProperties = &configuration;
        platform.notifications = &notifications;
    }

    const std::filesystem::path directory;
    Configuration configuration;
    NotificationCenter notifications;
    std::unique_ptr<ConfigurationWatch> watch;
};

} // namespace halyard::linux_
