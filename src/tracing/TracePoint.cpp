#include "tracing/TracePoint.h"

namespace halyard {

void TracePoint::processTracepoints(platform::EventTraceSession* /*session*/,
                                    const std::vector<trace_point>& points) {
    if (argument_ < 1 || argument_ > 4) {
        return;
    }
    for (const trace_point& point : points) {
        if (point.code == code_) {
            const std::uint64_t arguments[] = {point.arg1, point.arg2, point.arg3, point.arg4};
            addResult(arguments[argument_ - 1]);
        }
    }
}

} // namespace halyard
