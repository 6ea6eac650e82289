#include "reading/DriverStatistics.h"

#include <gtest/gtest.h>

namespace halyard::reading {
namespace {

TEST(DriverStatistics, ANameIsDriverGroupsAndChannel) {
    const auto name = statisticName("out.speaker_Speaker_Rx_Histogram_Cycletime", "Histogram");

    ASSERT_TRUE(name);
    EXPECT_EQ(name->driver, "out.speaker");
    EXPECT_EQ(name->group, "Speaker_Rx");
    EXPECT_EQ(name->channel, "Cycletime");
}

TEST(DriverStatistics, AKeyOfAnotherKindIsNoName) {
    EXPECT_FALSE(statisticName("out.speaker_Speaker_Simple_Cycles", "Histogram"));
    EXPECT_FALSE(statisticName("audiotag", "Simple"));
}

TEST(DriverStatistics, AHistogramHasItsBucketsUnitAndEnds) {
    const auto histogram =
        histogramIn("count=4,lower=-5,upper=40,min=-3,max=37,unit=ms::-5-10:5;30-40:2");

    ASSERT_TRUE(histogram);
    EXPECT_EQ(histogram->unit, "ms");
    EXPECT_EQ(histogram->min, -3);
    EXPECT_EQ(histogram->max, 37);
    ASSERT_EQ(histogram->buckets.size(), 2U);
    EXPECT_EQ(histogram->buckets[0].lower, -5);
    EXPECT_EQ(histogram->buckets[0].upper, 10);
    EXPECT_EQ(histogram->buckets[1].hits, 2);
}

TEST(DriverStatistics, WhatIsNoHistogramIsNone) {
    for (const char* text :
         {"", "count=1", "count=1,lower=0,upper=1,min=0,max=1,unit=ms",
          "count=1,lower=0,upper=1,min=0,max=1,unit=ms::",
          "count=1,lower=0,upper=1,min=0,max=1,unit=ms::0-x:1",
          "count=9999999999999999999999,lower=0,upper=1,min=0,max=1,unit=::0-1:1"}) {
        EXPECT_FALSE(histogramIn(text)) << text;
    }
}

TEST(DriverStatistics, BucketsOfAHistogramAreBounded) {
    std::string text = "count=9999,lower=0,upper=1,min=0,max=1,unit=us::0-1:1";
    for (int i = 0; i < 5000; ++i) {
        text += ";0-1:1";
    }

    EXPECT_EQ(histogramIn(text)->buckets.size(), 1024U);
}

TEST(DriverStatistics, StatesHaveNamesTransitionsAndShares) {
    const auto states = statesIn("name:C1 halt,transition:3,residency:2824,duty_cycle:0.250000;"
                                 "name:C6,transition:0,residency:1,duty_cycle:0.000001;");

    ASSERT_EQ(states.size(), 2U);
    EXPECT_EQ(states[0].name, "C1 halt");
    EXPECT_EQ(states[0].transitions, 3U);
    EXPECT_EQ(states[0].residency, 2824U);
    EXPECT_DOUBLE_EQ(states[0].dutyCycle, 0.25);
    EXPECT_EQ(states[1].name, "C6");
}

TEST(DriverStatistics, StatesEndWhereTheTextIsBroken) {
    EXPECT_EQ(statesIn("name:a,transition:1,residency:2,duty_cycle:0.5;name:b,trans").size(), 1U);
    EXPECT_TRUE(statesIn("nothing").empty());
}

} // namespace
} // namespace halyard::reading
