#include "linux/system/SmallFile.h"

#include <gtest/gtest.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

using Text = Result<std::string>;

Text failed(std::errc code) {
    return Failure{code};
}

TEST(SmallFileTest, ReadsAWholeFile) {
    const testing::TempTree tree;
    const std::string text(10000, 'x');

    EXPECT_EQ(readSmallFile(tree.write("f", text), 10000), Text(text));
    EXPECT_EQ(readSmallFile(tree.write("f", ""), 0), Text(std::string()));
}

TEST(SmallFileTest, RefusesAByteMoreThanTheBound) {
    const testing::TempTree tree;

    EXPECT_EQ(readSmallFile(tree.write("f", "1234"), 4), Text(std::string("1234")));
    EXPECT_EQ(readSmallFile(tree.write("f", "12345"), 4), failed(std::errc::file_too_large));
}

TEST(SmallFileTest, ReadsFilesThatDoNotTellTheirSize) {
    EXPECT_EQ(readSmallFile("/proc/sys/kernel/ostype", 100), Text(std::string("Linux\n")));
}

TEST(SmallFileTest, TellsWhyThereIsNoText) {
    const testing::TempTree tree;
    tree.write("file", "");
    ASSERT_EQ(::mkfifo((tree / "pipe").c_str(), 0600), 0);

    EXPECT_EQ(readSmallFile(tree / "none", 9), failed(std::errc::no_such_file_or_directory));
    EXPECT_EQ(readSmallFile(tree / "file/x", 9), failed(std::errc::not_a_directory));
    EXPECT_EQ(readSmallFile(tree.path(), 9), failed(std::errc::is_a_directory));
    EXPECT_EQ(readSmallFile(tree / "pipe", 9), failed(std::errc::invalid_argument));
}

TEST(SmallFileTest, WhatIsNoRegularFileIsNotEvenOpened) {
    const testing::TempTree tree;
    ASSERT_EQ(::mkfifo((tree / "pipe").c_str(), 0600), 0);
    const int watcher = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    ASSERT_GE(::inotify_add_watch(watcher, (tree / "pipe").c_str(), IN_OPEN), 0);

    EXPECT_EQ(readSmallFile(tree / "pipe", 9), failed(std::errc::invalid_argument));
    char events[4096];
    EXPECT_LT(::read(watcher, events, sizeof events), 0) << "opened";
    ::close(watcher);
}

} // namespace
} // namespace halyard::linux_
