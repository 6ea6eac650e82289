#include "CycleFiles.h"

#include <algorithm>
#include <cstring>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iterator>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::pipewire {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::UnorderedElementsAre;

class CycleFilesTest : public ::testing::Test {
protected:
    CycleFilesTest() { fs::create_directory(folder_); }

    void add(std::string_view device, bool missed = false) {
        statistics_.add(
            device, true,
            {.waitSeconds = 1e-5, .busySeconds = 1e-3, .cycleSeconds = 0.02, .missed = missed});
    }
    // As told a second after the last time.
    void write() {
        now_ += 1s;
        files_.write(statistics_, now_);
    }
    std::string read(const std::string& name) const {
        std::ifstream file(folder_ / name);
        return {std::istreambuf_iterator<char>(file), {}};
    }
    std::vector<std::string> list() const {
        std::vector<std::string> names;
        for (const auto& entry : fs::directory_iterator(folder_)) {
            names.push_back(entry.path().filename().native());
        }
        return names;
    }
    halyard::testing::TempTree tree_;
    fs::path folder_ = tree_ / "cycles";
    CycleStatistics statistics_;
    std::vector<std::string> notes_;
    CycleFiles files_{{tree_ / "absent", folder_},
                      [this](const std::string& text) { notes_.push_back(text); }};
    CycleFiles::SteadyTime now_{1000s};
};

TEST_F(CycleFilesTest, WritesFourFilesForEachDevice) {
    add("a");
    add("a", true);
    write();
    EXPECT_THAT(list(),
                UnorderedElementsAre("out-a.counts", "out-a.wait", "out-a.busy", "out-a.cycle"));
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 2\nmissed 1\n");
    const DeviceCycles& device = statistics_.devices()[0];
    EXPECT_EQ(read("out-a.wait"), device.wait.text());
    EXPECT_EQ(read("out-a.busy"), device.busy.text());
    EXPECT_EQ(read("out-a.cycle"), device.cycle.text());
}

TEST_F(CycleFilesTest, OthersMayReadThemWhateverTheUmask) {
    const mode_t before = ::umask(077);
    add("a");
    write();
    ::umask(before);
    EXPECT_EQ(fs::status(folder_ / "out-a.counts").permissions(), fs::perms(0644));
}

TEST_F(CycleFilesTest, ReplacesAFileWithoutChangingTheOldOne) {
    add("a");
    write();
    std::ifstream old(folder_ / "out-a.counts");
    add("a");
    write();
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(old), {}),
              "direction sink\ncycles 1\nmissed 0\n");
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 2\nmissed 0\n");
}

TEST_F(CycleFilesTest, WritesOnceASecondAtMost) {
    add("a");
    write();
    add("a");
    files_.write(statistics_, now_ + 999ms);
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 1\nmissed 0\n");
    files_.write(statistics_, now_ + 1s);
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 2\nmissed 0\n");
}

TEST_F(CycleFilesTest, LeavesTheFilesOfQuietDevicesAlone) {
    add("a");
    add("b");
    write();
    struct stat before {};
    struct stat after {};
    ASSERT_EQ(::stat((folder_ / "out-b.counts").c_str(), &before), 0);
    add("a");
    write();
    ASSERT_EQ(::stat((folder_ / "out-b.counts").c_str(), &after), 0);
    EXPECT_EQ(before.st_ino, after.st_ino);
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 2\nmissed 0\n");
}

TEST_F(CycleFilesTest, WithoutAFolderSaysNothingAndWaits) {
    fs::remove(folder_);
    add("a");
    write();
    EXPECT_TRUE(notes_.empty());
    EXPECT_FALSE(fs::exists(folder_));
}

// A reader saw no file meanwhile, and takes for new all that it finds.
TEST_F(CycleFilesTest, ForgetsWhatWasCountedBeforeThereWasAFile) {
    fs::remove(folder_);
    add("a");
    write();
    fs::create_directory(folder_);
    add("a");
    add("new", true);
    write();
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 0\nmissed 0\n");
    EXPECT_EQ(read("out-new.counts"), "direction sink\ncycles 1\nmissed 1\n");
    add("a");
    write();
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 1\nmissed 0\n");
}

TEST_F(CycleFilesTest, BeginsAnewInAFolderThatWasEmptied) {
    add("a");
    add("b");
    write();
    fs::remove(folder_ / "out-a.counts");
    write();
    EXPECT_EQ(read("out-a.counts"), "direction sink\ncycles 0\nmissed 0\n");
    EXPECT_EQ(read("out-b.counts"), "direction sink\ncycles 1\nmissed 0\n");
}

TEST_F(CycleFilesTest, TellsOfAFailureOnceAnEpisode) {
    fs::create_directory(folder_ / "out-a.wait"); // No file replaces that, not even root's.
    add("a");
    add("b");
    write();
    write();
    ASSERT_EQ(notes_.size(), 1U);
    EXPECT_THAT(notes_[0], HasSubstr("cannot be written to " + folder_.native() + ": "));
    EXPECT_EQ(read("out-b.counts"), "direction sink\ncycles 1\nmissed 0\n"); // All the same.
    fs::remove(folder_ / "out-a.wait");
    write();
    write();
    ASSERT_EQ(notes_.size(), 2U);
    EXPECT_THAT(notes_[1], HasSubstr("can be written to " + folder_.native() + " again"));
    EXPECT_THAT(list(), ::testing::Contains("out-a.wait"));
    EXPECT_THAT(list(), ::testing::Not(::testing::Contains(HasSubstr("tmp"))));
}

TEST_F(CycleFilesTest, RemovesWhatAnEarlierRunLeft) {
    tree_.write("cycles/out-gone.counts", "cycles 5\n");
    tree_.write("cycles/in-gone.cycle", "0 1 2\n");
    tree_.write("cycles/.out-gone.wait.tmp-77", "0");
    tree_.write("cycles/notes", "of the user");
    tree_.write("cycles/out-notes.txt", "of the user");
    write();
    EXPECT_THAT(list(), UnorderedElementsAre("notes", "out-notes.txt"));
}

TEST_F(CycleFilesTest, LeavesTheFilesOfOthersAlone) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can make files of others";
    }
    const fs::path other = tree_.write("cycles/out-gone.counts", "cycles 5\n");
    ASSERT_EQ(::chown(other.c_str(), 12345, 12345), 0);
    write();
    EXPECT_TRUE(fs::exists(other));
}

TEST_F(CycleFilesTest, LooksForLeftoversOnceOnly) {
    write();
    tree_.write("cycles/out-of-another-run.counts", "cycles 5\n");
    write();
    EXPECT_THAT(list(), ElementsAre("out-of-another-run.counts"));
}

TEST_F(CycleFilesTest, ALeftoverOfTheSameProcessIdIsInNobodysWay) {
    write();
    tree_.write("cycles/.out-a.wait.tmp-" + std::to_string(::getpid()), "half");
    add("a");
    write();
    EXPECT_EQ(read("out-a.wait"), statistics_.devices()[0].wait.text());
    EXPECT_EQ(list().size(), 4U);
}

// Whoever may write to the folder may leave a link there.
TEST_F(CycleFilesTest, WritesThroughNoLink) {
    const fs::path target = tree_.write("target", "untouched");
    write();
    fs::create_symlink(target, folder_ / (".out-a.wait.tmp-" + std::to_string(::getpid())));
    fs::create_symlink(target, folder_ / "out-a.busy");
    add("a");
    write();
    EXPECT_EQ(fs::file_size(target), std::strlen("untouched"));
    EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(folder_ / "out-a.busy")));
}

TEST_F(CycleFilesTest, AtTheEndItsFilesGo) {
    tree_.write("cycles/notes", "of the user");
    add("a");
    add("b");
    write();
    files_.remove();
    EXPECT_THAT(list(), ElementsAre("notes"));
}

TEST(CycleFileNameTest, IsPlainForAPlainName) {
    EXPECT_EQ(cycleFileName("alsa_output.pci-0000_00_1f.3.analog-stereo", true),
              "out-alsa_output.pci-0000_00_1f.3.analog-stereo");
    EXPECT_EQ(cycleFileName("a", false), "in-a");
}

TEST(CycleFileNameTest, HidesWhatMeansSomethingInAPath) {
    EXPECT_EQ(cycleFileName("../a b", true), "out-..%2Fa%20b");
    EXPECT_EQ(cycleFileName(std::string_view("\0%\xFF~", 4), true), "out-%00%25%FF%7E");
}

TEST(CycleFileNameTest, IsBoundedAndAnotherForEachDevice) {
    constexpr const char* kForm = "out-([A-Za-z0-9._-]|%[0-9A-F]{2})*(~[0-9A-F]{16})?";
    std::set<std::string> names;
    std::size_t count = 0;
    for (std::size_t length = 180; length < 240; ++length) {
        for (const char* end : {"x", "y", "/"}) {
            const std::string device(length, length % 2 == 0 ? 'a' : '/');
            const std::string name = cycleFileName(device + end, true);
            EXPECT_LE(name.size(), 200U);
            EXPECT_THAT(name, ::testing::MatchesRegex(kForm));
            names.insert(name);
            ++count;
        }
    }
    EXPECT_EQ(names.size(), count);
}

TEST(CycleFoldersTest, AreWhereTheSocketIs) {
    const auto environment = [](const char* name) -> const char* {
        return std::strcmp(name, "RUNTIME_DIRECTORY") == 0 ? "/run/a:/run/b" : "/run/user/7";
    };
    EXPECT_THAT(cycleFolders(environment, false, ""),
                ElementsAre("/run/a/cycles", "/run/user/7/halyard/cycles", "/run/halyard/cycles"));
    EXPECT_THAT(cycleFolders(environment, true, ""),
                ElementsAre("/run/a/cycles", "/run/halyard/cycles"));
    EXPECT_THAT(cycleFolders(environment, false, "/tmp/x/reporting.sock"),
                ElementsAre("/tmp/x/cycles"));
    EXPECT_THAT(
        cycleFolders([](const char*) -> const char* { return nullptr; }, false, "here.sock"),
        ElementsAre("cycles"));
}

} // namespace
} // namespace halyard::pipewire
