#include "linux/drivers/SharedFolder.h"

#include <cstdlib>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include "linux/drivers/SampledFile.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;
using ::testing::UnorderedElementsAre;

constexpr std::uint32_t kOther = 12345;

class SharedFolderTest : public ::testing::Test {
protected:
    SharedFolderTest() { EXPECT_TRUE(SharedFolder::make(path_).ok()); }

    std::errc openError(const std::string& name) {
        const Result<int> opened = folder_.open(name);
        if (opened.ok()) {
            ::close(opened.value());
            return {};
        }
        return opened.failure().code;
    }
    std::vector<std::string> names() {
        std::vector<std::string> names;
        complete_ = folder_.look([&](const char* name) {
            names.emplace_back(name);
            return true;
        });
        std::erase(names, ".");
        std::erase(names, "..");
        return names;
    }

    testing::TempTree tree_;
    fs::path path_ = tree_ / "shared";
    SharedFolder folder_{path_, [](std::uint32_t uid) { return uid == ::geteuid(); }};
    bool complete_ = false;
};

TEST_F(SharedFolderTest, EverybodyMayWriteToItAndRemoveTheirOwn) {
    struct stat facts {};
    const mode_t before = ::umask(077);
    EXPECT_TRUE(SharedFolder::make(tree_ / "other").ok());
    ::umask(before);
    for (const char* name : {"shared", "other"}) {
        ASSERT_EQ(::stat((tree_ / name).c_str(), &facts), 0);
        EXPECT_EQ(facts.st_mode & 07777U, 01777U);
    }
}

TEST_F(SharedFolderTest, OneThatIsThereGetsItsMode) {
    tree_.write("shared/file", "1");
    fs::permissions(path_, fs::perms::owner_all);
    EXPECT_TRUE(SharedFolder::make(path_).ok());
    EXPECT_EQ(fs::status(path_).permissions(), fs::perms(01777));
    EXPECT_EQ(openError("file"), std::errc());
}

TEST_F(SharedFolderTest, IsNotMadeWhereSomethingElseIs) {
    tree_.write("file", "");
    fs::create_directory_symlink(path_, tree_ / "link");
    EXPECT_FALSE(SharedFolder::make(tree_ / "file").ok());
    EXPECT_FALSE(SharedFolder::make(tree_ / "link").ok());
    EXPECT_FALSE(SharedFolder::make(tree_ / "no/where").ok());
    EXPECT_FALSE((SharedFolder{tree_ / "link", {}}.isThere()));
    EXPECT_TRUE(folder_.isThere());
}

TEST_F(SharedFolderTest, OfAnotherUserIsNotTaken) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can make folders of others";
    }
    ASSERT_EQ(::chown(path_.c_str(), kOther, kOther), 0);
    const Result<void> made = SharedFolder::make(path_);
    ASSERT_FALSE(made.ok());
    EXPECT_EQ(made.failure().code, std::errc::operation_not_permitted);
}

TEST_F(SharedFolderTest, OpensFilesOfTrustedOwners) {
    tree_.write("shared/file", "1");
    EXPECT_EQ(openError("file"), std::errc());
    EXPECT_EQ(openError("none"), std::errc::no_such_file_or_directory);
    const SharedFolder distrustful(path_, [](std::uint32_t) { return false; });
    const Result<int> opened = distrustful.open("file");
    ASSERT_FALSE(opened.ok());
    EXPECT_EQ(opened.failure().code, std::errc::operation_not_permitted);
}

TEST_F(SharedFolderTest, AsksOfTheFilesOwner) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can make files of others";
    }
    ASSERT_EQ(::chown(tree_.write("shared/file", "1").c_str(), kOther, kOther), 0);
    EXPECT_EQ(openError("file"), std::errc::operation_not_permitted);
    const SharedFolder trusting(path_, [](std::uint32_t uid) { return uid == kOther; });
    const Result<int> opened = trusting.open("file");
    ASSERT_TRUE(opened.ok());
    ::close(opened.value());
}

TEST_F(SharedFolderTest, OpensNothingButRegularFiles) {
    tree_.write("shared/file", "1");
    fs::create_symlink("file", path_ / "link");
    fs::create_directory(path_ / "folder");
    ASSERT_EQ(::mkfifo((path_ / "pipe").c_str(), 0600), 0);
    const int listener = ::socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    (path_ / "socket").native().copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    for (const char* name : {"link", "folder", "pipe", "socket", ".", ".."}) {
        EXPECT_EQ(openError(name), std::errc::operation_not_permitted) << name;
    }
    ::close(listener);
}

TEST_F(SharedFolderTest, OpensNothingOutside) {
    tree_.write("secret", "1");
    EXPECT_EQ(openError("../secret"), std::errc::operation_not_permitted);
    EXPECT_EQ(openError((tree_ / "secret").native()), std::errc::operation_not_permitted);
}

// One that a user serves may never answer.
TEST_F(SharedFolderTest, OpensNothingOfAnotherFileSystem) {
    const SharedFolder root("/", [](std::uint32_t) { return true; });
    ASSERT_TRUE(fs::is_regular_file("/proc/version"));
    const Result<int> opened = root.open("proc/version");
    ASSERT_FALSE(opened.ok());
    EXPECT_EQ(opened.failure().code, std::errc::operation_not_permitted);
}

TEST_F(SharedFolderTest, TellsTheNames) {
    tree_.write("shared/a", "");
    tree_.write("shared/b", "");
    EXPECT_THAT(names(), UnorderedElementsAre("a", "b"));
    EXPECT_TRUE(complete_);
}

TEST_F(SharedFolderTest, StopsWhenToldTo) {
    int calls = 0;
    EXPECT_FALSE(folder_.look([&](const char*) { return ++calls < 2; }));
    EXPECT_EQ(calls, 2);
}

TEST_F(SharedFolderTest, LooksAtSoManyNamesAndNoMore) {
    const std::size_t most = SharedFolder::kMaxEntries - 2; // Beside "." and "..".
    for (std::size_t i = 0; i < most; ++i) {
        ASSERT_EQ(::mknod((path_ / std::to_string(i)).c_str(), S_IFREG | 0600, 0), 0);
    }
    EXPECT_EQ(names().size(), most);
    EXPECT_TRUE(complete_);
    tree_.write("shared/one more", "");
    EXPECT_EQ(names().size(), most);
    EXPECT_FALSE(complete_);
}

TEST_F(SharedFolderTest, ThatIsGoneHasNothingToSee) {
    fs::remove(path_);
    EXPECT_TRUE(names().empty());
    EXPECT_TRUE(complete_);
    EXPECT_FALSE(folder_.isThere());
    EXPECT_EQ(openError("file"), std::errc::no_such_file_or_directory);
}

TEST_F(SharedFolderTest, IsReadAnewEachTime) {
    DescriptorBudget budget = 100;
    SampledFile file(path_ / "file", budget, [this] { return folder_.open("file"); });
    std::string text;
    EXPECT_FALSE(file.read(text).ok());
    tree_.write("shared/file", "1");
    EXPECT_TRUE(file.read(text).ok());
    EXPECT_EQ(text, "1");
    EXPECT_EQ(budget.load(), 100); // Nothing stays open,
    fs::create_symlink("elsewhere", path_ / "link");
    fs::rename(path_ / "link", path_ / "file"); // so this is seen.
    EXPECT_EQ(file.read(text).failure().code, std::errc::operation_not_permitted);
}

} // namespace
} // namespace halyard::linux_
