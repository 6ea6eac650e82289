// The statistics keys and strings, byte for byte.
#include <cstdint>
#include <limits>

#include "drivers/DriverFixture.h"

namespace halyard {
namespace {

class DriverStatisticsTest : public DriverTest {
protected:
    using Utility = HYReportingDriverUtility;

    static std::string key(const Channel& channel) {
        return Utility::getDriverStatsKey(channel, "Simple");
    }
    Value ofHistogram(const Channel& channel) {
        Dictionary stats;
        Utility::processHistogramData(channel, stats);
        return stats["Speaker_Histogram_Latency"];
    }
    static Value ofStates(const Channel& channel) {
        Dictionary stats;
        Utility::processStateData(channel, stats);
        return stats["Speaker_State_Power"];
    }
    static Dictionary ofSimple(std::int64_t value) {
        Dictionary stats;
        Utility::processSimpleData(simple("Underruns", value), stats);
        return stats;
    }
};

TEST_F(DriverStatisticsTest, AKeyJoinsTheCleanedNamesAndTheKind) {
    Channel channel;
    channel.driver = "Codec_One<instance 3>";
    channel.group = "Stats";
    channel.subGroup = "Rx_Path";
    channel.name = "Frame Drops";
    EXPECT_EQ(key(channel), "CodecOne_Stats_RxPath_Simple_FrameDrops");
}

TEST_F(DriverStatisticsTest, AKeyLeavesOutAbsentNames) {
    Channel channel;
    EXPECT_EQ(key(channel), "Simple_");
    channel.subGroup = "QLX";
    EXPECT_EQ(key(channel), "QLX_Simple_");
    channel.group = "Rx";
    EXPECT_EQ(key(channel), "Rx_QLX_Simple_");
    channel.name = "n";
    EXPECT_EQ(key(channel), "Rx_QLX_Simple_n");
}

TEST_F(DriverStatisticsTest, AKeyKeepsThePlaceOfEmptyNames) {
    Channel channel;
    channel.driver = "<all of it>";
    channel.group = "_ _";
    channel.name = "<kept>";
    EXPECT_EQ(key(channel), "__Simple_<kept>");
}

TEST_F(DriverStatisticsTest, AKeyMayBeOfAnyLength) {
    Channel channel;
    const std::string name(5000, 'x');
    channel.name = name;
    EXPECT_EQ(key(channel), "Simple_" + name);
}

TEST_F(DriverStatisticsTest, TheKindIsNotCleaned) {
    EXPECT_EQ(Utility::getDriverStatsKey(Channel(), "a_b c"), "a_b c_");
}

TEST_F(DriverStatisticsTest, ASimpleValueIsReportedFromOneOn) {
    EXPECT_TRUE(ofSimple(0).empty());
    EXPECT_TRUE(ofSimple(-1).empty());
    EXPECT_TRUE(ofSimple(std::numeric_limits<std::int64_t>::min()).empty());
    EXPECT_EQ(ofSimple(1), (Dictionary{{"Speaker_Simple_Underruns", 1}}));
    const std::int64_t most = std::numeric_limits<std::int64_t>::max();
    EXPECT_EQ(ofSimple(most), (Dictionary{{"Speaker_Simple_Underruns", most}}));
}

TEST_F(DriverStatisticsTest, AHistogramListsTheBucketsWithHits) {
    Channel channel = histogram({{0, 10, 5}, {10, 20, 0}, {20, 30, 0}, {30, 40, 2}});
    channel.min = 3;
    channel.max = 37;
    EXPECT_EQ(ofHistogram(channel),
              Value("count=4,lower=0,upper=40,min=3,max=37,unit=ms::0-10:5;30-40:2"));
}

TEST_F(DriverStatisticsTest, AHistogramWithHitsInTheSecondAndFifthBucketListsThoseTwo) {
    EXPECT_EQ(ofHistogram(histogram({{0, 1, 0}, {1, 2, 7}, {2, 3, 0}, {3, 4, 0}, {4, 5, 1}})),
              Value("count=5,lower=0,upper=5,min=0,max=0,unit=ms::1-2:7;4-5:1"));
}

TEST_F(DriverStatisticsTest, AHistogramWithoutHitsAddsNothing) {
    EXPECT_TRUE(ofHistogram(histogram({{0, 10, 0}, {10, 20, 0}})).isNone());
    EXPECT_TRUE(ofHistogram(histogram({})).isNone());
}

TEST_F(DriverStatisticsTest, AHistogramAboveZeroReportsALowerEndOfZero) {
    EXPECT_EQ(ofHistogram(histogram({{100, 200, 1}})),
              Value("count=1,lower=0,upper=200,min=0,max=0,unit=ms::100-200:1"));
}

TEST_F(DriverStatisticsTest, AHistogramBelowZeroReportsAnUpperEndOfZero) {
    EXPECT_EQ(ofHistogram(histogram({{-20, -10, 1}, {-10, -5, -2}})),
              Value("count=2,lower=-20,upper=0,min=0,max=0,unit=ms::-20--10:1;-10--5:-2"));
}

TEST_F(DriverStatisticsTest, AHistogramWithoutUnitSaysSo) {
    Channel channel = histogram({{0, 1, 1}});
    channel.unit.reset();
    EXPECT_EQ(ofHistogram(channel),
              Value("count=1,lower=0,upper=1,min=0,max=0,unit=(null)::0-1:1"));
}

TEST_F(DriverStatisticsTest, ABucketWithoutBoundsHasThoseOfTheOneBefore) {
    EXPECT_EQ(ofHistogram(histogram({{5, 6, 1, -3}, {10, 20, 0}, {7, 8, 4, 9}})),
              Value("count=3,lower=0,upper=20,min=0,max=0,unit=ms::0-0:1;10-20:4"));
    EXPECT_EQ(platform_.log.lines(),
              (Lines{line(LogLevel::Info, "Error in getting the bucket bounds : -3"),
                     line(LogLevel::Info, "Error in getting the bucket bounds : 9")}));
}

TEST_F(DriverStatisticsTest, StatesListTheResidentOnes) {
    EXPECT_EQ(
        ofStates(states({{"on", 12, 345, 0.25}, {"off", 3, 0, 0}, {std::nullopt, 0, 7, 2.0 / 3}})),
        Value("name:on,transition:12,residency:345,duty_cycle:0.250000;"
              "name:(null),transition:0,residency:7,duty_cycle:0.666667;"));
}

TEST_F(DriverStatisticsTest, StateNumbersAreUnsigned) {
    EXPECT_EQ(ofStates(states({{"s", ~0ULL, ~0ULL, 1e6}})),
              Value("name:s,transition:18446744073709551615,residency:18446744073709551615,"
                    "duty_cycle:1000000.000000;"));
}

TEST_F(DriverStatisticsTest, AStateChannelWithoutResidentStateStillAddsItsKey) {
    EXPECT_EQ(ofStates(states({{"on", 4, 0, 0.0}})), Value(""));
    EXPECT_EQ(ofStates(states({})), Value(""));
    EXPECT_EQ(platform_.log.lines().back(),
              line(LogLevel::Debug, "the current reported data is : "));
}

TEST_F(DriverStatisticsTest, TheTextOfStatesIsLogged) {
    ofStates(states({{"on", 1, 2, 0.5}}));
    EXPECT_EQ(platform_.log.lines().back(),
              line(LogLevel::Debug, "the current reported data is : "
                                    "name:on,transition:1,residency:2,duty_cycle:0.500000;"));
}

} // namespace
} // namespace halyard
