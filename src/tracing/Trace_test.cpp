#include "tracing/Trace.h"

#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "testing/FakeEventTrace.h"
#include "testing/TestPlatform.h"
#include "tracing/TracePoint.h"

namespace halyard {
namespace {

using halyard::testing::tracePoint;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Pair;

constexpr std::uint32_t kStart = 0x21040010;
constexpr std::uint32_t kStop = 0x21040011;
constexpr std::uint32_t kOther = 0x21040012;

trace_point start(std::uint64_t time, std::uint64_t thread = 1) {
    return tracePoint(kStart, time, thread);
}
trace_point stop(std::uint64_t time, std::uint64_t thread = 1) {
    return tracePoint(kStop, time, thread);
}

std::string discardedStarts(int count) {
    return "DISCARDED " + std::to_string(count) +
           " trace Start points for interval item because no stop points found";
}
std::string discardedStops(int count) {
    return "DISCARDED " + std::to_string(count) +
           " trace Stop points for interval item because no start points found";
}

class TraceTest : public ::testing::Test {
protected:
    void process(TraceData& item, const std::vector<trace_point>& points) {
        item.processTracepoints(session_.get(), points);
    }
    bool logged(LogLevel level, const std::string& text) const {
        return platform_.log.has(level, HYReportingTraceCategory, text);
    }

