#include "linux/system/PrivateFiles.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "linux/system/AtomicFile.h"
#include "linux/system/CollectedFiles.h"
#include "linux/system/LinuxFiles.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

class PrivateFilesTest : public ::testing::Test {
protected:
    ~PrivateFilesTest() override { setReaders(std::nullopt); }

    static mode_t modeOf(const fs::path& path) {
        struct stat facts {};
        EXPECT_EQ(::lstat(path.c_str(), &facts), 0) << path;
        return facts.st_mode & 07777;
    }
    fs::path fileOf(const char* name, mode_t mode) {
        const fs::path path = tree_.write(name, "text");
        ::chmod(path.c_str(), mode);
        return path;
    }
    fs::path directoryOf(const char* name, mode_t mode) {
        fs::create_directories(tree_ / name);
        ::chmod((tree_ / name).c_str(), mode);
        return tree_ / name;
    }

    testing::TempTree tree_;
};

TEST_F(PrivateFilesTest, FilesLoseWhatOthersHadAndDirectoriesWhatIsBeyond0750) {
    const fs::path file = fileOf("state/telemetry.db", 0666);
    const fs::path closed = directoryOf("state/incidents/1-x", 0700);
    const fs::path open = directoryOf("state", 0777);
    ASSERT_TRUE(keepCollectedPrivate(open, tree_ / "absent").ok());
    EXPECT_EQ(modeOf(file), 0600U);
    EXPECT_EQ(modeOf(open), 0750U);
    EXPECT_EQ(modeOf(closed), 0700U);
}

TEST_F(PrivateFilesTest, WhatIsNobodysDoingStaysAsItIs) {
    const fs::path foreign = fileOf("state/notes.txt", 0644);
    ASSERT_TRUE(keepCollectedPrivate(tree_ / "state", tree_ / "log").ok());
    EXPECT_EQ(modeOf(foreign), 0644U);
}

TEST_F(PrivateFilesTest, ReadersReadWhatTheyOwn) {
    setReaders(::getegid());
    const fs::path file = fileOf("log/Reporting/x.json", 0600);
    const fs::path folder = directoryOf("log/Reporting", 0700);
    ASSERT_TRUE(keepCollectedPrivate(tree_ / "state", tree_ / "log").ok());
    EXPECT_EQ(modeOf(file), 0640U);
    EXPECT_EQ(modeOf(folder), 0750U);
}

TEST_F(PrivateFilesTest, AGroupThatMayNotBeGivenTheFilesReadsNothing) {
    if (::geteuid() == 0) {
        GTEST_SKIP() << "root may give files to any group";
    }
    setReaders(0);
    const fs::path file = fileOf("file", 0644);
    EXPECT_FALSE(keepPrivate(file).ok());
    EXPECT_EQ(modeOf(file), 0600U);
}

TEST_F(PrivateFilesTest, NewFilesAreForTheReadersToo) {
    setReaders(::getegid());
    const mode_t before = ::umask(0077);
    AtomicFile file(tree_ / "file");
    EXPECT_TRUE(file.commit().ok());
    ::umask(before);
    EXPECT_EQ(modeOf(tree_ / "file"), 0640U);
}

TEST_F(PrivateFilesTest, ALinkIsNeitherFollowedNorChanged) {
    const fs::path target = fileOf("target", 0666);
    fs::create_symlink(target, tree_ / "link");
    EXPECT_TRUE(keepPrivate(tree_ / "link").ok());
    EXPECT_EQ(modeOf(target), 0666U);
}

TEST_F(PrivateFilesTest, ALinkInTheLogsDirectoryIsNotWrittenThrough) {
    directoryOf("elsewhere", 0755);
    directoryOf("log", 0755);
    fs::create_symlink(tree_ / "elsewhere", tree_ / "log/Reporting");
    LinuxFiles files(Directories{"/c", "/s", "/r", tree_ / "log"});
    const std::string folder = (tree_ / "log/Reporting").string();
    EXPECT_NE(files.createDirectories(folder, 0777), std::nullopt);
    EXPECT_NE(files.writeFileAtomically(folder + "/x", "text"), std::nullopt);
    EXPECT_TRUE(fs::is_empty(tree_ / "elsewhere"));
}

} // namespace
} // namespace halyard::linux_
