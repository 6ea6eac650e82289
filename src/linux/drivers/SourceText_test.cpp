#include "linux/drivers/SourceText.h"

#include <gmock/gmock.h>
#include <limits>

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::Optional;

TEST(SourceTextTest, AnIntegerMayHaveBlanksAroundItAndNothingElse) {
    EXPECT_EQ(parseInteger("42\n"), 42);
    EXPECT_EQ(parseInteger("  -7 \n\n"), -7);
    EXPECT_EQ(parseInteger("9223372036854775807"), std::numeric_limits<std::int64_t>::max());
    for (const char* text : {"", "\n", "4 2", "0x10", "1.5", "9223372036854775808", "1\n2\n"}) {
        EXPECT_EQ(parseInteger(text), std::nullopt) << text;
    }
}

constexpr const char* kSoftIrqs = "                    CPU0       CPU1\n"
                                  "          HI:          3          1\n"
                                  "       TIMER:     136378     112272\n";

TEST(SourceTextTest, AFieldIsFoundByRowNumberAndColumn) {
    EXPECT_EQ(parseField(kSoftIrqs, {"3", 2}), 136378);
    EXPECT_EQ(parseField(kSoftIrqs, {"3", 3}), 112272);
    EXPECT_EQ(parseField(kSoftIrqs, {"3", 4}), std::nullopt);
    EXPECT_EQ(parseField(kSoftIrqs, {"4", 1}), std::nullopt);
    EXPECT_EQ(parseField(kSoftIrqs, {"0", 1}), std::nullopt);
    EXPECT_EQ(parseField(kSoftIrqs, {"1", 1}), std::nullopt); // "CPU0"
}

TEST(SourceTextTest, AFieldIsFoundByTheRowsFirstWord) {
    EXPECT_EQ(parseField(kSoftIrqs, {"HI", 3}), 1);
    EXPECT_EQ(parseField(kSoftIrqs, {"HI:", 2}), 3);
    EXPECT_EQ(parseField(kSoftIrqs, {"H", 2}), std::nullopt);
}

TEST(SourceTextTest, AFieldMayBeAKeyWithItsNumber) {
    EXPECT_EQ(parseField("frames=12 drops=3\n", {"1", 2}), 3);
    EXPECT_EQ(parseField("frames=\n", {"1", 1}), std::nullopt);
}

TEST(SourceTextTest, PressureIsTheTotalOfItsLine) {
    const char* text = "some avg10=0.12 avg60=0.50 avg300=0.31 total=81234567\n"
                       "full avg10=0.00 avg60=0.00 avg300=0.00 total=5\n";
    EXPECT_EQ(parsePressure(text, "some"), 81234567);
    EXPECT_EQ(parsePressure(text, "full"), 5);
    EXPECT_EQ(parsePressure(text, "all"), std::nullopt);
    EXPECT_EQ(parsePressure("some total=x", "some"), std::nullopt);
}

TEST(SourceTextTest, PerProcessorCountsAreSummed) {
    EXPECT_EQ(parsePerCpuCount("4521,17\n"), 4538U);
    EXPECT_EQ(parsePerCpuCount("7"), 7U);
    for (const char* text : {"", "\n", "1,,2", "1,x", "18446744073709551615,1"}) {
        EXPECT_EQ(parsePerCpuCount(text), std::nullopt) << text;
    }
}

TEST(SourceTextTest, TimeInStateNamesEachFrequencyWithItsMilliseconds) {
    EXPECT_THAT(
        parseTimeInState("600000 12345\n1200000 678\n"),
        Optional(ElementsAre(SourceState{"600000", 123450, 0}, SourceState{"1200000", 6780, 0})));
    EXPECT_EQ(parseTimeInState(""), std::nullopt);
    EXPECT_EQ(parseTimeInState("600000\n"), std::nullopt);
    EXPECT_THAT(parseTimeInState("1 1844674407370955161\n"),
                Optional(ElementsAre(SourceState{"1", 18446744073709551610U, 0})));
    EXPECT_EQ(parseTimeInState("1 1844674407370955162\n"), std::nullopt);
}

TEST(SourceTextTest, StatesOfOneNameAreOne) {
    EXPECT_THAT(parseTimeInState("6 1\n12 2\n6 3\n"),
                Optional(ElementsAre(SourceState{"6", 40, 0}, SourceState{"12", 20, 0})));
    EXPECT_EQ(parseTimeInState("1 1844674407370955161\n1 1\n"), std::nullopt);
    EXPECT_THAT(parseTransitionStatistics("From : To\n : 6 12 6 time(ms)\n"
                                          "6: 0 1 2 10\n12: 3 0 4 20\n6: 5 6 0 30\n"),
                Optional(ElementsAre(SourceState{"6", 40, 14}, SourceState{"12", 20, 7})));
}

