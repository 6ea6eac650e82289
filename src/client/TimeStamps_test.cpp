#include "client/TimeStamps.h"

#include <gtest/gtest.h>

#include "protocol/Wire.h"

namespace halyard::client {
namespace {

class FixedClock final : public Clock {
public:
    std::int64_t realNanoseconds() const noexcept override { return 1'700'000'000'250'000'000; }
    std::int64_t bootNanoseconds() const noexcept override { return boot; }
    std::int64_t processStartNanoseconds() const noexcept override { return 90'000'000'000; }

    std::int64_t boot = 100'499'999'999;
};

class TimeStampsTest : public testing::Test {
protected:
    // Through the wire's own decoder, as a message.
    Dictionary write(StampSet present) {
        char bytes[kMaxStampBytes];
        const Stamps stamps = writeMissingStamps(bytes, present, clock_);
        std::string frame;
        protocol::appendArray(frame, 3);
        protocol::appendValue(frame, 2);
        protocol::appendText(frame, "setConfiguration");
        protocol::appendArray(frame, 2);
        protocol::appendMap(frame, stamps.entries);
        frame.append(bytes, stamps.bytes);
        protocol::appendValue(frame, 1);
        return protocol::CallDecoder().decode(frame)->arguments.dictionary;
    }

    FixedClock clock_;
};

TEST_F(TimeStampsTest, WritesAllThree) {
    const Dictionary stamps = write(kNoStamps);
    EXPECT_EQ(stamps["hyreporting_timestamp"].kind(), Value::Kind::Double);
    EXPECT_EQ(stamps["hyreporting_timestamp"].doubleValue(), 1'700'000'000.25);
    EXPECT_EQ(stamps["systemuptime_sec"].kind(), Value::Kind::Int);
    EXPECT_EQ(stamps["processuptime_ms"].integerValue(), 10'499);
}

TEST_F(TimeStampsTest, RoundsTheUptimeToTheNearestSecond) {
    EXPECT_EQ(write(kNoStamps)["systemuptime_sec"].integerValue(), 100);
    clock_.boot = 100'500'000'000;
    EXPECT_EQ(write(kNoStamps)["systemuptime_sec"].integerValue(), 101);
}

TEST_F(TimeStampsTest, LeavesOutWhatIsThere) {
    const Dictionary stamps = write(stampNamed("systemuptime_sec"));
    EXPECT_EQ(stamps.size(), 2U);
    EXPECT_FALSE(stamps.contains("systemuptime_sec"));
    EXPECT_TRUE(write(kAllStamps).empty());
}

TEST_F(TimeStampsTest, AProcessIsNeverYoungerThanZero) {
    clock_.boot = 80'000'000'000;
    EXPECT_EQ(write(kNoStamps)["processuptime_ms"].integerValue(), 0);
}

TEST(SystemClockTest, TheProcessStartedBeforeNowAndAfterTheBoot) {
    EXPECT_GT(systemClock().processStartNanoseconds(), 0);
    EXPECT_LE(systemClock().processStartNanoseconds(), systemClock().bootNanoseconds());
}

} // namespace
} // namespace halyard::client
