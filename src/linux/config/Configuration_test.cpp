#include "linux/config/Configuration.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <thread>

#include "linux/config/SettingsFiles.h"
#include "platform/Platform.h"
#include "testing/RecordingLog.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::StartsWith;
using Outcome = Configuration::Outcome;

class ConfigurationTest : public ::testing::Test {
protected:
    ConfigurationTest() {
        platform_.log = &log_;
        platform::install(&platform_);
    }
    ~ConfigurationTest() override { platform::install(nullptr); }

    Outcome reloadWith(std::string_view text) {
        tree_.write("halyard.toml", text);
        return configuration_.reload();
    }
    std::string file() const { return (tree_ / "halyard.toml").native(); }

    testing::RecordingLog log_;
    platform::Platform platform_;
    testing::TempTree tree_;
    Configuration configuration_{tree_.path()};
};

TEST_F(ConfigurationTest, WithoutAFileTheDefaultsAreInForce) {
    EXPECT_EQ(configuration_.reload(), Outcome::Unchanged);
    EXPECT_EQ(*configuration_.settings(), Settings());
    EXPECT_THAT(log_.texts(), ElementsAre());
}

TEST_F(ConfigurationTest, WithoutItsDirectoryTheDefaultsAreInForce) {
    Configuration configuration(tree_ / "none");

    EXPECT_EQ(configuration.reload(), Outcome::Unchanged);
    EXPECT_EQ(*configuration.settings(), Settings());
}

TEST_F(ConfigurationTest, AnswersTheCoreFromTheFile) {
    reloadWith("preferences.d = {k = 'v'}\nfeature_flags.AudioAnalytics.Tracing = true\n"
               "device_properties.InternalBuild = true\n");

    EXPECT_EQ(configuration_.value("k", "d"), Value("v"));
    EXPECT_TRUE(configuration_.isEnabled("AudioAnalytics", "Tracing"));
    EXPECT_EQ(configuration_.boolean("InternalBuild"), true);
}

TEST_F(ConfigurationTest, WhatTheFileDoesNotSayIsAbsentOrOff) {
    reloadWith("preferences.d = {k = 'v'}\nfeature_flags.AudioAnalytics.Tracing = true\n");

    EXPECT_EQ(configuration_.value("other", "d").kind(), Value::Kind::None);
    EXPECT_EQ(configuration_.value("k", "other").kind(), Value::Kind::None);
    EXPECT_FALSE(configuration_.isEnabled("AudioAnalytics", "Other"));
    EXPECT_FALSE(configuration_.isEnabled("Other", "Tracing"));
    EXPECT_EQ(configuration_.boolean("InternalBuild"), std::nullopt);
}

TEST_F(ConfigurationTest, ABrokenFileAtStartLeavesTheDefaults) {
    EXPECT_EQ(reloadWith("log.level = 'debug'\n[store]\nmax_age = 7\n"), Outcome::Refused);

    EXPECT_EQ(*configuration_.settings(), Settings());
    EXPECT_THAT(log_.texts(LogLevel::Error),
                ElementsAre(AllOf(StartsWith(file() + ":3:11: store.max_age must be "),
                                  EndsWith("; the defaults are in force"))));
}

TEST_F(ConfigurationTest, ABrokenFileLaterLeavesTheLastGoodOne) {
    reloadWith("log.level = 'debug'\n");
    log_.clear();

    EXPECT_EQ(reloadWith("log.level = \n"), Outcome::Refused);
    EXPECT_EQ(configuration_.settings()->logLevel, LogLevel::Debug);
    EXPECT_THAT(log_.texts(LogLevel::Error),
                ElementsAre(AllOf(StartsWith(file() + ":1:"),
                                  EndsWith("; the last good configuration stays in force"))));
}

TEST_F(ConfigurationTest, AFileThatCannotBeReadLeavesTheLastGoodOne) {
    reloadWith("log.level = 'debug'\n");
    log_.clear();

    EXPECT_EQ(reloadWith(std::string(kMaxSettingsBytes + 1, '\n')), Outcome::Refused);
    std::filesystem::remove(file());
    std::filesystem::create_directory(file());
    EXPECT_EQ(configuration_.reload(), Outcome::Refused);

    EXPECT_EQ(configuration_.settings()->logLevel, LogLevel::Debug);
    EXPECT_THAT(log_.texts(), ElementsAre(StartsWith(file() + ":0:0: File too large"),
                                          StartsWith(file() + ":0:0: Is a directory")));
}

