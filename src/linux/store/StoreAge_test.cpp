#include "linux/store/StoreAge.h"

#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using std::chrono::days;

class StoreAgeTest : public StoreFixture {
protected:
    StoreAgeTest() {
        EXPECT_TRUE(database_.open().ok());
        limits_.maxAge = days(7);
    }
    void setForward(std::chrono::seconds by) { clock_.setWallTime(clock_.wallTime() + by); }
    // How long before now, as the clock says it, rows are too old.
    double reach(StoreAge& age) {
        EXPECT_TRUE(database_.begin().ok());
        EXPECT_TRUE(age.update(database_).ok());
        const double oldest = age.oldest(limits_.maxAge);
        EXPECT_TRUE(database_.commit().ok());
        age.noteCommitted();
        return platform::secondsSince1970(clock_.wallTime()) - oldest;
    }
    static double daysOf(double count) { return count * 86400; }

    StoreLimits limits_;
    StoreDatabase database_{{.path = options_.path, .busyTimeout = 0ms}};
    StoreAge age_{clock_};
};

TEST_F(StoreAgeTest, TimeThatPassesIsNoJump) {
    clock_.advance(days(30));
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(7));
}

TEST_F(StoreAgeTest, AnHourIsNoJumpAndMoreIsOne) {
    setForward(3600s);
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(7));
    setForward(3601s);
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(7) + 3601);
}

TEST_F(StoreAgeTest, AJumpIsSubtractedUntilItIsOlderThanRowsMayBe) {
    setForward(days(10));
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(17));
    clock_.advance(days(7) - 1s);
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(17));
    clock_.advance(1s);
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(7));
}

TEST_F(StoreAgeTest, JumpsAddUp) {
    setForward(days(10));
    (void)reach(age_);
    clock_.advance(days(1));
    setForward(days(5));
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(22));
    clock_.advance(days(6)); // The first is as old as that.
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(12));
}

TEST_F(StoreAgeTest, SettingTheClockBackTakesTheJumpAway) {
    setForward(days(10));
    (void)reach(age_);
    setForward(-days(4));
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(13));
    setForward(-days(6));
    EXPECT_DOUBLE_EQ(reach(age_), daysOf(7));
}

TEST_F(StoreAgeTest, TheNextRunKnowsOfAJump) {
    setForward(days(10));
    (void)reach(age_);
    clock_.advance(days(1));
    StoreAge next(clock_);
    EXPECT_DOUBLE_EQ(reach(next), daysOf(17));
}

TEST_F(StoreAgeTest, AJumpThatWasUndoneBetweenRunsIsForgotten) {
    setForward(days(10));
    (void)reach(age_);
    setForward(-days(10));
    StoreAge next(clock_);
    EXPECT_DOUBLE_EQ(reach(next), daysOf(7));
}

TEST_F(StoreAgeTest, ANewFileIsToldOfJumpsAsWell) {
    setForward(days(10));
    (void)reach(age_);
    database_.close();
    std::filesystem::remove(options_.path);
    EXPECT_TRUE(database_.open().ok());
    (void)reach(age_);
    EXPECT_EQ(reader().number("SELECT seconds FROM clock_jump"), 864000);
}

TEST_F(StoreAgeTest, AClockThatJumpsAllTheTimeIsRememberedWithinBounds) {
    for (int i = 0; i < 100; ++i) {
        setForward(7200s);
        (void)reach(age_);
    }
    EXPECT_EQ(reader().number("SELECT count(*) FROM clock_jump"), 16);
}

TEST_F(StoreAgeTest, WithoutAJumpNothingIsWritten) {
    (void)reach(age_);
    EXPECT_EQ(reader().number("SELECT count(*) FROM sqlite_schema WHERE name = 'clock_jump'"), 0);
}

} // namespace
} // namespace halyard::linux_
