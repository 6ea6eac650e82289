// One named set of measurements that are made of the events of one kernel trace
// session.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tracing/TraceInterval.h"

namespace halyard {

class Trace {
public:
    // By item name; equal names keep the order of insertion.
    using Results = std::multimap<std::string, std::uint64_t>;

    // `flag` is set for traces of kernel events.
    Trace(const std::string& name, bool flag) : name_(name), flag_(flag) {}

    // Borrows the item, for good: nothing ever deletes it.
    void addTraceDataToCollect(TraceInterval* item);
    // Every item sees the whole batch.
    void processTracepoints(platform::EventTraceSession* session,
                            const std::vector<trace_point>& points);
    // Collects the items' results anew each time, so a second call returns them
    // twice.
    Results getResults();

    const std::string& name() const { return name_; }
    bool flag() const { return flag_; }
    const std::vector<TraceInterval*>& children() const { return children_; }

private:
    const std::string name_;
    const bool flag_;
    Results results_;
    std::vector<TraceInterval*> children_;
};

// Takes an item that is to live as long as the process, which is how long the
// items of traces live. Any thread.
TraceInterval* keepForever(std::unique_ptr<TraceInterval> item);

} // namespace halyard
