#include "common/Result.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <memory>

namespace halyard {
namespace {

struct PlacedFailure : Failure {
    int line = 0;
};

Result<std::string> nameOf(int number) {
    if (number < 0) {
        return Failure{std::errc::invalid_argument, "the number"};
    }
    return "name";
}

TEST(FailureTest, SaysItsTextOrItsCodeOrBoth) {
    EXPECT_EQ((Failure{{}, "no such name"}.message()), "no such name");
    EXPECT_EQ((Failure{std::errc::file_exists, {}}.message()), "File exists");
    EXPECT_EQ((Failure{std::errc::file_exists, "cannot make /a"}.message()),
              "cannot make /a: File exists");
}

TEST(FailureTest, TakesTheCodeOfTheCallThatFailed) {
    errno = EROFS;
    EXPECT_EQ(Failure::ofErrno("/a"), (Failure{std::errc::read_only_file_system, "/a"}));
    EXPECT_EQ(Failure::ofErrno(), (Failure{std::errc::read_only_file_system, ""}));
}

TEST(ResultTest, HoldsAValueOrAFailure) {
    const Result<std::string> named = nameOf(1);
    ASSERT_TRUE(named.ok());
    EXPECT_EQ(named.value(), "name");
    const Result<std::string> refused = nameOf(-1);
    ASSERT_FALSE(refused.ok());
    EXPECT_EQ(refused.failure(), (Failure{std::errc::invalid_argument, "the number"}));
}

TEST(ResultTest, AFailureWithoutCodeAndTextIsNoSuccess) {
    EXPECT_FALSE(Result<std::string>(Failure()).ok());
    EXPECT_FALSE(Result<void>(Failure()).ok());
}

TEST(ResultTest, AnEmptyTextIsAValue) {
    EXPECT_TRUE(Result<std::string>("").ok());
    EXPECT_NE(Result<std::string>(""), Result<std::string>(Failure()));
}

TEST(ResultTest, GivesUpAValueThatOnlyMoves) {
    Result<std::unique_ptr<const int>> made = std::make_unique<int>(7);
    const std::unique_ptr<const int> taken = std::move(made).value();
    EXPECT_EQ(*taken, 7);
    EXPECT_EQ(made.value(), nullptr);
}

TEST(ResultTest, WithoutAValueItIsDoneUnlessItSaysWhyNot) {
    const Result<void> done;
    EXPECT_TRUE(done.ok());
    const Result<void> refused = Failure{{}, "why"};
    ASSERT_FALSE(refused.ok());
    EXPECT_EQ(refused.failure().text, "why");
}

TEST(ResultTest, KeepsWhatAFailureKnowsBesides) {
    const Result<int, PlacedFailure> refused = PlacedFailure{{{}, "odd"}, 3};
    ASSERT_FALSE(refused.ok());
    EXPECT_EQ(refused.failure().line, 3);
    EXPECT_EQ(refused.failure().message(), "odd");
}

} // namespace
} // namespace halyard
