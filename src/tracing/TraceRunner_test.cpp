#include "tracing/TraceRunner.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <tuple>

#include "testing/TestPlatform.h"

namespace halyard {
namespace {

using halyard::testing::FakeResultsFiles;
using halyard::testing::tracePoint;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr const char* kPath =
    "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio/Traces/tracing_results.pbj";

TraceParams paramsNamed(std::string name, std::int32_t isSignpost = 0) {
    return {std::move(name),
            isSignpost,
            {{"b", TraceDataParams::Interval, 1, 2, true},
             {"a", TraceDataParams::Interval, 3, 4, false},
             {"impulse", TraceDataParams::Impulse, 1, 1, false}}};
}

class TraceRunnerTest : public ::testing::Test {
protected:
    TraceRunnerTest() {
        // Whoever blocks lets the queues go on.
        platform_.conditions.onWait = [this] { return platform_.queues.runOne(); };
        runner_ = std::make_unique<TraceRunner>();
    }

    void create(const TraceParams& params) { runner_->createTraceFromTraceParams(&params); }
    halyard::testing::FakeEventTrace::State& session(std::size_t index) {
        return *platform_.eventTrace.sessions[index];
    }
    void runAndStop() {
        runner_->runTraces();
        runner_->stopTracingandProcessResults();
    }
    const FakeResultsFiles::File& results() const { return *platform_.resultsFiles.files.at(0); }
    bool logged(LogLevel level, std::string_view text) const {
        return platform_.log.has(level, HYReportingTraceCategory, text);
    }

