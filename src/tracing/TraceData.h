// The items of a trace: each turns a batch of kernel trace events into results.
//
// A batch is processed on the runner's tracing queue; the results are read once
// the trace has completed.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/EventTrace.h"

namespace halyard {

class TraceData {
public:
    virtual ~TraceData() = default;
    // Adds the batch's results to those that are there. Borrows both for the
    // call; `session` may be null for an empty batch.
    virtual void processTracepoints(platform::EventTraceSession* session,
                                    const std::vector<trace_point>& points) = 0;

    const std::string& name() const { return name_; }
    bool hasResults() const { return !results_.empty(); }
    std::vector<std::uint64_t> getResults() const { return results_; }
    std::uint32_t getNumTimesTraced() const { return numTimesTraced_; }
    // Summed up in single precision; not a number when nothing was counted.
    float getAverageResult() const;

protected:
    explicit TraceData(std::string name) : name_(std::move(name)) {}

    void addResult(std::uint64_t value) { results_.push_back(value); }
    void countMeasurement() { ++numTimesTraced_; }

private:
    std::string name_;
    std::vector<std::uint64_t> results_;
    std::uint32_t numTimesTraced_ = 0;
};

} // namespace halyard
