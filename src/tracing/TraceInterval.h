// Measures the time from a start event to the stop event that follows it.
#pragma once

#include "tracing/EventPairing.h"
#include "tracing/TraceData.h"

namespace halyard {

class TraceInterval : public TraceData {
public:
    // With `singleThread`, a stop ends only what its own thread started.
    TraceInterval(const std::string& name, std::uint32_t startEventCode,
                  std::uint32_t stopEventCode, bool singleThread)
        : TraceData(name), startEventCode_(startEventCode), stopEventCode_(stopEventCode),
          singleThread_(singleThread) {}

    void processTracepoints(platform::EventTraceSession* session,
                            const std::vector<trace_point>& points) override;
    virtual void processTracepointsSingleThread(platform::EventTraceSession* session,
                                                const std::vector<trace_point>& points);
    virtual void processTracepointsAnyThread(platform::EventTraceSession* session,
                                             const std::vector<trace_point>& points);

    // What processTracepoints measures in `points`; points into them.
    EventPairing pairing(const std::vector<trace_point>& points) const;

private:
    void addResults(platform::EventTraceSession& session, const EventPairing& pairing);

    const std::uint32_t startEventCode_;
    const std::uint32_t stopEventCode_;
    const bool singleThread_;
};

} // namespace halyard
