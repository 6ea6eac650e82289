// Runs the performance traces of one reporting session: opens a kernel trace
// session for each, keeps the events while they come, and when it is stopped
// ends the traces one after another and writes what they measured to the
// results file.
//
// Threads: one caller at a time. Events and completions arrive on the runner's
// own serial queue; a trace's events are touched nowhere else until its
// completion has been signalled.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "common/Value.h"
#include "platform/EventTrace.h"
#include "platform/ResultsWriter.h"
#include "platform/Semaphore.h"
#include "platform/WorkQueue.h"
#include "tracing/Trace.h"
#include "tracing/TraceParamsParser.h"

namespace halyard {

inline constexpr const char* HYReportingTracingLogsDirectory =
    "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio/Traces";

class TraceRunner {
public:
    // Every trace records these codes, whatever its items are.
    static constexpr std::uint32_t kFirstCode = 0x21040000;
    static constexpr std::uint32_t kLastCode = 0x2104408A;

    // Requires an installed platform.
    TraceRunner();
    // Traces that still run are given up, with their events.
    virtual ~TraceRunner();
    TraceRunner(const TraceRunner&) = delete;
    TraceRunner& operator=(const TraceRunner&) = delete;

    // Every item becomes an interval, whatever its type. Null is refused.
    void createTraceFromTraceParams(const TraceParams* params);
    void runTraces();
    // Blocks its caller, without a limit, until every trace has completed. The
    // process ends when the results file cannot be opened. Requires runTraces()
    // and a caller that holds up neither the queue nor the trace facility.
    void stopTracingandProcessResults();

    // The steps of one trace.
    void setupTracing(Trace* trace);
    void startTracing(Trace* trace);
    void stopTracing(Trace* trace);
    void tearDownTracing(Trace* trace);
    void tracingCompletionHandler(Trace* trace);

    void writeBenchdata();
    static void printTraceResults(const std::pair<Trace*, Trace::Results>& results);

    std::uint64_t getNumTraces() const { return traces_.size(); }
    std::uint32_t getResultsVersion() const { return resultsVersion_; }

private:
    platform::TraceTimeline timelineOf(Trace& trace) const;

    const std::string resultsFileName_ = "tracing_results.pbj";
    const std::string writerName_ = "HYReporting";
    const std::uint32_t resultsVersion_ = 4;
    const Dictionary attributes_; // for whoever runs traces; nobody reads it
    std::unique_ptr<platform::ResultsWriter> writer_;
    std::vector<std::unique_ptr<Trace>> traces_;
    std::uint32_t completedTraces_ = 0;
    std::shared_ptr<platform::SerialQueue> queue_;
    platform::Semaphore semaphore_;
    std::map<Trace*, std::vector<trace_point>> points_;
    std::map<Trace*, Trace::Results> traceResults_;
    std::vector<platform::TraceTimeline> timelines_; // in the order of completion
    // Last, so that they are destroyed before what their handlers touch.
    std::map<Trace*, std::unique_ptr<platform::EventTraceSession>> sessions_;
};

} // namespace halyard
