#include "tracing/TraceRunner.h"

#include <algorithm>

#include "platform/Device.h"
#include "platform/Files.h"
#include "platform/Log.h"
#include "platform/Platform.h"

namespace halyard {
namespace {

constexpr std::size_t kReservedPoints = 1000;
constexpr std::uint32_t kDirectoryMode = 0777;

} // namespace

TraceRunner::TraceRunner()
    : queue_(platform::current().queues->makeSerialQueue("Tracing Queue",
                                                         platform::QueuePriority::Utility)) {}

TraceRunner::~TraceRunner() = default;

void TraceRunner::createTraceFromTraceParams(const TraceParams* params) {
    if (params == nullptr) {
        HY_LOG_DEFAULT(HYReportingTraceCategory, "Attempted to add nullptr to trace runner");
        return;
    }
    auto trace = std::make_unique<Trace>(params->name, params->isSignpost == 0);
    // Kept: every item becomes an interval, also those that never yield a duration.
    for (const TraceDataParams& item : params->items) {
        trace->addTraceDataToCollect(keepForever(std::make_unique<TraceInterval>(
            item.name, item.beginCode, item.endCode, item.matchByThread)));
    }
    points_[trace.get()].reserve(kReservedPoints);
    traces_.push_back(std::move(trace));
}

void TraceRunner::runTraces() {
    HY_LOG_INFO(HYReportingTraceCategory, "Number of traces to perform: {}", traces_.size());
    for (const auto& trace : traces_) {
        HY_LOG_INFO(HYReportingTraceCategory, "Performing trace : {}", trace->name());
        if (trace->flag()) {
            HY_LOG_INFO(HYReportingTraceCategory, "Setting up tracing: {}", trace->name());
            setupTracing(trace.get());
        }
        if (trace->flag()) {
            HY_LOG_INFO(HYReportingTraceCategory, "Starting tracing: {}", trace->name());
            startTracing(trace.get());
        }
    }
}

void TraceRunner::setupTracing(Trace* trace) {
    auto session = platform::current().eventTrace->createSession();
    session->setCompletionHandler([this, trace] { tracingCompletionHandler(trace); });
    session->setWallTimesEnabled(true);
    sessions_[trace] = std::move(session);
}

void TraceRunner::startTracing(Trace* trace) {
    platform::EventTraceSession& session = *sessions_[trace];
    std::vector<trace_point>& points = points_[trace];
    if (const int error = session.addEventsRange(
            kFirstCode, kLastCode,
            [&points](const trace_point& point) { points.push_back(point); });
        error != 0) {
        HY_LOG_ERROR(HYReportingTraceCategory, "Could not set up evtap range, error: {}", error);
    }
    if (const int error = session.start(queue_); error != 0) {
        HY_LOG_ERROR(HYReportingTraceCategory, "Could not start evtap session, error: {}", error);
    }
}

void TraceRunner::stopTracing(Trace* trace) {
    sessions_[trace]->end();
}

void TraceRunner::tearDownTracing(Trace* trace) {
    sessions_.erase(trace);
}

void TraceRunner::tracingCompletionHandler(Trace* trace) {
    if (sessions_.contains(trace)) {
        trace->processTracepoints(sessions_[trace].get(), points_[trace]);
        timelines_.push_back(timelineOf(*trace));
        tearDownTracing(trace);
    }
    ++completedTraces_;
    semaphore_.signal();
}

void TraceRunner::stopTracingandProcessResults() {
    for (const auto& each : traces_) {
        Trace* const trace = each.get();
        HY_LOG_INFO(HYReportingTraceCategory, "Tearing down trace :  {}", trace->name());
        queue_->async([this, trace] {
            // One that was stopped before has no session any more.
            if (trace->flag() && sessions_.contains(trace)) {
                stopTracing(trace);
            } else {
                tracingCompletionHandler(trace);
            }
        });
        semaphore_.wait();
        if (trace->flag()) {
            traceResults_.emplace(trace, trace->getResults());
        }
        HY_LOG_INFO(HYReportingTraceCategory, "Completed trace.... {},   {} ", completedTraces_,
                    traces_.size());
    }
    writeBenchdata();
}

platform::TraceTimeline TraceRunner::timelineOf(Trace& trace) const {
    const platform::EventTraceSession& session = *sessions_.at(&trace);
    const auto span = [&session](const trace_point* start, const trace_point* stop) {
        const trace_point& known = start != nullptr ? *start : *stop;
        return platform::TraceTimeline::Span{
            start != nullptr ? session.nanoseconds(start->timestamp) : 0,
            stop != nullptr ? session.nanoseconds(stop->timestamp) : 0,
            known.threadID,
            known.pid,
            start != nullptr,
            stop != nullptr};
    };
    platform::TraceTimeline timeline{trace.name(), session.clockName(), session.eventsLost(), {}};
    for (const TraceInterval* const item : trace.children()) {
        const EventPairing pairing = item->pairing(points_.at(&trace));
        platform::TraceTimeline::Track& track = timeline.tracks.emplace_back();
        track.item = item->name();
        for (const auto& [start, stop] : pairing.pairs) {
            track.spans.push_back(span(start, stop));
        }
        for (const auto* const starts : {&pairing.discardedStarts, &pairing.openStarts}) {
            for (const trace_point* const start : *starts) {
                track.spans.push_back(span(start, nullptr));
            }
        }
        for (const trace_point* const stop : pairing.discardedStops) {
            track.spans.push_back(span(nullptr, stop));
        }
    }
    return timeline;
}

void TraceRunner::writeBenchdata() {
    HY_LOG_INFO(HYReportingTraceCategory, "Completed trace....In write perf data.... {}",
                traceResults_.size());
    const platform::Platform& system = platform::current();
    if (const auto error =
            system.files->createDirectories(HYReportingTracingLogsDirectory, kDirectoryMode)) {
        HY_LOG_ERROR(HYReportingTraceCategory, "can't create logging directory at {}: {}",
                     system.files->located(HYReportingTracingLogsDirectory), error->message);
    }
    writer_ = system.resultsFiles->open(std::string(HYReportingTracingLogsDirectory) + '/' +
                                            resultsFileName_,
                                        writerName_, resultsVersion_);
    if (writer_ == nullptr) {
        // Kept: whoever waits for the file of a test run must not wait for ever.
        HY_LOG_ERROR(HYReportingTraceCategory, "Failed to open benchdata writer");
        system.ownProcess->terminate(1);
        return;
    }
    for (const auto& each : traceResults_) {
        printTraceResults(each);
        for (const auto& [name, value] : each.second) {
            writer_->newValue(name, platform::ResultsUnit::Nanoseconds, static_cast<double>(value));
        }
    }
    for (const platform::TraceTimeline& timeline : timelines_) {
        writer_->newTimeline(timeline);
    }
    writer_->close();
}

void TraceRunner::printTraceResults(const std::pair<Trace*, Trace::Results>& results) {
    const Trace::Results& values = results.second;
    const auto byValue = [](const auto& left, const auto& right) {
        return left.second < right.second;
    };
    for (auto first = values.begin(); first != values.end();) {
        const auto last = values.upper_bound(first->first);
        const auto [least, most] = std::minmax_element(first, last, byValue);
        HY_LOG_INFO(HYReportingTraceCategory, "Writing out {} result for {}, min: {}, max: {} ",
                    std::distance(first, last), first->first, least->second, most->second);
        first = last;
    }
}

} // namespace halyard
