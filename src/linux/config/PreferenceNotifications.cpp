#include "linux/config/PreferenceNotifications.h"

namespace halyard::linux_ {
namespace {

struct Followed {
    std::string_view domain;
    std::string_view key;
    std::string_view notification;
};

// The service's features, by the preference that each is read from.
constexpr Followed kFollowed[] = {
    {"com.kestrel.pinwheel", "spatial-audio-accessory-feature",
     "com.kestrel.pinwheel.spatial-audio-accessory-feature.changed"},
    {"com.kestrel.halyard", "device_name", "com.kestrel.halyard.reporting"},
};

Value preference(const Settings& settings, const Followed& followed) {
    const auto domain = settings.preferences.find(followed.domain);
    return domain == settings.preferences.end() ? Value() : domain->second[followed.key];
}

} // namespace

std::vector<std::string_view> changedPreferences(const Settings& before, const Settings& after) {
    std::vector<std::string_view> changed;
    for (const Followed& followed : kFollowed) {
        if (!(preference(before, followed) == preference(after, followed))) {
            changed.push_back(followed.notification);
        }
    }
    return changed;
}

void announceChangedPreferences(Configuration& configuration,
                                platform::Notifications& notifications) {
    configuration.observe([&notifications](const Settings& before, const Settings& after) {
        for (const std::string_view notification : changedPreferences(before, after)) {
            notifications.post(notification);
        }
    });
}

} // namespace halyard::linux_