TEST(SourceTextTest, TheTransitionTableCountsWhatLedIntoAState) {
    EXPECT_THAT(parseTransitionTable("   From  :    To\n"
                                     "         :    600000   1200000   1800000 \n"
                                     "   600000:         0        12         3 \n"
                                     "  1200000:        10         0         4 \n"
                                     "  1800000:         5         2         0 \n"),
                Optional(ElementsAre(SourceState{"600000", 0, 15}, SourceState{"1200000", 0, 14},
                                     SourceState{"1800000", 0, 7})));
}

constexpr const char* kTransitionStatistics = "     From  :   To\n"
                                              "           : 421000000 845000000   time(ms)\n"
                                              "  421000000:         0        31   5123401\n"
                                              "* 845000000:        28         0     23110\n"
                                              "Total transition : 59\n";

TEST(SourceTextTest, TransitionStatisticsEndInTheTimeOfAState) {
    EXPECT_THAT(parseTransitionStatistics(kTransitionStatistics),
                Optional(ElementsAre(SourceState{"421000000", 5123401, 28},
                                     SourceState{"845000000", 23110, 31})));
}

TEST(SourceTextTest, AnIncompleteTransitionTableIsNone) {
    EXPECT_EQ(parseTransitionTable(""), std::nullopt);
    EXPECT_EQ(parseTransitionTable("Not Supported.\n"), std::nullopt);
    EXPECT_EQ(parseTransitionTable("From : To\n : 1 2\n1: 0 3\n"), std::nullopt);
    EXPECT_EQ(parseTransitionTable("From : To\n : 1 2\n1: 0 3\n2: 1\n"), std::nullopt);
    EXPECT_EQ(parseTransitionStatistics("From : To\n : 1\n1: 0\n"), std::nullopt);
}

TEST(SourceTextTest, BucketsAreLinesOfBoundsAndHits) {
    EXPECT_THAT(parseBuckets("# ms\n0 10 5\n\n10 20 0 # none\n-5 0 1\n"),
                Optional(ElementsAre(SourceBucket{0, 10, 5}, SourceBucket{10, 20, 0},
                                     SourceBucket{-5, 0, 1})));
    for (const char* text : {"", "# only\n", "0 10\n", "0 10 -1\n", "0 10 1 2\n", "a b c\n"}) {
        EXPECT_EQ(parseBuckets(text), std::nullopt) << text;
    }
}

TEST(SourceTextTest, BucketsOfTheSameBoundsAreOne) {
    EXPECT_THAT(parseBuckets("10 20 1\n0 10 2\n10 20 3\n10 30 4\n0 10 5\n"),
                Optional(ElementsAre(SourceBucket{10, 20, 4}, SourceBucket{0, 10, 7},
                                     SourceBucket{10, 30, 4})));
    EXPECT_EQ(parseBuckets("0 1 18446744073709551615\n0 1 1\n"), std::nullopt);
    EXPECT_THAT(parseTraceHistogram("# event histogram\n{ lat: 7 } hitcount: 1\n"
                                    "{ lat: 5 } hitcount: 2\n{ lat: 7 } hitcount: 4\n"),
                Optional(ElementsAre(SourceBucket{5, 5, 2}, SourceBucket{7, 7, 5})));
}

TEST(SourceTextTest, MoreBucketsThanAnyHistogramHasAreNone) {
    std::string text;
    for (std::size_t i = 0; i < kMaxSourceBuckets; ++i) {
        text += std::to_string(i) + " 9999 1\n";
    }
    ASSERT_TRUE(parseBuckets(text));
    EXPECT_EQ(parseBuckets(text + "0 1 1\n"), std::nullopt);
}

TEST(SourceTextTest, ATraceHistogramHasValuesRangesOrPowers) {
    const std::string head = "# event histogram\n#\n# trigger info: hist:keys=lat [active]\n#\n\n";
    EXPECT_THAT(parseTraceHistogram(head + "{ lat: ~ 30-39 } hitcount:          2\n"
                                           "{ lat: ~ 10-19 } hitcount:         41\n"
                                           "\nTotals:\n    Hits: 43\n"),
                Optional(ElementsAre(SourceBucket{10, 19, 41}, SourceBucket{30, 39, 2})));
    EXPECT_THAT(parseTraceHistogram(head + "{ lat: ~ 2^0  } hitcount: 1\n"
                                           "{ lat: ~ 2^3  } hitcount: 2\n"),
                Optional(ElementsAre(SourceBucket{0, 1, 1}, SourceBucket{4, 8, 2})));
    EXPECT_THAT(parseTraceHistogram(head + "{ lat:         17 } hitcount: 9\n"),
                Optional(ElementsAre(SourceBucket{17, 17, 9})));
}

TEST(SourceTextTest, ATraceHistogramWithoutHitsIsOneAndOtherTextIsNone) {
    EXPECT_THAT(parseTraceHistogram("# event histogram\n"), Optional(ElementsAre()));
    EXPECT_EQ(parseTraceHistogram(""), std::nullopt);
    EXPECT_EQ(parseTraceHistogram("# event histogram\n{ comm: sh } hitcount: 1\n"), std::nullopt);
    EXPECT_EQ(parseTraceHistogram("# event histogram\n{ lat: 1 }\n"), std::nullopt);
}

