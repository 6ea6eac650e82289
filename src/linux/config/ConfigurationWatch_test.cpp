#include "linux/config/ConfigurationWatch.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/Platform.h"
#include "testing/RecordingLog.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;

class ConfigurationWatchTest : public ::testing::Test {
protected:
    void watch(const fs::path& directory, std::chrono::milliseconds settleTime = 0ms) {
        watch_ = std::make_unique<ConfigurationWatch>(
            context_, directory, "halyard.toml", "halyard.d", [this] { ++told_; }, settleTime);
    }
    // Runs the loop until something was told; the limit is for failures only.
    bool toldOnce() {
        const int before = std::exchange(seen_, seen_ + 1);
        const auto limit = std::chrono::steady_clock::now() + 30s;
        while (told_ == before && context_.run_one_until(limit) > 0) {
        }
        return told_ == before + 1;
    }
    // Whether what has happened so far is told at all.
    bool toldNothing() {
        context_.poll();
        return told_ == seen_;
    }

    asio::io_context context_;
    testing::TempTree tree_;
    std::unique_ptr<ConfigurationWatch> watch_;
    int told_ = 0;
    int seen_ = 0;
};

TEST_F(ConfigurationWatchTest, AWrittenFileIsTold) {
    watch(tree_.path());

    tree_.write("halyard.toml", "a");
    EXPECT_TRUE(toldOnce());
    tree_.write("halyard.toml", "b");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, AFileMovedIntoPlaceIsTold) {
    watch(tree_.path());
    tree_.write("new", "a");
    EXPECT_TRUE(toldNothing());

    fs::rename(tree_ / "new", tree_ / "halyard.toml");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, ARemovedFileIsTold) {
    tree_.write("halyard.toml", "a");
    watch(tree_.path());

    fs::remove(tree_ / "halyard.toml");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, ANewLinkIsTold) {
    watch(tree_.path());

    fs::create_symlink("/etc/hostname", tree_ / "halyard.toml");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, OtherFilesAreNot) {
    watch(tree_.path());

    tree_.write("halyard.toml.swp", "a");
    tree_.write("halyard.tom", "a");
    fs::create_directory(tree_ / "drop-ins");
    EXPECT_TRUE(toldNothing());
}

TEST_F(ConfigurationWatchTest, ManyEventsOfOneTurnAreToldOnce) {
    watch(tree_.path());

    for (int i = 0; i < 100; ++i) {
        tree_.write("halyard.toml", "a");
    }
    EXPECT_TRUE(toldOnce());
    EXPECT_TRUE(toldNothing());
}

TEST_F(ConfigurationWatchTest, AFileThatOnlyChangesPlacesIsNotToldAsGone) {
    tree_.write("halyard.toml", "a");
    watch(tree_.path(), 24h);

    fs::rename(tree_ / "halyard.toml", tree_ / "halyard.toml~");
    EXPECT_TRUE(toldNothing());
    tree_.write("halyard.toml", "b");
    EXPECT_TRUE(toldOnce());
    EXPECT_TRUE(toldNothing());
}

