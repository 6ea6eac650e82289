#include "linux/system/LinuxFiles.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "linux/system/AtomicFile.h"
#include "linux/system/SmallFile.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

class LinuxFilesTest : public ::testing::Test {
protected:
    std::string read(std::string_view path, std::size_t most = 100) {
        const auto result = files_.readFile((tree_ / path).string(), most);
        const auto* const error = std::get_if<Error>(&result);
        return error != nullptr ? error->message : std::get<std::string>(result);
    }
    std::vector<std::string> names() const {
        std::vector<std::string> result;
        for (const auto& entry : fs::directory_iterator(tree_.path())) {
            result.push_back(entry.path().filename().string());
        }
        return result;
    }

    halyard::testing::TempTree tree_;
    LinuxFiles files_{Directories{"/c", "/s", "/r", tree_ / "logs"}};
};

TEST_F(LinuxFilesTest, ReadsWholeFilesUpToABound) {
    tree_.write("small", "text\n");
    EXPECT_EQ(read("small", 5), "text\n");
    EXPECT_EQ(read("small", 4), "File too large");
    EXPECT_EQ(read("missing"), "No such file or directory");
    EXPECT_EQ(read(""), "Is a directory");
}

TEST_F(LinuxFilesTest, MakesDirectoriesWithTheirParentsLessTheMask) {
    for (const auto& [mask, mode] : {std::pair{0U, 0777U}, {0022U, 0755U}, {0027U, 0750U}}) {
        const std::string top = "a" + std::to_string(mask);
        const ::mode_t before = ::umask(mask);
        EXPECT_EQ(files_.createDirectories((tree_ / top / "b/c/").string(), 0777), std::nullopt);
        ::umask(before);
        for (const auto& made : {tree_ / top, tree_ / top / "b", tree_ / top / "b/c"}) {
            EXPECT_EQ(fs::status(made).permissions(), fs::perms(mode)) << made;
        }
    }
}

TEST_F(LinuxFilesTest, DirectoriesThatAreThereStayAsTheyAre) {
    fs::create_directories(tree_ / "a/b");
    fs::permissions(tree_ / "a/b", fs::perms::owner_all);
    EXPECT_EQ(files_.createDirectories((tree_ / "a/b").string(), 0777), std::nullopt);
    EXPECT_EQ(fs::status(tree_ / "a/b").permissions(), fs::perms::owner_all);
}

TEST_F(LinuxFilesTest, AFileWhereADirectoryShouldBeIsToldAsItIs) {
    tree_.write("file", "");
    EXPECT_EQ(files_.createDirectories((tree_ / "file/x").string(), 0777)->message, "File exists");
}

TEST_F(LinuxFilesTest, TellsWhereTheAudioLogsLie) {
    EXPECT_EQ(files_.located(
                  "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio/Reporting/x"),
              (tree_ / "logs/Reporting/x").string());
    EXPECT_EQ(files_.located("/etc/x"), "/etc/x");
}

TEST_F(LinuxFilesTest, TheAudioLogsLieInTheLogsDirectory) {
    const std::string traces =
        "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio/Traces";
    ASSERT_EQ(files_.createDirectories(traces, 0755), std::nullopt);
    ASSERT_EQ(files_.writeFileAtomically(traces + "/results", "1"), std::nullopt);
    EXPECT_EQ(read("logs/Traces/results"), "1");
}

TEST_F(LinuxFilesTest, WritesReplaceAndLeaveNothingElseBehind) {
    const std::string path = (tree_ / "file").string();
    ASSERT_EQ(files_.writeFileAtomically(path, "old, and longer"), std::nullopt);
    ASSERT_EQ(files_.writeFileAtomically(path, "new"), std::nullopt);
    EXPECT_EQ(read("file"), "new");
    EXPECT_THAT(names(), ::testing::ElementsAre("file"));
}

TEST_F(LinuxFilesTest, AFileThatIsAddedLeavesTheOthersAlone) {
    const std::string path = (tree_ / "a.json").string();
    for (const char* const text : {"1", "2", "3"}) {
        EXPECT_TRUE(std::holds_alternative<std::string>(files_.addFile(path, text)));
    }
    EXPECT_THAT(names(), ::testing::UnorderedElementsAre("a.json", "a-2.json", "a-3.json"));
    EXPECT_EQ(read("a.json"), "1");
    EXPECT_EQ(read("a-3.json"), "3");
}

TEST_F(LinuxFilesTest, OfTooManyAddedFilesTheOldestGo) {
    for (std::size_t i = 0; i < LinuxFiles::kMostAdded; ++i) {
        tree_.write(std::to_string(i), "");
        fs::last_write_time(tree_ / std::to_string(i),
                            fs::file_time_type::clock::now() - std::chrono::hours(i + 1));
    }
    (void)files_.addFile((tree_ / "new").string(), "");
    EXPECT_EQ(names().size(), LinuxFiles::kMostAdded);
    EXPECT_FALSE(fs::exists(tree_ / std::to_string(LinuxFiles::kMostAdded - 1)));
    EXPECT_TRUE(fs::exists(tree_ / "new"));
}

TEST_F(LinuxFilesTest, AddedFilesHaveABoundInBytesToo) {
    for (const char* const name : {"older", "old"}) {
        tree_.write(name, "");
        fs::resize_file(tree_ / name, LinuxFiles::kMostAddedBytes / 2);
    }
    fs::last_write_time(tree_ / "older", fs::file_time_type::clock::now() - std::chrono::hours(2));
    fs::last_write_time(tree_ / "old", fs::file_time_type::clock::now() - std::chrono::hours(1));
    (void)files_.addFile((tree_ / "new").string(), "text");
    EXPECT_THAT(names(), ::testing::UnorderedElementsAre("old", "new"));
}

TEST_F(LinuxFilesTest, FailedWritesTellAndLeaveWhatWasThere) {
    tree_.write("folder/file", "old");
    const auto error = files_.writeFileAtomically((tree_ / "folder").string(), "new");
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->code, EISDIR);
    EXPECT_EQ(files_.writeFileAtomically((tree_ / "no/file").string(), "new")->code, ENOENT);
    EXPECT_EQ(read("folder/file"), "old");
    EXPECT_THAT(names(), ::testing::ElementsAre("folder"));
}

TEST_F(LinuxFilesTest, AnAbandonedFileVanishes) {
    {
        AtomicFile file(tree_ / "file");
        file.write("half");
        EXPECT_THAT(names(), ::testing::SizeIs(1));
    }
    EXPECT_THAT(names(), ::testing::IsEmpty());
}

TEST_F(LinuxFilesTest, TheCurrentDirectoryIsAbsolute) {
    EXPECT_TRUE(fs::path(files_.currentDirectory()).is_absolute());
}

} // namespace
} // namespace halyard::linux_
