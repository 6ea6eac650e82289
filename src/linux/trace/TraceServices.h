// Both kinds of trace and the files of their results, as the platform offers them.
//
// Made and offered on one thread; the pieces may be used from any.
#pragma once

#include <cstdint>
#include <functional>
#include <utility>
#include <vector>

#include "linux/system/Directories.h"
#include "linux/trace/BenchmarkResultsWriter.h"
#include "linux/trace/TraceCmdRecorder.h"
#include "linux/trace/TracefsEventTrace.h"
#include "platform/Platform.h"

namespace halyard::linux_ {

struct TraceServices {
    // Borrows the clock. `clients` are the processes whose marks count, beside our own.
    TraceServices(const Directories& directories, const platform::Clock& clock,
                  std::function<std::vector<std::int32_t>()> clients)
        : resultsFiles(directories, clock), performanceTraces({directories.logs / "Traces"}),
          eventTrace(TracefsEventTrace::Options{kTracefs, std::move(clients)}) {}

    void offerTo(platform::Platform& platform) {
        platform.resultsFiles = &resultsFiles;
        platform.performanceTraces = &performanceTraces;
        platform.eventTrace = &eventTrace;
    }

    BenchmarkResultsFiles resultsFiles;
    TraceCmdRecorder performanceTraces;
    TracefsEventTrace eventTrace;
};

} // namespace halyard::linux_
