// A process that plays or records, shared by its streams, and what was seen of its
// thread in the graph.
//
// Not thread-safe.
#pragma once

#include <string>
#include <utility>

#include "History.h"
#include "ProcessReader.h"
#include "Samples.h"

namespace halyard::pipewire {

class WatchedProgram final {
public:
    explicit WatchedProgram(ProcessReader reader) : reader_(std::move(reader)) {}

    // Streams that run. Each begin and end of a run is looked at, so that what it does
    // at once is seen whole.
    void streamRuns(Nanoseconds now);
    void streamStopped(Nanoseconds now);
    bool runs() const { return streams_ > 0; }

    void sample(Nanoseconds now);
    // A thread without a name of its own is found by watching all of them for a while,
    // from the first run on.
    // `cycleLength`: of one of its streams, 0 while unknown.
    void seek(Nanoseconds now, Nanoseconds cycleLength);

    // The thread that works in the graph, as far as is known; empty for none.
    const std::string& thread() const { return reader_.thread(); }
    const History<ThreadSample>& history() const { return history_; }
    ProcessReader::Ending ending() const { return reader_.ending(); }

private:
    ProcessReader reader_;
    History<ThreadSample> history_;
    ThreadSample last_; // the first with the latest totals
    int streams_ = 0;
    int tries_ = 0;
    Nanoseconds searchedSince_ = 0;
};

} // namespace halyard::pipewire