TEST_F(ConfigurationWatchTest, ADirectoryThatAppearsIsFollowed) {
    watch(tree_ / "a/b/halyard");

    fs::create_directories(tree_ / "a/b");
    EXPECT_TRUE(toldOnce());
    tree_.write("a/b/halyard/halyard.toml", "a");
    EXPECT_TRUE(toldOnce());
    context_.poll();
    seen_ = told_;
    tree_.write("a/b/halyard/halyard.toml", "b");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, ADirectoryThatIsRemovedAndMadeAgainIsFollowed) {
    tree_.write("etc/halyard.toml", "a");
    watch(tree_ / "etc");

    fs::rename(tree_ / "etc", tree_ / "old");
    EXPECT_TRUE(toldOnce());
    tree_.write("old/halyard.toml", "b");
    EXPECT_TRUE(toldNothing());
    fs::rename(tree_ / "old", tree_ / "etc");
    EXPECT_TRUE(toldOnce());
    fs::remove_all(tree_ / "etc");
    EXPECT_TRUE(toldOnce());
    context_.poll();
    seen_ = told_;
    tree_.write("etc/halyard.toml", "c");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, ADropInThatIsWrittenMovedOrRemovedIsTold) {
    tree_.write("halyard.d/10.toml", "a");
    watch(tree_.path());

    tree_.write("halyard.d/10.toml", "b");
    EXPECT_TRUE(toldOnce());
    tree_.write("halyard.d/.20.toml.new", "a");
    EXPECT_TRUE(toldNothing());
    fs::rename(tree_ / "halyard.d/.20.toml.new", tree_ / "halyard.d/20.toml");
    EXPECT_TRUE(toldOnce());
    fs::remove(tree_ / "halyard.d/10.toml");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, WhatIsNoDropInIsNotTold) {
    tree_.write("halyard.d/10.toml", "a");
    watch(tree_.path());

    tree_.write("halyard.d/10.toml~", "a");
    tree_.write("halyard.d/.hidden.toml", "a");
    fs::create_directory(tree_ / "halyard.d/folder");
    EXPECT_TRUE(toldNothing());
}

TEST_F(ConfigurationWatchTest, AFolderOfDropInsThatAppearsIsFollowed) {
    watch(tree_.path());

    fs::create_directory(tree_ / "halyard.d");
    EXPECT_TRUE(toldOnce());
    tree_.write("halyard.d/10.toml", "a");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, AFolderOfDropInsThatIsRemovedAndMadeAgainIsFollowed) {
    tree_.write("halyard.d/10.toml", "a");
    watch(tree_.path());

    fs::rename(tree_ / "halyard.d", tree_ / "old");
    EXPECT_TRUE(toldOnce());
    tree_.write("old/10.toml", "b");
    EXPECT_TRUE(toldNothing());
    fs::rename(tree_ / "old", tree_ / "halyard.d");
    EXPECT_TRUE(toldOnce());
    tree_.write("halyard.d/10.toml", "c");
    EXPECT_TRUE(toldOnce());
    fs::remove_all(tree_ / "halyard.d");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, DropInsOfADirectoryThatAppearsAreFollowed) {
    watch(tree_ / "etc");

    fs::create_directories(tree_ / "new/halyard.d");
    fs::rename(tree_ / "new", tree_ / "etc");
    EXPECT_TRUE(toldOnce());
    tree_.write("etc/halyard.d/10.toml", "a");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, AFolderOfDropInsThatIsTheDirectoryItselfLosesNothing) {
    fs::create_directory_symlink(".", tree_ / "halyard.d");
    watch(tree_.path());

    tree_.write("halyard.toml", "a");
    EXPECT_TRUE(toldOnce());
    fs::remove(tree_ / "halyard.d");
    EXPECT_TRUE(toldOnce());
    tree_.write("halyard.toml", "b");
    EXPECT_TRUE(toldOnce());
}

TEST_F(ConfigurationWatchTest, NothingIsToldAfterItsEnd) {
    watch(tree_.path());
    tree_.write("halyard.toml", "a");
    context_.run_one();
    fs::remove(tree_ / "halyard.toml");
    context_.run_one();

    watch_.reset();
    context_.run();
    EXPECT_LE(told_, 1);
}

TEST_F(ConfigurationWatchTest, WhatCannotBeWatchedIsLogged) {
    testing::RecordingLog log;
    platform::Platform platform;
    platform.log = &log;
    platform::install(&platform);
    fs::create_directory_symlink("loop", tree_ / "loop");
    watch(tree_ / "loop");
    platform::install(nullptr);

    EXPECT_THAT(log.texts(LogLevel::Error),
                ::testing::ElementsAre("cannot watch " + (tree_ / "loop").native() +
                                       ": Too many levels of symbolic links; changes of the "
                                       "configuration are only seen on SIGHUP"));
    tree_.write("halyard.toml", "a");
    EXPECT_TRUE(toldNothing());
}

} // namespace
} // namespace halyard::linux_
