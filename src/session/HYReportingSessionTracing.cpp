// The performance traces of a session of type test.

#include "session/HYReportingSession.h"

#include <utility>

#include "platform/Device.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "tracing/TraceRunner.h"

namespace halyard {
namespace {

// The only template that sessions ask for.
constexpr int kTraceTemplate = 1;

// The kind counts as "evtap" only when it is this very constant. What clients
// send is another object, whatever it spells, and so is what they configure: no
// value that is present ever matches.
bool isEvtapConstant(const Value& kind) {
    return kind.text().data() == HYReportingTraceTypeEvtap;
}

} // namespace

bool HYReportingSession::tracesPerformance() const {
    return platform::current().featureFlags->isEnabled("AudioAnalytics", "Tracing") &&
           serviceType() == kAudioServiceTypeTest;
}

std::optional<std::string> HYReportingSession::tracingFileName() const {
    const MutexLock lock(stateMutex_);
    return tracingFileName_;
}

std::string HYReportingSession::getPSTraceFileURL() const {
    const MutexLock lock(stateMutex_);
    return finalTraceURL_;
}

std::shared_ptr<platform::PerformanceTraceSession> HYReportingSession::traceSession() const {
    const MutexLock lock(stateMutex_);
    return traceSession_;
}

void HYReportingSession::dropTraceSession() {
    std::shared_ptr<platform::PerformanceTraceSession> dropped; // Freed after the lock.
    const MutexLock lock(stateMutex_);
    dropped.swap(traceSession_);
}

void HYReportingSession::startTracing() {
    if (startedTracing_.load() || !tracesPerformance()) {
        return;
    }
    const Dictionary configured = configuration();
    const Value& kind = configured[HYReportingTraceType];
    const Value& path = configured[HYReportingLoomisPlistFilePath];
    if ((!kind.isNone() && !isEvtapConstant(kind)) || path.isNone()) {
        startPerformanceTrace();
        return;
    }
    const std::string fileName = describe(path);
    HY_LOG_DEBUG(HYReportingTraceCategory, "Got the tracefile {}, setting up trace", fileName);
    setupTracing(&fileName);
    if (tracingFileName()) {
        startedTracing_.store(true);
        traceRunner_->runTraces();
    }
}

void HYReportingSession::setupTracing(const std::string* fileName) {
    if (fileName == nullptr) {
        HY_LOG_ERROR(HYReportingTraceCategory, "TracefileName empty. Failed to setup tracing");
        return;
    }
    {
        const MutexLock lock(stateMutex_);
        tracingFileName_ = *fileName;
    }
    traceParams_ = std::make_unique<TraceParams>(TraceParamsParser(*fileName).loadTraceParams());
    traceRunner_ = std::make_unique<TraceRunner>();
    traceRunner_->createTraceFromTraceParams(traceParams_.get());
    startedTracing_.store(false);
    HY_LOG_INFO(HYReportingTraceCategory, "Setting up tracing for {}", serviceName());
}

void HYReportingSession::startPerformanceTrace() {
    const auto config = platform::PerformanceTraceConfig::configWithTemplate(kTraceTemplate);
    // Held here: a start that fails drops it from the session.
    const auto traceSession = platform::current().performanceTraces->initWithConfig(config);
    {
        const MutexLock lock(stateMutex_);
        traceConfig_ = config;
        traceSession_ = traceSession;
    }
    traceSession->setDelegate(weak_from_this());
    startedTracing_.store(true);
    traceSession->startPerformanceTrace();
}

void HYReportingSession::stopTracing() {
    if (!startedTracing_.load() || !tracesPerformance()) {
        return;
    }
    startedTracing_.store(false);
    setStopWaitsSince(platform::current().clock->steadyTime());
    waitForTrace();
    setStopWaitsSince(std::nullopt);
}

void HYReportingSession::waitForTrace() {
    if (tracingFileName()) {
        stopEventTrace();
        return;
    }
    if (const auto running = traceSession()) {
        running->stopPerformanceTrace();
    }
    mTraceDispatchSemaphore_.wait();
}

// The name of the file stays when its trace has ended, the runner does not: it
// holds every event that was recorded. A performance trace that the session
// takes later thus has nobody to stop it, and runs until the session goes.
void HYReportingSession::stopEventTrace() {
    if (traceRunner_ != nullptr) {
        traceRunner_->stopTracingandProcessResults();
    }
    traceRunner_.reset();
    traceParams_.reset();
}

std::optional<platform::SteadyTime> HYReportingSession::stopWaitsSince() const {
    const MutexLock lock(stateMutex_);
    return stopWaitsSince_;
}

void HYReportingSession::setStopWaitsSince(std::optional<platform::SteadyTime> since) {
    const MutexLock lock(stateMutex_);
    stopWaitsSince_ = since;
}

void HYReportingSession::performanceTraceDidStart(const MaybeError& error) {
    HY_LOG_DEFAULT(HYReportingPlatformCategory, "started performance trace.");
    if (!error) {
        HY_LOG_INFO(HYReportingTraceCategory, "Performance Trace Started");
        return;
    }
    dropTraceSession();
    {
        const MutexLock lock(stateMutex_);
        traceConfig_.reset();
    }
    HY_LOG_ERROR(HYReportingTraceCategory, "performanceTraceDidStart {}", error->message);
}

void HYReportingSession::performanceTraceDidStop(const MaybeError& error) {
    if (!error) {
        HY_LOG_INFO(HYReportingTraceCategory, "Performance Trace Stopped");
        return;
    }
    dropTraceSession();
    HY_LOG_ERROR(HYReportingTraceCategory, "performanceTraceDidStop {}", error->message);
}

void HYReportingSession::performanceTraceDidComplete(std::string_view traceURL,
                                                     std::string_view /*token*/,
                                                     const MaybeError& error) {
    if (const auto completed = traceSession()) {
        completed->setDelegate({});
    }
    dropTraceSession();
    mTraceDispatchSemaphore_.signal();
    if (error) {
        HY_LOG_ERROR(HYReportingTraceCategory, "performanceTraceDidComplete {}", error->message);
        return;
    }
    {
        const MutexLock lock(stateMutex_);
        finalTraceURL_ = traceURL;
    }
    HY_LOG_INFO(HYReportingTraceCategory, "Performance Trace Completed: {}", traceURL);
}

} // namespace halyard
