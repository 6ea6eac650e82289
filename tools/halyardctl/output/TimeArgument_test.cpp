#include "output/TimeArgument.h"

#include <cstdlib>
#include <ctime>
#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

constexpr double kNow = 1700000000.5; // 2023-11-14T22:13:20.5Z

class TimeArgumentTest : public ::testing::Test {
protected:
    TimeArgumentTest() { setZone("UTC0"); }
    ~TimeArgumentTest() override { setZone("UTC0"); }

    static void setZone(const char* zone) {
        ::setenv("TZ", zone, 1);
        ::tzset();
    }
};

TEST_F(TimeArgumentTest, MomentsAreReadAsInternetTimeStamps) {
    EXPECT_EQ(timeArgument("2023-11-14T22:13:20Z", kNow), 1700000000);
    EXPECT_EQ(timeArgument("2023-11-14t22:13:20.25z", kNow), 1700000000.25);
    EXPECT_EQ(timeArgument("2023-11-15 00:13:20+02:00", kNow), 1700000000);
    EXPECT_EQ(timeArgument("2023-11-14T16:43:20-05:30", kNow), 1700000000);
    EXPECT_EQ(timeArgument("1969-12-31T23:59:59Z", kNow), -1);
}

TEST_F(TimeArgumentTest, DurationsGoBackFromNow) {
    EXPECT_EQ(timeArgument("90m", kNow), kNow - 5400);
    EXPECT_EQ(timeArgument("5s", kNow), kNow - 5);
    EXPECT_EQ(timeArgument("2h", kNow), kNow - 7200);
    EXPECT_EQ(timeArgument("7d", kNow), kNow - 604800);
}

TEST_F(TimeArgumentTest, DaysBeginAtMidnightWhereTheDeviceIs) {
    EXPECT_EQ(timeArgument("today", kNow), 1699920000);
    EXPECT_EQ(timeArgument("yesterday", kNow), 1699920000 - 86400);
    setZone("EST5EDT");
    EXPECT_EQ(timeArgument("today", kNow), 1699920000 + 5 * 3600);
    // The clocks were put back on the 5th.
    const double sixth = 1699290000;
    EXPECT_EQ(timeArgument("today", sixth), 1699246800);
    EXPECT_EQ(timeArgument("yesterday", sixth), 1699246800 - 25 * 3600);
}

TEST_F(TimeArgumentTest, EverythingElseIsNoTime) {
    for (const char* const text : {"",
                                   "x",
                                   "now",
                                   "90",
                                   "m",
                                   "-5m",
                                   "+5m",
                                   "5 m",
                                   "1.5h",
                                   "5w",
                                   "99999999999999999999s",
                                   "2023-11-14",
                                   "2023-11-14T22:13:20",
                                   "2023-13-14T22:13:20Z",
                                   "2023-02-29T00:00:00Z",
                                   "2023-11-14T24:00:00Z",
                                   "2023-11-14T22:13:20.Z",
                                   "2023-11-14T22:13:20Zx",
                                   "2023-11-14T22:13:20+2:00",
                                   "2023-11--4T22:13:20Z",
                                   "Today"}) {
        EXPECT_FALSE(timeArgument(text, kNow)) << text;
    }
    EXPECT_TRUE(timeArgument("2024-02-29T00:00:00Z", kNow));
}

} // namespace
} // namespace halyard::ctl
