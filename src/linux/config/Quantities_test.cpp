#include "linux/config/Quantities.h"

#include <gtest/gtest.h>

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

TEST(ByteSizeTest, TakesPlainNumbersAndBinaryUnits) {
    EXPECT_EQ(parseByteSize("0"), 0u);
    EXPECT_EQ(parseByteSize("262144"), 262144u);
    EXPECT_EQ(parseByteSize("12B"), 12u);
    EXPECT_EQ(parseByteSize("256KiB"), 262144u);
    EXPECT_EQ(parseByteSize("256MiB"), 268435456u);
    EXPECT_EQ(parseByteSize("1GiB"), 1073741824u);
    EXPECT_EQ(parseByteSize("2TiB"), 2199023255552u);
}

TEST(ByteSizeTest, RefusesWhatDoesNotFitSixtyThreeBits) {
    EXPECT_EQ(parseByteSize("9223372036854775807"), 9223372036854775807u);
    EXPECT_EQ(parseByteSize("9223372036854775808"), std::nullopt);
    EXPECT_EQ(parseByteSize("8388607TiB"), 8388607u * kMiB * kMiB);
    EXPECT_EQ(parseByteSize("8388608TiB"), std::nullopt);
    EXPECT_EQ(parseByteSize("99999999999999999999"), std::nullopt);
}

TEST(ByteSizeTest, RefusesOtherText) {
    for (const char* text : {"", "MiB", "-1", "+1", "1.5GiB", "1 MiB", " 1", "1MB", "1mib", "1K"}) {
        EXPECT_EQ(parseByteSize(text), std::nullopt) << text;
    }
}

TEST(DurationTest, TakesOneNumberWithItsUnit) {
    EXPECT_EQ(parseDuration("45s"), 45s);
    EXPECT_EQ(parseDuration("30m"), 30min);
    EXPECT_EQ(parseDuration("12h"), 12h);
    EXPECT_EQ(parseDuration("7d"), 168h);
    EXPECT_EQ(parseDuration("0s"), 0s);
}

TEST(DurationTest, EndsAtAHundredYears) {
    EXPECT_EQ(parseDuration("36500d"), kMaxDuration);
    EXPECT_EQ(parseDuration("36501d"), std::nullopt);
    EXPECT_EQ(parseDuration("3153600000s"), kMaxDuration);
    EXPECT_EQ(parseDuration("3153600001s"), std::nullopt);
}

TEST(DurationTest, RefusesOtherText) {
    for (const char* text : {"", "d", "7", "-7d", "1w", "1.5h", "1h30m", "7 d", "7D"}) {
        EXPECT_EQ(parseDuration(text), std::nullopt) << text;
    }
}

} // namespace
} // namespace halyard::linux_
