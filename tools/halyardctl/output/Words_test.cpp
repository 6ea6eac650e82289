#include "output/Words.h"

#include <cstdlib>
#include <ctime>
#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

TEST(WordsTest, LengthsHaveTheUnitThatFits) {
    EXPECT_EQ(lengthOfTime(0), "0 ms");
    EXPECT_EQ(lengthOfTime(0.32), "320 ms");
    EXPECT_EQ(lengthOfTime(4.25), "4.2 s");
    EXPECT_EQ(lengthOfTime(61), "1 min 1 s");
    EXPECT_EQ(lengthOfTime(12000), "3 h 20 min");
    EXPECT_EQ(lengthOfTime(1e300), "277777777777 h 46 min");
    EXPECT_EQ(lengthOfTime(0.0 / 0.0), "-");
}

TEST(WordsTest, TimesAreThoseOfTheDevice) {
    ::setenv("TZ", "UTC0", 1);
    ::tzset();
    EXPECT_EQ(timeOfDay(1700000000.49), "22:13:20.4");
    EXPECT_EQ(timeOfDay(1700000000.99), "22:13:20.9");
    EXPECT_EQ(dayAndTime(1700000000.99), "2023-11-14 22:13:20");
    EXPECT_EQ(dayAndTime({}), "");
    EXPECT_EQ(dayAndTime(1e300), "");
    EXPECT_EQ(dayOf(1700000000), "14 November 2023");
}

TEST(WordsTest, SizesHaveOneDigitBehindThePoint) {
    EXPECT_EQ(sizeOf(1023), "1023 bytes");
    EXPECT_EQ(sizeOf(1536), "1.5 KiB");
    EXPECT_EQ(sizeOf(256 * 1024 * 1024), "256.0 MiB");
}

TEST(WordsTest, CategoriesGoByTheirPrintedNamesAndNumbers) {
    EXPECT_EQ(categoryOf("Playback"), 4U);
    EXPECT_EQ(categoryOf("volume"), 14U);
    EXPECT_EQ(categoryOf("DSP_IO"), 0x10000007U);
    EXPECT_EQ(categoryOf("0x04000001"), 0x04000001U);
    EXPECT_EQ(categoryOf("4294967295"), 4294967295U);
    EXPECT_EQ(categoryOf("4294967296"), std::nullopt);
    EXPECT_EQ(categoryOf("Playbac"), std::nullopt);
    EXPECT_EQ(categoryOf(""), std::nullopt);
}

TEST(WordsTest, TypesAndServicesDoSoToo) {
    EXPECT_EQ(typeOf("IssueDetector"), 7);
    EXPECT_EQ(typeOf("generic"), 0);
    EXPECT_EQ(typeOf("Unknown"), 65535);
    EXPECT_EQ(typeOf("65536"), std::nullopt);
    EXPECT_EQ(serviceTypeOf("alarms"), 4);
    EXPECT_EQ(serviceTypeOf("unknown"), 65535);
    EXPECT_EQ(serviceTypeOf("13"), 13);
    EXPECT_EQ(serviceTypeOf("nothing"), std::nullopt);
}

} // namespace
} // namespace halyard::ctl
