#include "linux/system/CollectedFiles.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <string>
#include <vector>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

TEST(CollectedFilesTest, WhatWasCollectedGoesAndTheRestStays) {
    const testing::TempTree tree;
    for (const char* const path :
         {"state/incidents/000001-x/signature.json", "state/incidents/.unfinished/a",
          "state/telemetry.db.damaged-20261121T033306Z",
          "state/telemetry.db.damaged-20261121T033306Z-wal", "log/Reporting/a.json",
          "log/Traces/b/c.pbj", "state/telemetry.db", "state/other", "log/other"}) {
        tree.write(path, "x");
    }
    EXPECT_TRUE(removeCollectedState(tree / "state").ok());
    EXPECT_TRUE(removeCollectedLogs(tree / "log").ok());
    std::vector<std::string> left;
    for (const auto& entry : fs::recursive_directory_iterator(tree.path())) {
        if (entry.is_regular_file()) {
            left.push_back(fs::relative(entry.path(), tree.path()));
        }
    }
    std::sort(left.begin(), left.end());
    EXPECT_EQ(left, (std::vector<std::string>{"log/other", "state/other", "state/telemetry.db"}));
}

TEST(CollectedFilesTest, WhatKilledDaemonsLeftHalfWrittenGoesAndTheRestStays) {
    const testing::TempTree tree;
    for (const char* const path :
         {"state/incidents/.unfinished/a", "state/incidents/000001-x/.a.json.7-1",
          "log/Reporting/.a.json.4711-0", "log/Reporting/a.json", "log/Reporting/.hidden",
          "log/Traces/b/.tracing_results.pbj.4711-12", "log/Traces/b/tracing_results.pbj"}) {
        tree.write(path, "x");
    }
    removeUnfinished(tree / "state", tree / "log");
    removeUnfinished(tree / "no state", tree / "no log");
    std::vector<std::string> left;
    for (const auto& entry : fs::recursive_directory_iterator(tree.path())) {
        if (entry.is_regular_file()) {
            left.push_back(fs::relative(entry.path(), tree.path()));
        }
    }
    std::sort(left.begin(), left.end());
    EXPECT_EQ(left, (std::vector<std::string>{"log/Reporting/.hidden", "log/Reporting/a.json",
                                              "log/Traces/b/tracing_results.pbj",
                                              "state/incidents/000001-x/.a.json.7-1"}));
}

TEST(CollectedFilesTest, WhereNothingIsThereIsNothingToDo) {
    EXPECT_TRUE(removeCollectedState("/nonexistent").ok());
    EXPECT_TRUE(removeCollectedLogs("/nonexistent").ok());
}

TEST(CollectedFilesTest, LinksAreRemovedAndNotFollowed) {
    const testing::TempTree tree;
    const fs::path precious = tree.write("precious/file", "x");
    fs::create_directories(tree / "state");
    fs::create_directory_symlink(tree / "precious", tree / "state/incidents");
    EXPECT_TRUE(removeCollectedState(tree / "state").ok());
    EXPECT_FALSE(fs::is_symlink(tree / "state/incidents"));
    EXPECT_TRUE(fs::exists(precious));
}

TEST(CollectedFilesTest, AFailureIsTold) {
    const Result<void> removed = removeCollectedLogs("/" + std::string(5000, 'x'));
    ASSERT_FALSE(removed.ok());
    EXPECT_EQ(removed.failure().code, std::errc::filename_too_long);
}

} // namespace
} // namespace halyard::linux_
