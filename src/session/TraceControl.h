// The performance trace of a session of type test, from its start to its stop: a
// kernel event trace where a parameter file is configured, else a trace that the
// platform's framework takes, which reports back here.
//
// Started, stopped and set up on the service work queue; stopping blocks it until
// the trace is complete. The rest may be called from any thread.
#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "common/Mutex.h"
#include "platform/Clock.h"
#include "platform/PerformanceTrace.h"
#include "platform/Semaphore.h"
#include "sinks/SessionFacts.h"

namespace halyard {

class TraceRunner;
struct TraceParams;

// Configuration keys of performance traces, and the kinds of trace there are.
inline constexpr const char* HYReportingTraceType = "HYReportingTraceType";
inline constexpr const char* HYReportingTraceTypeEvtap = "evtap";
inline constexpr const char* HYReportingTraceTypeArtrace = "artrace";
inline constexpr const char* HYReportingLoomisPlistFilePath = "HYReportingLoomisPlistFilePath";
// Declared for those who configure traces; nothing here reads them.
inline constexpr const char* HYReportingPerfProcesses = "HYReportingPerfProcesses";
inline constexpr const char* HYReportingDelayPerfEndSnapShot = "HYReportingPerfEndDelay";
inline constexpr const char* HYReportingTestName = "HYReportingTestName";

class TraceControl final : public platform::PerformanceTraceDelegate,
                           public std::enable_shared_from_this<TraceControl> {
public:
    // Borrows the session, which owns it; only start, stop and setupTracing look
    // at it.
    explicit TraceControl(const SessionFacts& session);
    ~TraceControl() override;

    // Nothing happens where the feature is off, or for another type of session.
    void start();
    void stop();

    // Reads the trace parameter file and makes the runner of its traces; null is
    // logged and refused.
    void setupTracing(const std::string* fileName) HY_EXCLUDES(mutex_);
    std::optional<std::string> tracingFileName() const HY_EXCLUDES(mutex_);
    bool startedTracing() const { return startedTracing_.load(); }
    // Since when a stop waits for its trace to complete, which has no limit; none
    // while none does.
    std::optional<platform::SteadyTime> stopWaitsSince() const HY_EXCLUDES(mutex_);
    // Where the last performance trace lies; empty before.
    std::string getPSTraceFileURL() const HY_EXCLUDES(mutex_);

    void performanceTraceDidStart(const MaybeError& error) override HY_EXCLUDES(mutex_);
    void performanceTraceDidStop(const MaybeError& error) override HY_EXCLUDES(mutex_);
    void performanceTraceDidComplete(std::string_view traceURL, std::string_view token,
                                     const MaybeError& error) override HY_EXCLUDES(mutex_);

private:
    bool isWanted() const;
    void startPerformanceTrace() HY_EXCLUDES(mutex_);
    void waitForTrace();
    void stopEventTrace();
    void setStopWaitsSince(std::optional<platform::SteadyTime> since) HY_EXCLUDES(mutex_);
    std::shared_ptr<platform::PerformanceTraceSession> traceSession() const HY_EXCLUDES(mutex_);
    void dropTraceSession() HY_EXCLUDES(mutex_);

    const SessionFacts& session_;
    std::atomic<bool> startedTracing_{false};
    platform::Semaphore mTraceDispatchSemaphore_;
    // On the service work queue only; there while an event trace runs.
    std::unique_ptr<TraceParams> traceParams_;
    std::unique_ptr<TraceRunner> traceRunner_;

    mutable Mutex mutex_;
    std::optional<std::string> tracingFileName_ HY_GUARDED_BY(mutex_);
    std::optional<platform::PerformanceTraceConfig> traceConfig_ HY_GUARDED_BY(mutex_);
    std::shared_ptr<platform::PerformanceTraceSession> traceSession_ HY_GUARDED_BY(mutex_);
    std::string finalTraceURL_ HY_GUARDED_BY(mutex_);
    std::optional<platform::SteadyTime> stopWaitsSince_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard
