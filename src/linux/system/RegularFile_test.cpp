#include "linux/system/RegularFile.h"

#include <cstdlib>
#include <fcntl.h>
#include <fstream>
#include <gtest/gtest.h>
#include <string>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

class Descriptor {
public:
    explicit Descriptor(int descriptor) : descriptor_(descriptor) {}
    ~Descriptor() { ::close(descriptor_); }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    operator int() const { return descriptor_; }

private:
    const int descriptor_;
};

struct Outcome {
    std::errc error;
    bool opened; // The kernel told others of an opening.
    bool operator==(const Outcome&) const = default;
};

// None when it is open.
std::errc errorOf(const RegularFile& file) {
    return file.opened().ok() ? std::errc{} : file.opened().failure().code;
}

Outcome open(const fs::path& path) {
    const Descriptor watcher(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    EXPECT_GE(::inotify_add_watch(watcher, path.c_str(), IN_OPEN), 0);
    const RegularFile file(path);
    char events[4096];
    return {errorOf(file), ::read(watcher, events, sizeof events) > 0};
}

class RegularFileTest : public ::testing::Test {
protected:
    testing::TempTree tree_;
};

TEST_F(RegularFileTest, OpensARegularFile) {
    EXPECT_EQ(open(tree_.write("file", "")), (Outcome{std::errc{}, true}));
    fs::create_symlink("file", tree_ / "link");
    EXPECT_EQ(open(tree_ / "link"), (Outcome{std::errc{}, true}));
}

TEST_F(RegularFileTest, OpensNoPipe) {
    ASSERT_EQ(::mkfifo((tree_ / "pipe").c_str(), 0600), 0);
    EXPECT_EQ(open(tree_ / "pipe"), (Outcome{std::errc::invalid_argument, false}));
}

TEST_F(RegularFileTest, OpensNoDevice) {
    const Descriptor terminal(::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC));
    char device[64];
    if (terminal < 0 || ::unlockpt(terminal) != 0 ||
        ::ptsname_r(terminal, device, sizeof device) != 0) {
        GTEST_SKIP() << "no pseudo-terminals here";
    }
    EXPECT_EQ(open(device), (Outcome{std::errc::invalid_argument, false}));
    fs::create_symlink(device, tree_ / "link");
    EXPECT_EQ(open(tree_ / "link"), (Outcome{std::errc::invalid_argument, false}));
}

TEST_F(RegularFileTest, OpensNoDirectory) {
    EXPECT_EQ(open(tree_.path()), (Outcome{std::errc::is_a_directory, false}));
}

TEST_F(RegularFileTest, TellsWhyThereIsNoFile) {
    tree_.write("file", "");
    fs::create_symlink("loop", tree_ / "loop");
    EXPECT_EQ(errorOf(RegularFile(tree_ / "none")), std::errc::no_such_file_or_directory);
    EXPECT_EQ(errorOf(RegularFile(tree_ / "file/x")), std::errc::not_a_directory);
    EXPECT_EQ(errorOf(RegularFile(tree_ / "loop")), std::errc::too_many_symbolic_link_levels);
}

TEST_F(RegularFileTest, ItsPathLeadsToItWhateverHasItsName) {
    const RegularFile file(tree_.write("file", "first"));
    fs::rename(tree_ / "file", tree_ / "elsewhere");
    tree_.write("file", "second");

    std::string text;
    std::ifstream(file.path()) >> text;
    EXPECT_EQ(text, "first");
}

} // namespace
} // namespace halyard::linux_
