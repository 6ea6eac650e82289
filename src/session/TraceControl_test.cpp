// The trace by itself, as part of something that is no session.

#include "session/TraceControl.h"

#include <gmock/gmock.h>
#include <optional>

#include "sinks/SinkFixture.h"
#include "testing/TestPlatform.h"

namespace halyard {
namespace {

using ::testing::IsEmpty;
using ::testing::SizeIs;

class TraceControlTest : public ::testing::Test {
protected:
    TraceControlTest() {
        platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = true;
        // Whoever blocks lets the queues go on.
        platform_.conditions.onWait = [this] { return platform_.queues.runOne(); };
        session_->type = kAudioServiceTypeTest;
        session_->settings = {};
    }
    auto& performance() { return platform_.performanceTraces.sessions; }

    testing::TestPlatform platform_;
    std::unique_ptr<FakeSessionFacts> session_ = std::make_unique<FakeSessionFacts>();
    std::shared_ptr<TraceControl> trace_ = std::make_shared<TraceControl>(*session_);
};

TEST_F(TraceControlTest, IsTheDelegateOfItsPerformanceTrace) {
    trace_->start();
    ASSERT_THAT(performance(), SizeIs(1));
    EXPECT_EQ(performance()[0]->delegate.lock(), trace_);
    trace_->stop();
    EXPECT_EQ(trace_->getPSTraceFileURL(), "/traces/one.dat");
    EXPECT_FALSE(trace_->startedTracing());
}

TEST_F(TraceControlTest, AConfiguredFileTakesAnEventTraceInstead) {
    session_->settings = {{HYReportingLoomisPlistFilePath, "/none"}};
    trace_->start();
    EXPECT_EQ(trace_->tracingFileName(), "/none");
    EXPECT_TRUE(trace_->startedTracing());
    EXPECT_THAT(performance(), IsEmpty());
    trace_->stop();
    EXPECT_THAT(platform_.resultsFiles.files, SizeIs(1));
}

TEST_F(TraceControlTest, OtherSessionsAreNotEvenAskedForTheirConfiguration) {
    session_->type = kAudioServiceTypeHaptics;
    trace_->start();
    EXPECT_EQ(session_->configurationReads, 0);
    EXPECT_THAT(performance(), IsEmpty());
}

TEST_F(TraceControlTest, AStopTellsSinceWhenItWaits) {
    std::optional<platform::SteadyTime> since;
    platform_.performanceTraces.completes = false;
    platform_.conditions.onWait = [&] {
        since = trace_->stopWaitsSince();
        trace_->performanceTraceDidComplete("/late", "", std::nullopt);
        return true;
    };
    trace_ = std::make_shared<TraceControl>(*session_);
    trace_->start();
    trace_->stop();
    EXPECT_EQ(since, platform_.clock.steadyTime());
    EXPECT_EQ(trace_->stopWaitsSince(), std::nullopt);
}

TEST_F(TraceControlTest, ACallThatIsUnderWayNeedsNoSession) {
    trace_->start();
    const auto delegate = performance()[0]->delegate.lock();
    trace_.reset();
    session_.reset();
    delegate->performanceTraceDidStop(std::nullopt);
    delegate->performanceTraceDidComplete("/late", "", std::nullopt);
    EXPECT_EQ(platform_.log.count("Performance Trace Completed: /late"), 1U);
}

} // namespace
} // namespace halyard
