#include "linux/drivers/SampledFile.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

class SampledFileTest : public ::testing::Test {
protected:
    // What reading it failed with; none when it did not.
    std::errc read(SampledFile& file) {
        const Result<void> result = file.read(text_);
        return result.ok() ? std::errc{} : result.failure().code;
    }

    testing::TempTree tree_;
    DescriptorBudget budget_{8};
    std::string text_;
};

TEST_F(SampledFileTest, ReadsWhatIsThereNow) {
    SampledFile file(tree_.write("counter", "1\n"), budget_);
    EXPECT_EQ(read(file), std::errc{});
    EXPECT_EQ(text_, "1\n");
    tree_.write("counter", "1000000\n");
    EXPECT_EQ(read(file), std::errc{});
    EXPECT_EQ(text_, "1000000\n");
}

TEST_F(SampledFileTest, FindsTheFileThatWasMovedOverIt) {
    SampledFile file(tree_.write("counter", "1"), budget_);
    ASSERT_EQ(read(file), std::errc{});
    std::filesystem::rename(tree_.write("new", "2"), tree_ / "counter");
    EXPECT_EQ(read(file), std::errc{});
    EXPECT_EQ(text_, "2");
}

TEST_F(SampledFileTest, FollowsAFileThatGoesAndComesBack) {
    SampledFile file(tree_ / "counter", budget_);
    EXPECT_TRUE(meansAbsent({read(file), {}}));
    tree_.write("counter", "1");
    EXPECT_EQ(read(file), std::errc{});
    std::filesystem::remove(tree_ / "counter");
    EXPECT_TRUE(meansAbsent({read(file), {}}));
    EXPECT_EQ(text_, "");
    EXPECT_EQ(budget_, 8);
    tree_.write("counter", "2");
    EXPECT_EQ(read(file), std::errc{});
    EXPECT_EQ(text_, "2");
}

TEST_F(SampledFileTest, RefusesWhatIsNoFileWithoutWaiting) {
    ASSERT_EQ(::mkfifo((tree_ / "pipe").c_str(), 0600), 0);
    SampledFile pipe(tree_ / "pipe", budget_);
    EXPECT_EQ(read(pipe), std::errc::invalid_argument);
    SampledFile directory(tree_.path(), budget_);
    EXPECT_EQ(read(directory), std::errc::is_a_directory);
    SampledFile device("/dev/zero", budget_);
    EXPECT_EQ(read(device), std::errc::invalid_argument);
}

TEST_F(SampledFileTest, ReadsNoMoreThanItsBound) {
    SampledFile most(tree_.write("most", std::string(kMaxSampledFile, 'x')), budget_);
    EXPECT_EQ(read(most), std::errc{});
    EXPECT_EQ(text_.size(), kMaxSampledFile);
    SampledFile more(tree_.write("more", std::string(kMaxSampledFile + 1, 'x')), budget_);
    EXPECT_EQ(read(more), std::errc::file_too_large);
    EXPECT_EQ(text_, "");
}

TEST_F(SampledFileTest, KeepsNoMoreFilesOpenThanTheBudgetHas) {
    budget_ = 1;
    SampledFile kept(tree_.write("a", "1"), budget_);
    SampledFile reopened(tree_.write("b", "2"), budget_);
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(read(kept), std::errc{});
        EXPECT_EQ(read(reopened), std::errc{});
        EXPECT_EQ(text_, "2");
        EXPECT_EQ(budget_, 0);
    }
}

TEST_F(SampledFileTest, GivesItsDescriptorBack) {
    {
        SampledFile file(tree_.write("a", "1"), budget_);
        ASSERT_EQ(read(file), std::errc{});
        SampledFile moved(std::move(file));
        EXPECT_EQ(budget_, 7);
    }
    EXPECT_EQ(budget_, 8);
}

TEST_F(SampledFileTest, ReadsTheKernelsFilesWhole) {
    SampledFile status("/proc/self/status", budget_);
    for (int i = 0; i < 2; ++i) {
        ASSERT_EQ(read(status), std::errc{});
        EXPECT_TRUE(text_.starts_with("Name:"));
        EXPECT_TRUE(text_.ends_with('\n'));
    }
}

TEST_F(SampledFileTest, TellsWhatIsAbsentFromWhatIsBroken) {
    for (const auto error : {std::errc::no_such_file_or_directory, std::errc::no_such_device,
                             std::errc::no_such_device_or_address, std::errc::not_a_directory}) {
        EXPECT_TRUE(meansAbsent({error, {}}));
    }
    for (const auto error : {std::errc{}, std::errc::io_error, std::errc::permission_denied,
                             std::errc::file_too_large}) {
        EXPECT_FALSE(meansAbsent({error, {}}));
    }
}

} // namespace
} // namespace halyard::linux_