TEST_F(ConfigurationTest, RemovingTheFileMeansTheDefaults) {
    reloadWith("log.level = 'debug'\n");

    std::filesystem::remove(file());
    EXPECT_EQ(configuration_.reload(), Outcome::Changed);
    EXPECT_EQ(*configuration_.settings(), Settings());
}

TEST_F(ConfigurationTest, DropInsWinInOrderOfTheirNames) {
    tree_.write("halyard.d/20.toml", "log.level = 'error'\n");
    tree_.write("halyard.d/10.toml", "log.level = 'default'\nstore.max_age = '2d'\n");
    reloadWith("log.level = 'debug'\nstore.max_age = '1d'\nstore.max_bytes = '1MiB'\n");

    EXPECT_EQ(configuration_.settings()->logLevel, LogLevel::Error);
    EXPECT_EQ(configuration_.settings()->store.maxAge, std::chrono::hours(48));
    EXPECT_EQ(configuration_.settings()->store.maxBytes, 1048576u);
    EXPECT_THAT(log_.texts(),
                ElementsAre("configuration of " + file() + " and 2 of halyard.d is in force"));
}

TEST_F(ConfigurationTest, DropInsHoldWithoutTheFileBeforeThem) {
    tree_.write("halyard.d/10.toml", "log.level = 'debug'\n");

    EXPECT_EQ(configuration_.reload(), Outcome::Changed);
    EXPECT_EQ(configuration_.settings()->logLevel, LogLevel::Debug);
}

TEST_F(ConfigurationTest, OneBrokenFileLeavesTheLastGoodConfigurationAsAWhole) {
    tree_.write("halyard.d/10.toml", "log.level = 'debug'\n");
    reloadWith("store.max_bytes = '1MiB'\n");
    log_.clear();

    tree_.write("halyard.d/10.toml", "log.level = 'info'\n");
    tree_.write("halyard.d/20.toml", "\nlog.level = 'loud'\n");
    EXPECT_EQ(reloadWith("store.max_bytes = '2MiB'\n"), Outcome::Refused);

    EXPECT_EQ(configuration_.settings()->logLevel, LogLevel::Debug);
    EXPECT_EQ(configuration_.settings()->store.maxBytes, 1048576u);
    EXPECT_THAT(log_.texts(), ElementsAre(StartsWith((tree_ / "halyard.d/20.toml").native() +
                                                     ":2:13: log.level must be one of ")));
}

TEST_F(ConfigurationTest, WarningsAreLoggedWithTheirLines) {
    reloadWith("\nlog.colour = 'red'\n");

    EXPECT_THAT(log_.texts(), ElementsAre(file() + ":2: unknown key log.colour has no effect"));
}

TEST_F(ConfigurationTest, ObserversSeeOldAndNewOfEveryChange) {
    std::vector<std::pair<LogLevel, LogLevel>> seen;
    configuration_.observe([&](const Settings& before, const Settings& after) {
        EXPECT_EQ(configuration_.settings()->logLevel, after.logLevel);
        seen.emplace_back(before.logLevel, after.logLevel);
    });

    EXPECT_EQ(reloadWith("log.level = 'debug'\n"), Outcome::Changed);
    EXPECT_EQ(reloadWith("# the same\nlog.level = 'debug'\n"), Outcome::Unchanged);
    EXPECT_EQ(reloadWith("log.level = 7\n"), Outcome::Refused);
    EXPECT_EQ(reloadWith("log.level = 'error'\n"), Outcome::Changed);

    EXPECT_THAT(seen, ElementsAre(std::pair(LogLevel::Info, LogLevel::Debug),
                                  std::pair(LogLevel::Debug, LogLevel::Error)));
}

TEST_F(ConfigurationTest, ASnapshotOutlivesAReload) {
    reloadWith("preferences.d.k = 'a long value of the old file'\n");
    const std::shared_ptr<const Settings> before = configuration_.settings();

    reloadWith("");
    EXPECT_EQ(before->preferences.at("d")["k"], Value("a long value of the old file"));
}

TEST_F(ConfigurationTest, ReadersAndReloadsMayComeFromAnyThread) {
    std::thread reader([this] {
        for (int i = 0; i < 500; ++i) {
            const Value seen = configuration_.value("k", "d");
            EXPECT_TRUE(seen.isNone() || seen.text().starts_with("a value longer than"));
        }
    });
    for (int i = 0; i < 50; ++i) {
        reloadWith("preferences.d.k = 'a value longer than fifteen " + std::to_string(i) + "'\n");
    }
    reader.join();
}

} // namespace
} // namespace halyard::linux_
