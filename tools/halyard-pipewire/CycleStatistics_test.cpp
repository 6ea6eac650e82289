#include "CycleStatistics.h"

#include <cmath>
#include <gtest/gtest.h>
#include <limits>
#include <sstream>

namespace halyard::pipewire {
namespace {

struct Bucket {
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    std::uint64_t hits = 0;

    bool operator==(const Bucket&) const = default;
};

std::vector<Bucket> bucketsOf(const CycleHistogram& histogram) {
    std::istringstream text(histogram.text());
    std::vector<Bucket> buckets;
    for (Bucket bucket; text >> bucket.lower >> bucket.upper >> bucket.hits;) {
        buckets.push_back(bucket);
    }
    return buckets;
}

std::vector<Bucket> hit(const CycleHistogram& histogram) {
    std::vector<Bucket> buckets = bucketsOf(histogram);
    std::erase_if(buckets, [](const Bucket& bucket) { return bucket.hits == 0; });
    return buckets;
}

TEST(CycleHistogramTest, HasBucketsSideBySideWhateverItCounted) {
    CycleHistogram histogram;
    const std::vector<Bucket> empty = bucketsOf(histogram);
    ASSERT_EQ(empty.size(), CycleHistogram::kBuckets);
    EXPECT_EQ(empty.front().lower, 0);
    for (std::size_t place = 1; place < empty.size(); ++place) {
        EXPECT_EQ(empty[place].lower, empty[place - 1].upper);
        EXPECT_LT(empty[place].lower, empty[place].upper);
    }
    histogram.add(0.5);
    EXPECT_EQ(bucketsOf(histogram).size(), empty.size());
}

TEST(CycleHistogramTest, EachBoundBeginsABucket) {
    for (std::size_t place = 0; place < CycleHistogram::kBuckets; ++place) {
        const std::int64_t lower = CycleHistogram::kBounds[place];
        const std::int64_t upper = CycleHistogram::kBounds[place + 1];
        CycleHistogram histogram;
        histogram.add(static_cast<double>(lower) / 1e6);
        histogram.add((static_cast<double>(upper) - 0.01) / 1e6);
        EXPECT_EQ(hit(histogram), (std::vector<Bucket>{{lower, upper, 2}})) << lower;
    }
}

TEST(CycleHistogramTest, ALongerTimeIsInTheLastBucket) {
    CycleHistogram histogram;
    histogram.add(1000.0);
    histogram.add(1e300);
    EXPECT_EQ(hit(histogram), (std::vector<Bucket>{{10'000'000, 1'000'000'000, 2}}));
}

TEST(CycleHistogramTest, WhatWasNotMeasuredIsLeftOut) {
    CycleHistogram histogram;
    histogram.add(std::nan(""));
    histogram.add(std::numeric_limits<double>::infinity());
    histogram.add(-1e-9);
    EXPECT_EQ(hit(histogram), std::vector<Bucket>());
    histogram.add(-0.0);
    EXPECT_EQ(hit(histogram), (std::vector<Bucket>{{0, 1, 1}}));
}

class CycleStatisticsTest : public testing::Test {
protected:
    static constexpr CycleStatistics::Cycle kGood{0.00002, 0.001, 0.0213, false};
    static constexpr CycleStatistics::Cycle kMissed{0.002, 0.03, 0.0213, true};

    CycleStatistics statistics_;
};

TEST_F(CycleStatisticsTest, CountsWhatEachCycleTook) {
    statistics_.add("speaker", true, kGood);
    statistics_.add("speaker", true, kGood);
    statistics_.add("speaker", true, kMissed);
    ASSERT_EQ(statistics_.devices().size(), 1U);
    const DeviceCycles& device = statistics_.devices()[0];
    EXPECT_EQ(device.device, "speaker");
    EXPECT_EQ(device.countsText(), "direction sink\ncycles 3\nmissed 1\n");
    EXPECT_EQ(hit(device.wait), (std::vector<Bucket>{{20, 30, 2}, {2000, 3000, 1}}));
    EXPECT_EQ(hit(device.busy), (std::vector<Bucket>{{1000, 1500, 2}, {30'000, 50'000, 1}}));
    EXPECT_EQ(hit(device.cycle), (std::vector<Bucket>{{20'000, 30'000, 3}}));
}

TEST_F(CycleStatisticsTest, TellsASinkFromASourceOfTheSameName) {
    statistics_.add("duplex", true, kGood);
    statistics_.add("duplex", false, kMissed);
    ASSERT_EQ(statistics_.devices().size(), 2U);
    EXPECT_EQ(statistics_.devices()[0].countsText(), "direction sink\ncycles 1\nmissed 0\n");
    EXPECT_EQ(statistics_.devices()[1].countsText(), "direction source\ncycles 1\nmissed 1\n");
}

TEST_F(CycleStatisticsTest, GoesOnCountingADeviceThatComesBack) {
    statistics_.add("a", true, kGood);
    statistics_.add("b", true, kGood);
    statistics_.add("a", true, kGood);
    ASSERT_EQ(statistics_.devices().size(), 2U);
    EXPECT_EQ(statistics_.devices()[0].cycles, 2U);
}

TEST_F(CycleStatisticsTest, IgnoresDevicesBeyondTheMost) {
    for (std::size_t i = 0; i < CycleStatistics::kMaxDevices + 2; ++i) {
        statistics_.add("device " + std::to_string(i), false, kGood);
    }
    EXPECT_EQ(statistics_.devices().size(), CycleStatistics::kMaxDevices);
    EXPECT_EQ(statistics_.ignoredCycles(), 2U);
    statistics_.add("device 0", false, kGood);
    EXPECT_EQ(statistics_.devices()[0].cycles, 2U);
    EXPECT_EQ(statistics_.ignoredCycles(), 2U);
}

TEST_F(CycleStatisticsTest, IgnoresADeviceWithoutAName) {
    statistics_.add("", true, kGood);
    EXPECT_TRUE(statistics_.devices().empty());
    EXPECT_EQ(statistics_.ignoredCycles(), 1U);
}

TEST_F(CycleStatisticsTest, ADeviceBeginsAnewWhenTold) {
    statistics_.add("a", false, kMissed);
    statistics_.add("b", false, kMissed);
    statistics_.restart(0);
    EXPECT_EQ(statistics_.devices()[0].device, "a");
    EXPECT_EQ(statistics_.devices()[0].countsText(), "direction source\ncycles 0\nmissed 0\n");
    EXPECT_EQ(hit(statistics_.devices()[0].busy), std::vector<Bucket>());
    EXPECT_EQ(statistics_.devices()[1].cycles, 1U);
}

} // namespace
} // namespace halyard::pipewire
