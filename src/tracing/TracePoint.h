// Records one argument of every event of a code.
#pragma once

#include "tracing/TraceData.h"

namespace halyard {

class TracePoint : public TraceData {
public:
    // `argument` is 1 to 4; any other records nothing.
    TracePoint(const std::string& name, std::uint32_t code, std::uint32_t argument)
        : TraceData(name), code_(code), argument_(static_cast<std::int32_t>(argument)) {}

    // Counts no measurements.
    void processTracepoints(platform::EventTraceSession* session,
                            const std::vector<trace_point>& points) override;

private:
    const std::uint32_t code_;
    const std::int32_t argument_;
};

} // namespace halyard