    halyard::testing::TestPlatform platform_;
    halyard::testing::FakeEventTrace facility_;
    std::unique_ptr<platform::EventTraceSession> session_ = facility_.createSession();
    TraceInterval anyThread_{"item", kStart, kStop, false};
    TraceInterval singleThread_{"item", kStart, kStop, true};
};

TEST_F(TraceTest, TheNewestStartWins) {
    process(anyThread_, {start(10, 1), start(20, 2), stop(35, 3)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(15));
    EXPECT_EQ(anyThread_.getNumTimesTraced(), 1U);
    EXPECT_TRUE(logged(LogLevel::Default, discardedStarts(1)));
}

TEST_F(TraceTest, TheStopMessageShowsTheNumberOfStarts) {
    process(anyThread_, {start(10), start(20), stop(30), stop(40), stop(50)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(10));
    EXPECT_TRUE(logged(LogLevel::Default, discardedStarts(1)));
    EXPECT_TRUE(logged(LogLevel::Default, discardedStops(1)));
}

TEST_F(TraceTest, AStrayStopIsLoggedWithTheStartCountZero) {
    process(anyThread_, {stop(5), start(10), stop(30)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(20));
    EXPECT_THAT(platform_.log.texts(), ElementsAre(discardedStops(0)));
}

TEST_F(TraceTest, ByThreadEachThreadIsMeasuredOnItsOwn) {
    process(singleThread_, {start(10, 1), start(12, 2), stop(20, 1), stop(32, 2)});
    EXPECT_THAT(singleThread_.getResults(), ElementsAre(10, 20));
    EXPECT_THAT(platform_.log.texts(), IsEmpty());
}

TEST_F(TraceTest, OverAllThreadsTheSameEventsMakeOneInterval) {
    process(anyThread_, {start(10, 1), start(12, 2), stop(20, 1), stop(32, 2)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(8));
    EXPECT_THAT(platform_.log.texts(), ElementsAre(discardedStarts(1), discardedStops(1)));
}

TEST_F(TraceTest, ByThreadDiscardsAreCountedAtDebugLevel) {
    process(singleThread_, {start(10), start(20), stop(25, 2), stop(30)});
    EXPECT_THAT(singleThread_.getResults(), ElementsAre(10));
    EXPECT_TRUE(logged(LogLevel::Debug, discardedStarts(1)));
    EXPECT_TRUE(logged(LogLevel::Debug, discardedStops(1)));
}

TEST_F(TraceTest, ByThreadAStartIsUsedUpByItsStop) {
    process(singleThread_, {start(10), stop(20), stop(30), start(40), stop(45)});
    EXPECT_THAT(singleThread_.getResults(), ElementsAre(10, 5));
    EXPECT_EQ(singleThread_.getNumTimesTraced(), 2U);
    EXPECT_THAT(platform_.log.texts(), ElementsAre(discardedStops(0)));
}

TEST_F(TraceTest, ATrailingStartLeavesNoTrace) {
    for (TraceInterval* const item : {&anyThread_, &singleThread_}) {
        process(*item, {start(10)});
        EXPECT_FALSE(item->hasResults());
        // Nor does it pair with what a later batch brings.
        process(*item, {});
    }
    EXPECT_THAT(platform_.log.texts(), IsEmpty());
}

TEST_F(TraceTest, AnOpenStartDoesNotReachTheNextBatch) {
    process(anyThread_, {start(10)});
    process(anyThread_, {stop(20)});
    process(singleThread_, {start(10)});
    process(singleThread_, {stop(20)});
    EXPECT_FALSE(anyThread_.hasResults());
    EXPECT_FALSE(singleThread_.hasResults());
}

TEST_F(TraceTest, OverAllThreadsAStartAtTimeZeroIsNone) {
    process(anyThread_, {start(0), start(10), stop(20)});
    process(anyThread_, {start(0), stop(20)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(10));
    EXPECT_THAT(platform_.log.texts(), ElementsAre(discardedStops(0)));
    process(singleThread_, {start(0), stop(20)});
    EXPECT_THAT(singleThread_.getResults(), ElementsAre(20));
}

TEST_F(TraceTest, EqualCodesAreOnlyEverStarts) {
    TraceInterval item("item", kStart, kStart, false);
    process(item, {start(10), start(20), start(30)});
    EXPECT_FALSE(item.hasResults());
    EXPECT_THAT(platform_.log.texts(), ElementsAre(discardedStarts(2)));
}

TEST_F(TraceTest, TimesAreTakenFromTheSession) {
    facility_.nanosecondsPerUnit = 100;
    process(anyThread_, {start(1), tracePoint(kOther, 2), stop(4)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(300));
}

TEST_F(TraceTest, ANegativeSpanWraps) {
    process(anyThread_, {start(20), stop(19)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(~std::uint64_t{0}));
}

TEST_F(TraceTest, BatchesAddUp) {
    process(anyThread_, {start(10), stop(20)});
    process(anyThread_, {start(30), stop(60)});
    EXPECT_THAT(anyThread_.getResults(), ElementsAre(10, 30));
    EXPECT_EQ(anyThread_.getNumTimesTraced(), 2U);
}

TEST_F(TraceTest, AnEmptyBatchNeedsNoSession) {
    anyThread_.processTracepoints(nullptr, {});
    singleThread_.processTracepoints(nullptr, {});
    EXPECT_FALSE(anyThread_.hasResults() || singleThread_.hasResults());
}

TEST_F(TraceTest, TheAverageIsThatOfTheCountedMeasurements) {
    EXPECT_TRUE(std::isnan(anyThread_.getAverageResult()));
    process(anyThread_, {start(10), stop(11), start(20), stop(22), start(30), stop(33)});
    EXPECT_EQ(anyThread_.getAverageResult(), 2.0F);
}

TEST_F(TraceTest, APointRecordsTheSelectedArgument) {
    trace_point point = tracePoint(kOther, 1);
    point.arg1 = 11;
    point.arg2 = 12;
    point.arg3 = 13;
    point.arg4 = 14;
    for (const std::uint32_t argument : {0U, 1U, 2U, 3U, 4U, 5U, 0xFFFFFFFFU}) {
        TracePoint item("point", kOther, argument);
        process(item, {point, start(2), point});
        if (argument >= 1 && argument <= 4) {
            EXPECT_THAT(item.getResults(), ElementsAre(10 + argument, 10 + argument));
            EXPECT_TRUE(std::isinf(item.getAverageResult())); // It never counts.
        } else {
            EXPECT_FALSE(item.hasResults());
        }
        EXPECT_EQ(item.getNumTimesTraced(), 0U);
    }
}

TEST_F(TraceTest, ATraceCollectsItsItemsResultsByName) {
    TraceInterval other("a", kStop, kStart, false);
    Trace trace("trace", true);
    trace.addTraceDataToCollect(&anyThread_);
    trace.addTraceDataToCollect(&other);
    trace.addTraceDataToCollect(&singleThread_);
    trace.processTracepoints(session_.get(), {start(10), stop(30), start(31), stop(32)});
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("a", 1), Pair("item", 20), Pair("item", 1),
                                                Pair("item", 20), Pair("item", 1)));
}

TEST_F(TraceTest, AskedTwiceATraceReturnsItsResultsTwice) {
    Trace trace("trace", true);
    trace.addTraceDataToCollect(&anyThread_);
    trace.processTracepoints(session_.get(), {start(10), stop(30)});
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("item", 20)));
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("item", 20), Pair("item", 20)));
    EXPECT_THAT(Trace("empty", false).getResults(), IsEmpty());
}

TEST_F(TraceTest, ItemsOutliveTheirTrace) {
    TraceInterval* const item = keepForever(std::make_unique<TraceInterval>("x", 1, 2, true));
    { Trace("short", true).addTraceDataToCollect(item); }
    EXPECT_EQ(item->name(), "x");
}

} // namespace
} // namespace halyard
