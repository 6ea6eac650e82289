// What was measured around one open episode, so that its cause can be told when it
// is over: the samples of before are gone by then.
//
// Not thread-safe.
#pragma once

#include <memory>
#include <optional>

#include "GlitchCause.h"
#include "GlitchFinder.h"
#include "GlitchMessage.h"
#include "History.h"
#include "Samples.h"
#include "WatchedProgram.h"

namespace halyard::pipewire {

class GlitchInquiry final {
public:
    // Borrows `machine`. `program` may be null; `viaServer`: its threads are not
    // those that work in the graph.
    GlitchInquiry(Nanoseconds start, std::shared_ptr<const WatchedProgram> program, bool viaServer,
                  const History<MachineSample>& machine);

    // Takes what was seen until then.
    void fold(Nanoseconds until);

    // What the threads of others ran has to be added.
    CauseFacts factsOf(const Episode& episode) const;
    GlitchEvidence evidenceOf(const Episode& episode) const;

private:
    const ThreadSample* threadAfter(const Episode& episode) const;

    const History<MachineSample>& machine_;
    std::shared_ptr<const WatchedProgram> program_;
    const bool viaServer_;
    std::optional<ThreadSample> threadBefore_;
    std::optional<MachineSample> machineBefore_;
    UsualRates usual_;
    Nanoseconds foldedUntil_;
    bool stopped_ = false;
    bool frozen_ = false;
    char state_ = 0;
    Nanoseconds stoodStill_ = 0;
};

} // namespace halyard::pipewire