TEST(SourceTextTest, ReadsTheStatusOfAStream) {
    const auto status = parsePcmStatus("state: RUNNING\nowner_pid   : 2718\n"
                                       "trigger_time: 5113.412345678\ntstamp      : 5120.5\n"
                                       "hw_ptr      : 360112\n");
    ASSERT_TRUE(status);
    EXPECT_EQ(status->state, "RUNNING");
    EXPECT_EQ(status->owner, 2718);
    EXPECT_EQ(status->triggered, 5113s + 412345678ns);
    EXPECT_EQ(status->stamped, std::nullopt); // not nine digits
    EXPECT_EQ(status->frames, 360112);
    EXPECT_EQ(parsePcmStatus("closed\n")->state, "CLOSED");
    EXPECT_FALSE(parsePcmStatus(""));
}

TEST(SourceTextTest, BlanksAreSpacesTabsAndReturns) {
    EXPECT_EQ(parseInteger("\t7\r\n"), 7);
    EXPECT_EQ(parseField("a\tb  3\r\n", {"a", 3}), 3);
}

TEST(SourceTextTest, ARowThatIsANumberIsALinesNumber) {
    EXPECT_EQ(parseField("cpu 5\n1 7\n", {"1", 2}), 5);
}

TEST(SourceTextTest, PerProcessorCountsAreOneLine) {
    EXPECT_EQ(parsePerCpuCount("1,2\n9\n"), 3U);
}

TEST(SourceTextTest, MoreStatesThanAnyDeviceHasAreNone) {
    std::string times = "\n";
    std::string header = "From : To\n :";
    std::string rows;
    for (std::size_t i = 0; i < kMaxSourceStates; ++i) {
        times += std::to_string(i) + " 1\n\n";
        header += " " + std::to_string(i);
    }
    EXPECT_EQ(parseTimeInState(times).value().size(), kMaxSourceStates);
    EXPECT_EQ(parseTimeInState(times + "x 1\n"), std::nullopt);
    EXPECT_EQ(parseTransitionTable(header + " x\n"), std::nullopt);
}

TEST(SourceTextTest, ATransitionTableWithTooManyRowsOrTransitionsIsNone) {
    EXPECT_TRUE(parseTransitionTable("From : To\n : 1\n1: 3\n"));
    EXPECT_EQ(parseTransitionTable("From : To\n : 1\n1: 3\n1: 3\n"), std::nullopt);
    EXPECT_EQ(parseTransitionTable("From : To\n : 1 2\n1: 18446744073709551615 0\n2: 1 0\n"),
              std::nullopt);
}

TEST(SourceTextTest, TheKeysOfATraceHistogramHaveBounds) {
    const auto keyed = [](const std::string& key) {
        return parseTraceHistogram("# event histogram\n{ lat: " + key + " } hitcount: 1\n");
    };
    EXPECT_THAT(keyed("~ -10--5"), Optional(ElementsAre(SourceBucket{-10, -5, 1})));
    EXPECT_THAT(keyed("~ 2^62"), Optional(ElementsAre(SourceBucket{std::int64_t{1} << 61,
                                                                   std::int64_t{1} << 62, 1})));
    for (const char* key : {"~ 2^63", "~ 2^-1", "~ 10", "~ a-b", ""}) {
        EXPECT_EQ(keyed(key), std::nullopt) << key;
    }
    EXPECT_EQ(parseTraceHistogram("{ lat: 1 } hitcount: 1\n"), std::nullopt);
    EXPECT_EQ(parseTraceHistogram("# event histogram\n{ lat: 1 } hitcount: x\n"), std::nullopt);
}

TEST(SourceTextTest, MoreBucketsThanAnyTraceHistogramHasAreNone) {
    std::string text = "# event histogram\n";
    for (std::size_t i = 0; i < kMaxSourceBuckets; ++i) {
        text += "{ lat: " + std::to_string(i) + " } hitcount: 1\n";
    }
    EXPECT_EQ(parseTraceHistogram(text).value().size(), kMaxSourceBuckets);
    EXPECT_EQ(parseTraceHistogram(text + "{ lat: 5000 } hitcount: 1\n"), std::nullopt);
}

TEST(SourceTextTest, StampsThatNoClockHasAreNone) {
    const auto stamp = [](const std::string& text) {
        return parsePcmStatus("state: RUNNING\ntstamp: " + text + "\n")->stamped;
    };
    EXPECT_EQ(stamp("9000000000.000000001"), 9'000'000'000s + 1ns);
    EXPECT_EQ(stamp("0.000000000"), 0ns);
    for (const char* text :
         {"9000000001.000000000", "-1.000000000", "5", "5.12345678x", "x.000000000"}) {
        EXPECT_EQ(stamp(text), std::nullopt) << text;
    }
}

} // namespace
} // namespace halyard::linux_
