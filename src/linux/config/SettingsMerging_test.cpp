// Several configuration files read one over the other.

#include "linux/config/SettingsTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

// What `later` makes of the settings that `earlier` left.
Settings over(std::string_view earlier, std::string_view later) {
    auto result = parseSettings(later, "later", settings(earlier));
    EXPECT_TRUE(result.ok());
    return result.ok() ? std::move(result).value().settings : Settings();
}

TEST(SettingsOfSeveralFilesTest, WhatALaterFileLeavesOutStays) {
    const std::string_view all = "analytics.wanted = ['a']\naccess.users = ['kim']\n"
                                 "access.readers = 'adm'\nstore.max_age = '1d'\n"
                                 "log.level = 'debug'\nservice.idle_exit = '1m'\n"
                                 "preferences.d.k = 1\nfeature_flags.d.f = true\n"
                                 "device_properties.p = true\nexport.consent = true\n"
                                 "export.resource.a = 'b'\n";

    EXPECT_EQ(over(all, ""), settings(all));
    EXPECT_EQ(over(all, "[access]\n[store]\n[export]\n[preferences.d]\n"), settings(all));
}

TEST(SettingsOfSeveralFilesTest, ALaterFileWinsForEachKeyThatItHas) {
    const Settings both = over("store.max_age = '1d'\nstore.max_bytes = '1MiB'\n"
                               "access.users = ['kim', 'lee']\nexport.consent = true\n",
                               "store.max_age = '2d'\naccess.users = ['mo']\n"
                               "export.consent = false\n");

    EXPECT_EQ(both.store.maxAge, 48h);
    EXPECT_EQ(both.store.maxBytes, 1048576u);
    EXPECT_THAT(both.access.users, ElementsAre("mo"));
    EXPECT_FALSE(both.exporting.consent);
}

TEST(SettingsOfSeveralFilesTest, PreferencesSwitchesAndAttributesAreMergedByKey) {
    const Settings both = over("preferences.d = {a = 1, b = {x = 1}}\n"
                               "feature_flags.d = {f = true, g = true}\n"
                               "device_properties = {p = true, q = true}\n"
                               "export.resource = {r = '1', s = '1'}\n",
                               "preferences.d = {b = {y = 2}, c = 3}\npreferences.e.k = 4\n"
                               "feature_flags.d = {g = false}\n"
                               "device_properties = {q = false}\n"
                               "export.resource = {s = '2'}\n");

    EXPECT_EQ(both.preferences.at("d"),
              (Dictionary{{"a", 1}, {"b", Dictionary{{"y", 2}}}, {"c", 3}}));
    EXPECT_EQ(both.preferences.at("e")["k"], Value(4));
    EXPECT_EQ(both.featureFlags.at("d"), (Settings::Switches{{"f", true}, {"g", false}}));
    EXPECT_EQ(both.deviceProperties, (Settings::Switches{{"p", true}, {"q", false}}));
    EXPECT_EQ(both.exporting.resource,
              (std::map<std::string, std::string>{{"r", "1"}, {"s", "2"}}));
}

TEST(SettingsOfSeveralFilesTest, DriverChannelsAreAddedUpToTheirBound) {
    const auto channels = [](std::size_t count) {
        std::string text;
        for (std::size_t i = 0; i < count; ++i) {
            text += "[[drivers.channel]]\ngroup = 'g'\nname = 'n'\nsource = 'file:/x'\n";
        }
        return text;
    };
    EXPECT_EQ(over(channels(1), channels(kMaxDriverChannels - 1)).driverChannels.size(),
              kMaxDriverChannels);
    const auto beyond = parseSettings(channels(kMaxDriverChannels), "f", settings(channels(1)));
    ASSERT_FALSE(beyond.ok());
    EXPECT_EQ(beyond.failure().text, "drivers.channel has more than 1024 entries");
}

TEST(SettingsOfSeveralFilesTest, TheKeysThatAFileHasAreTold) {
    EXPECT_THAT(parsed("log.level = 'info'\n[export]\nconsent = false\n[store]\n").given,
                ElementsAre("export", "export.consent", "log", "log.level", "store"));
}

} // namespace
} // namespace halyard::linux_
