// Performance traces of the whole system, which a framework takes and keeps.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "common/Error.h"

namespace halyard::platform {

struct PerformanceTraceConfig {
    // What to record is the framework's to know.
    static PerformanceTraceConfig configWithTemplate(int number) { return {number}; }

    int templateNumber = 0;
};

// Called on any thread of the framework. After a start, however it goes,
// performanceTraceDidComplete is called once.
class PerformanceTraceDelegate {
public:
    virtual ~PerformanceTraceDelegate() = default;
    virtual void performanceTraceDidStart(const MaybeError& error) = 0;
    virtual void performanceTraceDidStop(const MaybeError& error) = 0;
    virtual void performanceTraceDidComplete(std::string_view traceURL, std::string_view token,
                                             const MaybeError& error) = 0;
};

// One trace. Destroying it while it runs gives the trace up. Any thread.
class PerformanceTraceSession {
public:
    virtual ~PerformanceTraceSession() = default;
    // Null for none. Calls that are under way may still end.
    virtual void setDelegate(std::weak_ptr<PerformanceTraceDelegate> delegate) = 0;
    virtual void startPerformanceTrace() = 0;
    virtual void stopPerformanceTrace() = 0;
};

class PerformanceTraces {
public:
    virtual ~PerformanceTraces() = default;
    virtual std::shared_ptr<PerformanceTraceSession>
    initWithConfig(const PerformanceTraceConfig& config) = 0;
};

} // namespace halyard::platform
