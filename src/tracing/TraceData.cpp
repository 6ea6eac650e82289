#include "tracing/TraceData.h"

namespace halyard {

float TraceData::getAverageResult() const {
    float sum = 0;
    for (const std::uint64_t result : results_) {
        sum += static_cast<float>(result);
    }
    return sum / static_cast<float>(numTimesTraced_); // Kept: of nothing, not a number.
}

} // namespace halyard
