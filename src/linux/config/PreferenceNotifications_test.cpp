#include "linux/config/PreferenceNotifications.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "linux/system/NotificationCenter.h"
#include "testing/ManualQueues.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

using ::testing::ElementsAre;

constexpr std::string_view kSpatial =
    "com.kestrel.pinwheel.spatial-audio-accessory-feature.changed";
constexpr std::string_view kReporting = "com.kestrel.halyard.reporting";

Settings with(std::string_view domain, std::string_view key, Value value) {
    Settings settings;
    settings.preferences[std::string(domain)].set(Value(key), std::move(value));
    return settings;
}

TEST(ChangedPreferencesTest, EachFollowedPreferenceHasItsNotification) {
    EXPECT_THAT(changedPreferences(Settings(), with("com.kestrel.pinwheel",
                                                    "spatial-audio-accessory-feature", true)),
                ElementsAre(kSpatial));
    EXPECT_THAT(changedPreferences(Settings(), with("com.kestrel.halyard", "device_name", "x")),
                ElementsAre(kReporting));
}

TEST(ChangedPreferencesTest, UnsettingIsAChangeAndTheSameValueIsNone) {
    const Settings named = with("com.kestrel.halyard", "device_name", "x");

    EXPECT_THAT(changedPreferences(named, Settings()), ElementsAre(kReporting));
    EXPECT_THAT(changedPreferences(named, with("com.kestrel.halyard", "device_name", "y")),
                ElementsAre(kReporting));
    EXPECT_THAT(changedPreferences(named, named), ElementsAre());
}

TEST(ChangedPreferencesTest, OtherPreferencesAreNotFollowed) {
    EXPECT_THAT(
        changedPreferences(Settings(), with("com.kestrel.halyard", "disable_reporting", true)),
        ElementsAre());
    EXPECT_THAT(changedPreferences(Settings(), with("com.kestrel.pinwheel", "device_name", "x")),
                ElementsAre());
}

TEST(PreferenceNotificationsTest, AReloadAnnouncesWhatItChanged) {
    testing::ManualClock clock;
    testing::ManualQueues queues(clock);
    const testing::TempTree tree;
    NotificationCenter center;
    Configuration configuration(tree.path());
    int heard = 0;
    announceChangedPreferences(configuration, center);
    center.registerFor(
        kReporting, queues.makeSerialQueue("q", platform::QueuePriority::Utility), [&](int) {
            EXPECT_EQ(configuration.value("device_name", "com.kestrel.halyard"), Value("kitchen"));
            ++heard;
        });

    for (const char* text : {"preferences.\"com.kestrel.halyard\".device_name = 'kitchen'",
                             "preferences.\"com.kestrel.halyard\".device_name = \"kitchen\"",
                             "preferences.\"com.kestrel.halyard\".device_name = broken"}) {
        tree.write("halyard.toml", text);
        configuration.reload();
        queues.runUntilIdle();
    }
    EXPECT_EQ(heard, 1);
}

} // namespace
} // namespace halyard::linux_
