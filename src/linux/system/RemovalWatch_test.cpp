#include "linux/system/RemovalWatch.h"

#include <gtest/gtest.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

class RemovalWatchTest : public ::testing::Test {
protected:
    // How often it has told, once it has heard of everything.
    int told() {
        context_.restart();
        while (context_.poll() > 0) {
        }
        return told_;
    }

    testing::TempTree tree_;
    asio::io_context context_;
    int told_ = 0;
    RemovalWatch watch_{context_, tree_.path(), "kept.db", [this] { ++told_; },
                        std::chrono::milliseconds(0)};
};

TEST_F(RemovalWatchTest, TellsOfFilesThatAreRemovedMovedAwayOrReplaced) {
    tree_.write("kept.db", "");
    tree_.write("kept.db-log", "");
    tree_.write("other", "");
    EXPECT_EQ(told(), 0);
    std::filesystem::remove(tree_.path() / "kept.db-log");
    EXPECT_EQ(told(), 1);
    std::filesystem::rename(tree_.path() / "kept.db", tree_.path() / "away");
    EXPECT_EQ(told(), 2);
    std::filesystem::rename(tree_.path() / "other", tree_.path() / "kept.db");
    EXPECT_EQ(told(), 3);
}

TEST_F(RemovalWatchTest, TellsOnceOfSeveralAtATime) {
    tree_.write("kept.db", "");
    tree_.write("kept.db-log", "");
    std::filesystem::remove(tree_.path() / "kept.db-log");
    std::filesystem::remove(tree_.path() / "kept.db");
    EXPECT_EQ(told(), 1);
}

TEST_F(RemovalWatchTest, IsSilentAboutOtherFiles) {
    tree_.write("other", "");
    std::filesystem::remove(tree_.path() / "other");
    EXPECT_EQ(told(), 0);
}

} // namespace
} // namespace halyard::linux_
