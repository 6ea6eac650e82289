#include "linux/config/Settings.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "linux/config/Quantities.h"
#include "linux/config/SettingsTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

TEST(SettingsTest, AnEmptyFileMeansTheStrictestDefaults) {
    const Settings defaults = settings("");

    EXPECT_EQ(defaults, Settings());
    EXPECT_TRUE(defaults.preferences.empty());
    EXPECT_TRUE(defaults.featureFlags.empty());
    EXPECT_TRUE(defaults.deviceProperties.empty());
    EXPECT_THAT(defaults.wantedEvents, ElementsAre("com.kestrel.halyard.*"));
    EXPECT_EQ(defaults.access, Access());
    EXPECT_EQ(defaults.store.maxBytes, 268435456u);
    EXPECT_EQ(defaults.store.maxAge, 7 * 24h);
    EXPECT_EQ(defaults.logLevel, LogLevel::Info);
    EXPECT_TRUE(defaults.driverChannels.empty());
}

TEST(SettingsTest, EmptySectionsMeanTheDefaultsToo) {
    EXPECT_EQ(settings("[preferences]\n[feature_flags]\n[device_properties]\n[analytics]\n"
                       "[access]\n[store]\n[log]\n[drivers]\n"),
              Settings());
}

TEST(SettingsTest, ReadsSwitchesListsAndLimits) {
    const Settings all = settings(R"(
[feature_flags.AudioAnalytics]
Tracing = true
[device_properties]
InternalBuild = true
[analytics]
wanted = ["a.*", "b?"]
[access]
users = ["kim", 1000]
groups = ["audio"]
admin_users = ["ops"]
[store]
max_bytes = "1GiB"
max_age = "12h"
[log]
level = "debug"
[service]
idle_exit = "10m"
)");
    EXPECT_TRUE(all.featureFlags.at("AudioAnalytics").at("Tracing"));
    EXPECT_TRUE(all.deviceProperties.at("InternalBuild"));
    EXPECT_THAT(all.wantedEvents, ElementsAre("a.*", "b?"));
    EXPECT_THAT(all.access.users, ElementsAre("kim", "1000"));
    EXPECT_THAT(all.access.groups, ElementsAre("audio"));
    EXPECT_THAT(all.access.adminUsers, ElementsAre("ops"));
    EXPECT_EQ(all.store.maxBytes, 1073741824u);
    EXPECT_EQ(all.store.maxAge, 12h);
    EXPECT_EQ(all.logLevel, LogLevel::Debug);
    EXPECT_EQ(all.idleExit, 10min);
}

TEST(SettingsTest, AnEmptyListOfWantedEventsWantsNone) {
    EXPECT_THAT(settings("analytics.wanted = []").wantedEvents, ElementsAre());
}

TEST(SettingsTest, PreferencesKeepEveryKindOfValue) {
    const auto all = settings(R"(
[preferences."com.kestrel.pinwheel"]
on = true
count = -9223372036854775808
ratio = 0.5
text = "kitchen ünit"
moment = 2024-02-29T12:30:01.5+01:00
local = 2024-02-29T12:30:01
day = 1969-12-31
hour = 07:08:09
fine = 07:08:09.000000001
list = [1, "two", [3.0], {four = 4}]
table = {a = {b = 1}}
)");
    const Dictionary& values = all.preferences.at("com.kestrel.pinwheel");

    EXPECT_EQ(values["on"], Value(true));
    EXPECT_EQ(values["count"], Value(std::numeric_limits<std::int64_t>::min()));
    EXPECT_EQ(values["ratio"], Value(0.5));
    EXPECT_EQ(values["text"], Value("kitchen ünit"));
    EXPECT_EQ(values["moment"], Value(Date{1709206201, 500'000'000}));
    EXPECT_EQ(values["local"], Value(Date{1709209801, 0}));
    EXPECT_EQ(values["day"], Value(Date{-86400, 0}));
    EXPECT_EQ(values["hour"], Value("07:08:09"));
    EXPECT_EQ(values["fine"], Value("07:08:09.000000001"));
    EXPECT_EQ(values["list"], Value(List{1, "two", List{3.0}, Dictionary{{"four", 4}}}));
    EXPECT_EQ(values["table"], Value(Dictionary{{"a", Dictionary{{"b", 1}}}}));
}

