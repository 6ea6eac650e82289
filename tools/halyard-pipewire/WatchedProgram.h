// A process that plays or records, shared by its streams, and what was seen of its
// thread in the graph.
//
// Not thread-safe.
#pragma once

#include <utility>

#include "History.h"
#include "ProcessReader.h"
#include "Samples.h"

namespace halyard::pipewire {

class WatchedProgram final {
public:
    explicit WatchedProgram(ProcessReader reader) : reader_(std::move(reader)) {}

    // Streams that run.
    void streamRuns() { ++streams_; }
    void streamStopped() { --streams_; }
    bool runs() const { return streams_ > 0; }

    void sample(Nanoseconds now) { history_.add(reader_.sample(now)); }
    // The thread of a program that just started to play is found by watching its
    // threads for a while. `cycleLength`: of one of its streams, 0 while unknown.
    void seek(Nanoseconds now, Nanoseconds cycleLength);

    const History<ThreadSample>& history() const { return history_; }
    ProcessReader::Ending ending() const { return reader_.ending(); }

private:
    ProcessReader reader_;
    History<ThreadSample> history_;
    int streams_ = 0;
    int tries_ = 0;
    Nanoseconds searchedSince_ = 0;
};

} // namespace halyard::pipewire
