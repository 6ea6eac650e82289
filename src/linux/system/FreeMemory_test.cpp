#include "linux/system/FreeMemory.h"

#include <gtest/gtest.h>

#include "testing/ManualQueues.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

class FreeMemoryTest : public ::testing::Test {
protected:
    void advance(std::chrono::nanoseconds by) { queues_.advance(by); }

    testing::ManualClock clock_;
    testing::ManualQueues queues_{clock_};
    std::size_t resident_ = FreeMemory::kUsualBytes + 1;
    int returned_ = 0;
    FreeMemory memory_{queues_.backgroundQueue(),
                       {[this] { return resident_; }, [this] { ++returned_; }}};
};

TEST_F(FreeMemoryTest, IsReturnedASecondAfterSomebodyLetGo) {
    advance(60s);
    EXPECT_EQ(returned_, 0);
    memory_.released();
    advance(1s - 1ns);
    EXPECT_EQ(returned_, 0);
    advance(1ns);
    EXPECT_EQ(returned_, 1);
}

TEST_F(FreeMemoryTest, OfAProcessOfUsualSizeIsLeftAlone) {
    resident_ = FreeMemory::kUsualBytes;
    memory_.released();
    advance(60s);
    EXPECT_EQ(returned_, 0);
}

TEST_F(FreeMemoryTest, IsLookedAfterAFewTimesWhileTheProcessStaysLarge) {
    memory_.released();
    advance(1s + 2s + 4s);
    EXPECT_EQ(returned_, 3);
    advance(1h);
    EXPECT_EQ(returned_, 5) << "and then not any more";
    memory_.released();
    advance(1s);
    EXPECT_EQ(returned_, 6);
}

TEST_F(FreeMemoryTest, ThousandsWhoLeaveAtOnceAreLookedAfterOnce) {
    for (int i = 0; i < 1000; ++i) {
        memory_.released();
    }
    resident_ = FreeMemory::kUsualBytes;
    advance(60s);
    EXPECT_EQ(returned_, 0);
    EXPECT_EQ(queues_.pending("background"), 0U);
}

TEST(ResidentBytesTest, AreThoseOfThisProcess) {
    EXPECT_GT(residentBytes(), 1'000'000U);
    returnFreeMemory();
}

} // namespace
} // namespace halyard::linux_
