#include "tracing/TraceInterval.h"

#include "platform/Log.h"

namespace halyard {
namespace {

// Kept: both messages count the starts, as readers of the log know them.
void logDiscarded(LogLevel level, const EventPairing& pairing, const std::string& name) {
    const std::size_t starts = pairing.discardedStarts.size();
    if (starts > 0) {
        HY_LOG(level, HYReportingTraceCategory,
               "DISCARDED {} trace Start points for interval {} because no stop points found",
               starts, name);
    }
    if (!pairing.discardedStops.empty()) {
        HY_LOG(level, HYReportingTraceCategory,
               "DISCARDED {} trace Stop points for interval {} because no start points found",
               starts, name);
    }
}

} // namespace

EventPairing TraceInterval::pairing(const std::vector<trace_point>& points) const {
    return singleThread_ ? pairByThread(points, startEventCode_, stopEventCode_)
                         : pairOverAllThreads(points, startEventCode_, stopEventCode_);
}

void TraceInterval::addResults(platform::EventTraceSession& session, const EventPairing& pairing) {
    for (const auto& [start, stop] : pairing.pairs) {
        addResult(session.nanoseconds(stop->timestamp) - session.nanoseconds(start->timestamp));
        countMeasurement();
    }
}

void TraceInterval::processTracepoints(platform::EventTraceSession* session,
                                       const std::vector<trace_point>& points) {
    if (singleThread_) {
        processTracepointsSingleThread(session, points);
    } else {
        processTracepointsAnyThread(session, points);
    }
}

void TraceInterval::processTracepointsSingleThread(platform::EventTraceSession* session,
                                                   const std::vector<trace_point>& points) {
    if (points.empty()) {
        return;
    }
    const EventPairing found = pairByThread(points, startEventCode_, stopEventCode_);
    addResults(*session, found);
    logDiscarded(LogLevel::Debug, found, name());
}

void TraceInterval::processTracepointsAnyThread(platform::EventTraceSession* session,
                                                const std::vector<trace_point>& points) {
    if (points.empty()) {
        return;
    }
    const EventPairing found = pairOverAllThreads(points, startEventCode_, stopEventCode_);
    addResults(*session, found);
    logDiscarded(LogLevel::Default, found, name());
}

} // namespace halyard