    halyard::testing::TestPlatform platform_;
    std::unique_ptr<TraceRunner> runner_;
};

TEST_F(TraceRunnerTest, WithoutTracesItWritesAFileWithoutValues) {
    runAndStop();
    EXPECT_THAT(platform_.files.directories, ElementsAre(halyard::testing::FakeFiles::Made{
                                                 HYReportingTracingLogsDirectory, 0777}));
    EXPECT_EQ(results().path, kPath);
    EXPECT_EQ(results().name, "HYReporting");
    EXPECT_EQ(results().version, 4U);
    EXPECT_THAT(results().values, IsEmpty());
    EXPECT_TRUE(results().closed);
    EXPECT_THAT(platform_.log.texts(), ElementsAre("Number of traces to perform: 0",
                                                   "Completed trace....In write perf data.... 0"));
}

TEST_F(TraceRunnerTest, NoParametersAreRefused) {
    runner_->createTraceFromTraceParams(nullptr);
    EXPECT_TRUE(logged(LogLevel::Default, "Attempted to add nullptr to trace runner"));
    EXPECT_EQ(runner_->getNumTraces(), 0U);
}

TEST_F(TraceRunnerTest, VersionAndNumberOfTracesCanBeAsked) {
    create(paramsNamed("one"));
    create(paramsNamed("signpost", 1));
    EXPECT_EQ(runner_->getNumTraces(), 2U);
    EXPECT_EQ(runner_->getResultsVersion(), 4U);
}

TEST_F(TraceRunnerTest, ATraceRecordsTheFixedRangeWithWallTimesOnItsOwnQueue) {
    create(paramsNamed("one"));
    runner_->runTraces();
    EXPECT_EQ(session(0).first, 0x21040000U);
    EXPECT_EQ(session(0).last, 0x2104408AU);
    EXPECT_TRUE(session(0).wallTimes && session(0).started);
    EXPECT_EQ(platform_.queues.queuesMade("Tracing Queue"), 1U);
    EXPECT_NE(platform_.queues.priority("Tracing Queue"), platform::QueuePriority::UserInteractive);
    EXPECT_THAT(platform_.log.texts(),
                ElementsAre("Number of traces to perform: 1", "Performing trace : one",
                            "Setting up tracing: one", "Starting tracing: one"));
}

TEST_F(TraceRunnerTest, ResultsAreWrittenByNameAndThenInTheirOrder) {
    create(paramsNamed("one"));
    runner_->runTraces();
    for (const auto& [code, time] : std::vector<std::pair<std::uint32_t, std::uint64_t>>{
             {1, 10}, {2, 40}, {1, 50}, {2, 60}, {3, 70}, {4, 75}}) {
        session(0).deliver(tracePoint(code, time));
    }
    runner_->stopTracingandProcessResults();
    EXPECT_THAT(results().values, ElementsAre(FakeResultsFiles::NamedValue{"a", 5},
                                              FakeResultsFiles::NamedValue{"b", 30},
                                              FakeResultsFiles::NamedValue{"b", 10}));
    EXPECT_TRUE(logged(LogLevel::Info, "Writing out 1 result for a, min: 5, max: 5 "));
    EXPECT_TRUE(logged(LogLevel::Info, "Writing out 2 result for b, min: 10, max: 30 "));
}

TEST_F(TraceRunnerTest, EventsThatWaitedInTheQueueCountWhenItStops) {
    create(paramsNamed("one"));
    runner_->runTraces();
    std::vector<int> ended; // how often, when each event arrives
    session(0).handler = [&, handler = session(0).handler](const trace_point& point) {
        ended.push_back(session(0).ended);
        handler(point);
    };
    session(0).deliver(tracePoint(1, 10));
    session(0).deliver(tracePoint(2, 20));
    session(0).deliver(tracePoint(1, 30));
    session(0).deliver(tracePoint(2, 45));
    ASSERT_EQ(platform_.queues.pending("Tracing Queue"), 4U);
    runner_->stopTracingandProcessResults();
    EXPECT_EQ(platform_.queues.pending("Tracing Queue"), 0U);
    EXPECT_THAT(ended, ElementsAre(0, 0, 0, 0));
    EXPECT_THAT(results().values, ElementsAre(FakeResultsFiles::NamedValue{"b", 10},
                                              FakeResultsFiles::NamedValue{"b", 15}));
}

TEST_F(TraceRunnerTest, AStoppedTracesSessionIsEndedOnceAndDestroyed) {
    create(paramsNamed("one"));
    runAndStop();
    EXPECT_EQ(session(0).ended, 1);
    EXPECT_TRUE(session(0).destroyed);
}

TEST_F(TraceRunnerTest, ASecondStopEndsNothingAgainAndWritesTheSameResults) {
    create(paramsNamed("one"));
    runner_->runTraces();
    session(0).deliver(tracePoint(1, 10));
    session(0).deliver(tracePoint(2, 40));
    runner_->stopTracingandProcessResults();
    runner_->stopTracingandProcessResults();
    EXPECT_EQ(session(0).ended, 1);
    ASSERT_THAT(platform_.resultsFiles.files, SizeIs(2));
    for (const auto& file : platform_.resultsFiles.files) {
        EXPECT_THAT(file->values, ElementsAre(FakeResultsFiles::NamedValue{"b", 30}));
        EXPECT_THAT(file->timelines, SizeIs(1));
    }
}

TEST_F(TraceRunnerTest, ASignpostTraceIsCountedButNeverRuns) {
    create(paramsNamed("signpost", 1));
    runAndStop();
    EXPECT_THAT(platform_.eventTrace.sessions, IsEmpty());
    EXPECT_THAT(results().values, IsEmpty());
    EXPECT_THAT(results().timelines, IsEmpty());
    EXPECT_THAT(platform_.log.texts(),
                ElementsAre("Number of traces to perform: 1", "Performing trace : signpost",
                            "Tearing down trace :  signpost", "Completed trace.... 1,   1 ",
                            "Completed trace....In write perf data.... 0"));
}

TEST_F(TraceRunnerTest, TracesAreEndedOneAfterAnotherAndCounted) {
    create(paramsNamed("one"));
    create(paramsNamed("signpost", 1));
    create(paramsNamed("three"));
    runner_->runTraces();
    int endedBefore = -1; // the third, when the first completes
    session(0).completion = [&, completion = session(0).completion] {
        endedBefore = session(1).ended;
        completion();
    };
    runner_->stopTracingandProcessResults();
    EXPECT_EQ(endedBefore, 0);
    std::vector<std::string> completed;
    for (const std::string& text : platform_.log.texts()) {
        if (text.starts_with("Completed trace.... ")) {
            completed.push_back(text);
        }
    }
    EXPECT_THAT(completed, ElementsAre("Completed trace.... 1,   3 ", "Completed trace.... 2,   3 ",
                                       "Completed trace.... 3,   3 "));
    EXPECT_TRUE(logged(LogLevel::Info, "Completed trace....In write perf data.... 2"));
}

TEST_F(TraceRunnerTest, WhatCannotStartIsLoggedAndYieldsNothing) {
    platform_.eventTrace.rangeResult = 22;
    platform_.eventTrace.startResult = 13;
    create(paramsNamed("one"));
    runAndStop();
    EXPECT_TRUE(logged(LogLevel::Error, "Could not set up evtap range, error: 22"));
    EXPECT_TRUE(logged(LogLevel::Error, "Could not start evtap session, error: 13"));
    EXPECT_THAT(results().values, IsEmpty());
    EXPECT_TRUE(results().closed);
}

TEST_F(TraceRunnerTest, ADirectoryThatCannotBeMadeIsLogged) {
    platform_.files.createError = Error{"posix", 13, "Permission denied"};
    platform_.files.place = "/var/log";
    runAndStop();
    EXPECT_TRUE(logged(LogLevel::Error, std::string("can't create logging directory at /var/log") +
                                            HYReportingTracingLogsDirectory +
                                            ": Permission denied"));
    EXPECT_TRUE(results().closed);
}

TEST_F(TraceRunnerTest, WithoutAResultsFileTheProcessEnds) {
    platform_.resultsFiles.refuse = true;
    runAndStop();
    EXPECT_TRUE(logged(LogLevel::Error, "Failed to open benchdata writer"));
    EXPECT_THAT(platform_.ownProcess.terminations, ElementsAre(1));
}

TEST_F(TraceRunnerTest, TheTimelineShowsPairedAndUnpairedEvents) {
    create(paramsNamed("one"));
    runner_->runTraces();
    session(0).lost = 7;
    for (const auto& [code, time] : std::vector<std::pair<std::uint32_t, std::uint64_t>>{
             {4, 5}, {3, 10}, {3, 20}, {4, 40}, {3, 50}}) {
        session(0).deliver(tracePoint(code, time, 9));
    }
    runner_->stopTracingandProcessResults();
    ASSERT_THAT(results().timelines, SizeIs(1));
    const platform::TraceTimeline& timeline = results().timelines[0];
    EXPECT_EQ(timeline.trace, "one");
    EXPECT_EQ(timeline.clock, "fake");
    EXPECT_EQ(timeline.eventsLost, 7U);
    ASSERT_THAT(timeline.tracks, SizeIs(3));
    const auto& spans = timeline.tracks[1].spans;
    ASSERT_THAT(spans, SizeIs(4)); // A pair, two starts alone, a stop alone.
    EXPECT_TRUE(spans[0].hasBegin && spans[0].hasEnd);
    EXPECT_EQ(spans[0].begin, 20U);
    EXPECT_EQ(spans[0].end, 40U);
    EXPECT_EQ(spans[0].threadID, 9U);
    EXPECT_TRUE(spans[1].hasBegin && !spans[1].hasEnd && spans[1].begin == 10);
    EXPECT_TRUE(spans[2].hasBegin && !spans[2].hasEnd && spans[2].begin == 50);
    EXPECT_TRUE(!spans[3].hasBegin && spans[3].hasEnd && spans[3].end == 5);
    EXPECT_TRUE(spans[1].end == 0 && spans[2].end == 0 && spans[3].begin == 0);
}

TEST_F(TraceRunnerTest, TheTimelineHasATrackForEachItemThatPairsAsTheItemDoes) {
    platform_.eventTrace.nanosecondsPerUnit = 10;
    create({"one",
            0,
            {{"by thread", TraceDataParams::Interval, 1, 2, true},
             {"any thread", TraceDataParams::Interval, 1, 2, false}}});
    runner_->runTraces();
    for (const auto& [code, time, thread] :
         std::vector<std::tuple<std::uint32_t, std::uint64_t, std::uint64_t>>{
             {1, 1, 7}, {1, 2, 8}, {2, 3, 7}}) {
        trace_point point = tracePoint(code, time, thread);
        point.pid = static_cast<std::int32_t>(thread + 100);
        session(0).deliver(point);
    }
    runner_->stopTracingandProcessResults();
    std::vector<std::string> shown;
    for (const auto& track : results().timelines.at(0).tracks) {
        for (const auto& span : track.spans) {
            shown.push_back(fmt::format("{}: {} to {}, {} of {}", track.item, span.begin, span.end,
                                        span.threadID, span.pid));
        }
    }
    EXPECT_THAT(shown,
                ElementsAre("by thread: 10 to 30, 7 of 107", "by thread: 20 to 0, 8 of 108",
                            "any thread: 20 to 30, 8 of 108", "any thread: 10 to 0, 7 of 107"));
}

TEST_F(TraceRunnerTest, ARunnerDestroyedWhileItTracesGivesItsSessionsUp) {
    create(paramsNamed("one"));
    runner_->runTraces();
    runner_.reset();
    EXPECT_TRUE(session(0).destroyed);
}

} // namespace
} // namespace halyard