TEST(SettingsTest, ReadsDriverChannels) {
    const Settings all = settings(R"(
[[drivers.channel]]
group = "Speaker"
name = "Underruns"
format = "simple"
source = "file:/sys/kernel/x"
[[drivers.channel]]
subgroup = "QLX"
driver = "dsp"
name = "Latency"
unit = "ms"
format = "histogram"
source = "histogram:/run/latency"
)");
    ASSERT_EQ(all.driverChannels.size(), 2u);
    const DriverChannel& first = all.driverChannels[0];
    EXPECT_EQ(first.group, "Speaker");
    EXPECT_EQ(first.subgroup, std::nullopt);
    EXPECT_EQ(first.source, "file:/sys/kernel/x");
    EXPECT_EQ(all.driverChannels[1],
              (DriverChannel{std::nullopt, "QLX", "dsp", "Latency", "ms", ChannelFormat::Histogram,
                             "histogram:/run/latency"}));
}

TEST(SettingsTest, AChannelWithoutFormatHasTheUsualOneOfItsSource) {
    const auto formatOf = [](const std::string& source) {
        return settings("[[drivers.channel]]\ngroup = 'g'\nname = 'n'\nsource = '" + source + "'")
            .driverChannels.at(0)
            .format;
    };
    EXPECT_EQ(formatOf("file:/x"), ChannelFormat::Simple);
    EXPECT_EQ(formatOf("field:/x:1:2"), ChannelFormat::Simple);
    EXPECT_EQ(formatOf("cpuidle:/x"), ChannelFormat::State);
    EXPECT_EQ(formatOf("runtime_pm:/x"), ChannelFormat::State);
    EXPECT_EQ(formatOf("cpufreq:/x"), ChannelFormat::State);
    EXPECT_EQ(formatOf("devfreq:/x"), ChannelFormat::State);
    EXPECT_EQ(formatOf("alsa_states:/x"), ChannelFormat::State);
    EXPECT_EQ(formatOf("alsa_frames:/x"), ChannelFormat::Simple);
    EXPECT_EQ(formatOf("tracefs_hist:/x"), ChannelFormat::Histogram);
    EXPECT_EQ(formatOf("histogram:/x"), ChannelFormat::Histogram);
}

TEST(SettingsErrorTest, SyntaxErrorsNameFileLineAndColumn) {
    const auto result = parseSettings("[log]\nlevel = = 1\n", "/etc/halyard/halyard.toml");

    ASSERT_FALSE(result.ok());
    EXPECT_EQ(result.failure().file, "/etc/halyard/halyard.toml");
    EXPECT_EQ(result.failure().line, 2u);
    EXPECT_EQ(result.failure().column, 9u);
    EXPECT_FALSE(result.failure().text.empty());
}

TEST(SettingsErrorTest, InvalidUtf8AndDuplicateKeysAreErrors) {
    EXPECT_THAT(mistake("[log]\nlevel = \"\xff\"\n"), HasSubstr("2:"));
    EXPECT_THAT(mistake("[log]\nlevel = \"info\"\nlevel = \"info\"\n"), HasSubstr("3:"));
}

TEST(SettingsErrorTest, EverySectionMustBeATable) {
    for (const std::string section : {"preferences", "feature_flags", "device_properties",
                                      "analytics", "access", "store", "log", "drivers"}) {
        EXPECT_EQ(mistake(section + " = 1"),
                  "1:" + std::to_string(section.size() + 4) + ": " + section + " must be a table");
    }
    EXPECT_EQ(mistake("preferences.x = 1"), "1:17: preferences.\"x\" must be a table");
    EXPECT_EQ(mistake("feature_flags.x = 1"), "1:19: feature_flags.x must be a table");
}

TEST(SettingsErrorTest, KindsAreChecked) {
    EXPECT_EQ(mistake("feature_flags.x.y = 1"), "1:21: feature_flags.x.y must be true or false");
    EXPECT_EQ(mistake("device_properties.InternalBuild = \"yes\""),
              "1:35: device_properties.InternalBuild must be true or false");
    EXPECT_EQ(mistake("analytics.wanted = \"*\""),
              "1:20: analytics.wanted must be a list of texts");
    EXPECT_EQ(mistake("analytics.wanted = [\"a\", 1]"),
              "1:26: analytics.wanted must be a list of texts");
    EXPECT_EQ(mistake("analytics.wanted = [\"\"]"),
              "1:21: analytics.wanted must be a list of texts");
    EXPECT_EQ(mistake("access.users = [-1]"),
              "1:17: access.users must be a list of texts or numeric ids");
    EXPECT_EQ(mistake("access.groups = [4294967295]"),
              "1:18: access.groups must be a list of texts or numeric ids");
}

TEST(SettingsErrorTest, LevelsAreNamesOfTheList) {
    const std::string message =
        "1:13: log.level must be one of \"debug\", \"info\", \"default\", \"error\"";
    EXPECT_EQ(mistake("log.level = \"warning\""), message);
    EXPECT_EQ(mistake("log.level = \"Info\""), message);
    EXPECT_EQ(mistake("log.level = 3"), message);
    EXPECT_EQ(settings("log.level = \"error\"").logLevel, LogLevel::Error);
    EXPECT_EQ(settings("log.level = \"default\"").logLevel, LogLevel::Default);
}

