#include "GlitchInquiry.h"

#include <algorithm>
#include <utility>

namespace halyard::pipewire {

namespace {

// Between two looks.
constexpr Nanoseconds kTick = 50'000'000;

} // namespace

GlitchInquiry::GlitchInquiry(Nanoseconds start, std::shared_ptr<const WatchedProgram> program,
                             bool viaServer, const History<MachineSample>& machine)
    : machine_(machine), program_(std::move(program)), viaServer_(viaServer), foldedUntil_(start) {
    if (const auto* const before = machine_.before(start); before && before->at <= start) {
        machineBefore_ = *before;
    }
    if (program_ == nullptr) {
        return;
    }
    if (const auto* const before = program_->history().before(start);
        before && before->at <= start) {
        threadBefore_ = *before;
        usual_ = usualRates(program_->history(), before->at);
    }
}

// Before the samples of a long episode are gone.
void GlitchInquiry::fold(Nanoseconds until) {
    if (until <= foldedUntil_) {
        return;
    }
    if (program_ != nullptr) {
        program_->history().each(foldedUntil_, until, [&](const ThreadSample& sample) {
            stopped_ = stopped_ || isStopped(sample);
            frozen_ = frozen_ || sample.frozen;
            if (state_ == 0 || isStopped(sample)) {
                state_ = sample.state;
            }
        });
    }
    const MachineSample* last = nullptr;
    machine_.each(foldedUntil_ - 2 * kTick, until + 2 * kTick, [&](const MachineSample& sample) {
        if (last != nullptr) {
            const Nanoseconds waited = growth(last->ownDelay, sample.ownDelay).value_or(0);
            stoodStill_ = std::max(stoodStill_, sample.at - last->at - kTick - waited);
        }
        last = &sample;
    });
    foldedUntil_ = until;
}

const ThreadSample* GlitchInquiry::threadAfter(const Episode& episode) const {
    return program_ != nullptr ? program_->history().after(episode.end + episode.cycleLength)
                               : nullptr;
}

CauseFacts GlitchInquiry::factsOf(const Episode& episode) const {
    CauseFacts facts;
    facts.cycleSeconds = seconds(episode.cycleLength);
    facts.missingSeconds = seconds(episode.missing);
    facts.heldSeconds = seconds(episode.held);
    facts.lateShare = episode.cycles != 0 ? static_cast<double>(episode.lateCycles) /
                                                static_cast<double>(episode.cycles)
                                          : 0;
    facts.latenessSeconds = seconds(episode.lateness);
    facts.woke = episode.woke;
    facts.ownCycles = episode.busyCycles;
    facts.othersCycles = episode.othersCycles;
    facts.largestOther = episode.largestOther;
    facts.gone = program_ != nullptr && program_->ending().died();
    // What a server missed for a program that was stopped meanwhile is the server's.
    const bool own = !viaServer_ || episode.inferred;
    facts.stopped = stopped_ && own;
    facts.frozen = frozen_ && own;
    facts.stoodStillSeconds = seconds(stoodStill_);
    if (const auto* const after = machine_.after(episode.end); after && machineBefore_) {
        facts.asleepSeconds = seconds(after->asleep - machineBefore_->asleep);
    }
    // The figures of a program behind a server say nothing of the server's work.
    const ThreadSample* const after = threadAfter(episode);
    if (after != nullptr && threadBefore_ && !viaServer_) {
        facts.thread = excessOf(usual_, *threadBefore_, *after);
    }
    return facts;
}

GlitchEvidence GlitchInquiry::evidenceOf(const Episode& episode) const {
    GlitchEvidence evidence{.state = state_,
                            .machineBefore = machineBefore_,
                            .busyCycles = episode.busyCycles,
                            .driverLateSeconds = seconds(episode.lateness),
                            .waitedForOthers = episode.waitedForOthers};
    if (const auto* const after = machine_.after(episode.end)) {
        evidence.machineAfter = *after;
    }
    if (const auto* const after = threadAfter(episode); after && !viaServer_) {
        evidence.threadBefore = threadBefore_;
        evidence.threadAfter = *after;
    }
    return evidence;
}

} // namespace halyard::pipewire