TEST(SettingsErrorTest, TheStoreHoldsAtLeast256KiB) {
    EXPECT_EQ(settings("store.max_bytes = 262144").store.maxBytes, 262144u);
    EXPECT_EQ(settings("store.max_bytes = \"256KiB\"").store.maxBytes, 262144u);
    EXPECT_EQ(mistake("store.max_bytes = 262143"), "1:19: store.max_bytes must be at least 256KiB");
    EXPECT_EQ(mistake("store.max_bytes = \"255KiB\""),
              "1:19: store.max_bytes must be at least 256KiB");
    const std::string message =
        "1:19: store.max_bytes must be a size such as \"256MiB\" or a number of bytes";
    for (const char* value : {"-1", "1.5", "true", "\"\"", "\"lots\"", "\"9999999TiB\""}) {
        EXPECT_EQ(mistake(std::string("store.max_bytes = ") + value), message) << value;
    }
}

TEST(SettingsErrorTest, SessionsCountUpToALimit) {
    EXPECT_EQ(settings("").sessions.uploadLimit, 5);
    EXPECT_FALSE(settings("").sessions.recount);
    EXPECT_EQ(settings("sessions.upload_limit = 0").sessions.uploadLimit, 0);
    EXPECT_TRUE(settings("sessions.recount = true").sessions.recount);
    EXPECT_EQ(mistake("sessions.upload_limit = -1"),
              "1:25: sessions.upload_limit must be a number, 0 or more");
    EXPECT_EQ(mistake("sessions.recount = 1"), "1:20: sessions.recount must be true or false");
}

TEST(SettingsErrorTest, TheStoreKeepsAtLeastASecond) {
    EXPECT_EQ(settings("store.max_age = \"1s\"").store.maxAge, 1s);
    EXPECT_EQ(mistake("store.max_age = \"0d\""), "1:17: store.max_age must be at least \"1s\"");
    EXPECT_EQ(settings("store.max_age = \"36500d\"").store.maxAge, kMaxDuration);
    for (const char* value : {"7", "\"7\"", "\"36501d\"", "\"a week\"", "07:00:00"}) {
        EXPECT_THAT(mistake(std::string("store.max_age = ") + value),
                    HasSubstr("1:17: store.max_age must be a duration"))
            << value;
    }
}

TEST(SettingsErrorTest, TheDaemonIsIdleForAtLeastASecond) {
    EXPECT_EQ(settings("").idleExit, std::nullopt);
    EXPECT_EQ(settings("service.idle_exit = \"1s\"").idleExit, 1s);
    EXPECT_EQ(mistake("service.idle_exit = \"0s\""),
              "1:21: service.idle_exit must be at least \"1s\"");
    EXPECT_THAT(mistake("service.idle_exit = 60"), HasSubstr("must be a duration such as"));
}

TEST(SettingsErrorTest, AChannelNeedsItsGroupNameAndSource) {
    const auto channel = [](std::string_view keys) {
        return mistake("[[drivers.channel]]\n" + std::string(keys));
    };
    EXPECT_EQ(channel("name = 'n'\nsource = 'file:/x'"),
              "1:1: drivers.channel needs a group or a subgroup");
    EXPECT_EQ(channel("group = 'g'\nsource = 'file:/x'"), "1:1: drivers.channel needs a name");
    for (const char* source :
         {"", "source = ''", "source = '/x'", "source = 'file:'", "source = ':/x'"}) {
        EXPECT_EQ(channel(std::string("group = 'g'\nname = 'n'\n") + source),
                  "1:1: drivers.channel needs a source such as \"file:/sys/...\"");
    }
    EXPECT_THAT(channel("group = 'g'\nname = 'n'\nsource = 'file:/x'\nformat = 'pie'"),
                HasSubstr("5:10: drivers.channel.format must be one of \"simple\", "));
    EXPECT_THAT(mistake("drivers.channel = [1]"), HasSubstr("drivers.channel must be a table"));
    EXPECT_THAT(mistake("[drivers.channel]\ngroup = 'g'"), HasSubstr("must be a list of tables"));
}

TEST(SettingsErrorTest, OfSeveralMistakesTheFirstOfTheFileIsTold) {
    EXPECT_EQ(mistake("store.max_age = 1\naccess.users = 1\n").substr(0, 16), "1:17: store.max_");
}

TEST(SettingsErrorTest, NestingIsBounded) {
    const auto nested = [](int depth) {
        std::string text = "preferences.d.k = ";
        text.append(static_cast<std::size_t>(depth), '[');
        text.append(static_cast<std::size_t>(depth), ']');
        return mistake(text);
    };
    EXPECT_EQ(nested(kMaxPreferenceDepth), "");
    EXPECT_THAT(nested(kMaxPreferenceDepth + 1), HasSubstr("nests deeper than 32"));
}

TEST(SettingsErrorTest, KeysOfAThousandPartsAreRefusedBeforeTheyNest) {
    const auto dotted = [](int dots) {
        std::string text = "\n";
        for (int i = 0; i < dots; ++i) {
            text += "a.";
        }
        return mistake(text + "a = 1");
    };
    EXPECT_EQ(dotted(8192), "");
    EXPECT_EQ(dotted(8193), "2:1: more than 8192 dots in one file");
    EXPECT_EQ(dotted(500000), "2:1: more than 8192 dots in one file");
}

TEST(SettingsWarningTest, UnknownKeysAreToldWithTheirLines) {
    EXPECT_THAT(
        warnings("colour = 1\n[log]\nlevel = \"info\"\nLevel = 2\n[store]\n[access]\n"
                 "root = []\n[[drivers.channel]]\ngroup = 'g'\nname = 'n'\n"
                 "source = 'file:/x'\nspeed = 1\n"),
        ElementsAre(SettingsWarning{1, "unknown key colour has no effect"},
                    SettingsWarning{4, "unknown key log.Level has no effect"},
                    SettingsWarning{7, "unknown key access.root has no effect"},
                    SettingsWarning{12, "unknown key drivers.channel.speed has no effect"}));
}

TEST(SettingsWarningTest, PreferencesOfTheWrongKindAreKeptAndTold) {
    const ParsedSettings result = parsed("[preferences.\"com.kestrel.halyard\"]\n"
                                         "device_name = 5\ndisable_reporting = \"no\"\n");

    EXPECT_EQ(result.settings.preferences.at("com.kestrel.halyard")["device_name"], Value(5));
    EXPECT_THAT(result.warnings,
                ElementsAre(SettingsWarning{2, "device_name should be a text"},
                            SettingsWarning{3, "disable_reporting should be true or false"}));
}

TEST(SettingsWarningTest, ADomainWithoutItsQuotesIsTold) {
    EXPECT_THAT(warnings("[preferences.com.kestrel.halyard]\ndevice_name = \"x\"\n"),
                ElementsAre(SettingsWarning{
                    1, "preferences.com holds only tables: a domain with dots needs quotes"}));
}

TEST(SettingsWarningTest, WarningsAreBoundedAndTheRestIsCounted) {
    std::string text;
    for (std::size_t i = 0; i < kMaxSettingsWarnings + 3; ++i) {
        text += "k" + std::to_string(i) + " = 1\n";
    }
    const ParsedSettings result = parsed(text);

    EXPECT_EQ(result.warnings.size(), kMaxSettingsWarnings);
    EXPECT_EQ(result.warnings.front().line, 1u);
    EXPECT_EQ(result.warningsLeftOut, 3u);
}

TEST(SettingsTest, TheSyncIntervalIsBetween50MillisecondsAnd10Minutes) {
    EXPECT_EQ(settings("").store.syncInterval, 50ms);
    EXPECT_EQ(settings("[store]\nsync_interval = \"50ms\"").store.syncInterval, 50ms);
    EXPECT_EQ(settings("[store]\nsync_interval = \"5s\"").store.syncInterval, 5s);
    EXPECT_EQ(settings("[store]\nsync_interval = \"10m\"").store.syncInterval, 10min);
    for (const char* wrong : {"\"49ms\"", "\"11m\"", "5", "\"\""}) {
        EXPECT_EQ(mistake(std::string("[store]\nsync_interval = ") + wrong),
                  "2:17: store.sync_interval must be a duration from \"50ms\" to \"10m\"");
    }
}

TEST(SettingsTest, LimitsOfClients) {
    const platform::ClientLimits limits =
        settings("[limits]\nmemory = \"1GiB\"\nsessions = 7\nconnections = 8\n"
                 "configuration = 4096\nsummary = \"1MiB\"\ncopies = 0")
            .clients;
    EXPECT_EQ(limits, (platform::ClientLimits{std::size_t{1} << 30, 7, 8, 4096, 1 << 20, 0}));
    EXPECT_EQ(mistake("limits.sessions = 0"), "1:19: limits.sessions must be a number, 1 or more");
    EXPECT_EQ(mistake("limits.copies = \"much\""),
              "1:17: limits.copies must be a size such as \"256MiB\" or a number of bytes");
}

} // namespace
} // namespace halyard::linux_
