#include "GlitchCause.h"

#include <algorithm>
#include <cstddef>
#include <vector>

namespace halyard::pipewire {

namespace {

// What explains at least this share of the time that a stream was held up is its
// cause.
constexpr double kMostOf = 0.5;
// A machine that slept for less has not missed a cycle by it.
constexpr double kLeastSleep = 0.005;
// We look every 50 ms: shorter than this, a delay of ours is no measure.
constexpr double kLeastPause = 0.1;
// A thread that had not begun was held up by its program only if it took this long:
// the signal to begin takes its time as well.
constexpr double kLongSilence = 0.01;
constexpr double kSecond = 1e9;

// How far back to look for what is usual.
constexpr Nanoseconds kUsually = 2'000'000'000;

Range spread(std::vector<double>& values) {
    if (values.empty()) {
        return {};
    }
    std::sort(values.begin(), values.end());
    const std::size_t last = values.size() - 1;
    return {values[last / 10], values[last - last / 10]};
}

template <class Number>
double grown(const std::optional<Number>& from, const std::optional<Number>& to, double unit) {
    return static_cast<double>(growth(from, to).value_or(0)) / unit;
}

// The growth of a total beyond what it usually is in `length` seconds.
template <class Number>
std::optional<Range> beyond(const std::optional<Number>& from, const std::optional<Number>& to,
                            const Range& usual, double length, double unit) {
    const auto all = growth(from, to);
    if (!all) {
        return std::nullopt;
    }
    const double value = static_cast<double>(*all) / unit;
    return Range{std::max(0.0, value - usual.most * length),
                 std::max(0.0, value - usual.least * length)};
}

double middle(const std::optional<Range>& range) {
    return range ? (range->least + range->most) / 2 : 0;
}

// The share of a runnable thread's time in which it ran.
double runningShare(const ThreadExcess& thread) {
    const double ready = middle(thread.cpu) + middle(thread.delay);
    return ready > 0 ? middle(thread.cpu) / ready : 1;
}

// In which it neither ran nor waited for a processor, for certain.
double blockedSeconds(const CauseFacts& facts) {
    return facts.heldSeconds - facts.thread.cpu->most - facts.thread.delay->most;
}

bool isOverloaded(const CauseFacts& facts) {
    // What held it up may have been the work of several cycles, one after the other.
    const double each = middle(facts.thread.cpu) / std::max(facts.missingSeconds, 1e-9);
    const double own = std::min(facts.ownCycles * runningShare(facts.thread), each);
    return own + facts.othersCycles > 1 && own < 1 && facts.largestOther < 0.9 &&
           blockedSeconds(facts) < kMostOf * facts.heldSeconds &&
           facts.othersCpuSeconds.value_or(facts.missingSeconds) > 0.3 * facts.missingSeconds;
}

bool wasPaused(const CauseFacts& facts) {
    return facts.asleepSeconds >= kLeastSleep ||
           (facts.lateShare > kMostOf && facts.stoodStillSeconds >= kLeastPause &&
            facts.stoodStillSeconds > 0.8 * facts.latenessSeconds);
}

} // namespace

const char* nameOf(GlitchCause cause) {
    switch (cause) {
    case GlitchCause::ProcessStopped:
        return "process_stopped";
    case GlitchCause::ProcessFrozen:
        return "process_frozen";
    case GlitchCause::ProcessGone:
        return "process_gone";
    case GlitchCause::MachinePaused:
        return "machine_paused";
    case GlitchCause::DriverLate:
        return "driver_late";
    case GlitchCause::GraphOverloaded:
        return "graph_overloaded";
    case GlitchCause::ProcessorWait:
        return "processor_wait";
    case GlitchCause::ClientSlow:
        return "client_slow";
    case GlitchCause::Memory:
        return "memory";
    case GlitchCause::ClientBlocked:
        return "client_blocked";
    case GlitchCause::Unknown:
        break;
    }
    return "unknown";
}

UsualRates usualRates(const History<ThreadSample>& history, Nanoseconds until) {
    std::vector<double> cpu;
    std::vector<double> delay;
    std::vector<double> faults;
    const ThreadSample* last = nullptr;
    history.each(until - kUsually, until, [&](const ThreadSample& sample) {
        if (last != nullptr && sample.at > last->at) {
            const double length = static_cast<double>(sample.at - last->at) / kSecond;
            cpu.push_back(grown(last->cpu, sample.cpu, kSecond) / length);
            delay.push_back(grown(last->delay, sample.delay, kSecond) / length);
            faults.push_back(grown(last->majorFaults, sample.majorFaults, 1) / length);
        }
        last = &sample;
    });
    return {.cpu = spread(cpu), .delay = spread(delay), .majorFaults = spread(faults)};
}

ThreadExcess excessOf(const UsualRates& usual, const ThreadSample& before,
                      const ThreadSample& after) {
    const double length = static_cast<double>(after.at - before.at) / kSecond;
    return {.cpu = beyond(before.cpu, after.cpu, usual.cpu, length, kSecond),
            .delay = beyond(before.delay, after.delay, usual.delay, length, kSecond),
            .majorFaults =
                beyond(before.majorFaults, after.majorFaults, usual.majorFaults, length, 1)};
}

GlitchCause causeOf(const CauseFacts& facts) {
    if (facts.stopped) {
        return GlitchCause::ProcessStopped;
    }
    if (facts.frozen) {
        return GlitchCause::ProcessFrozen;
    }
    if (facts.gone) {
        return GlitchCause::ProcessGone;
    }
    if (wasPaused(facts)) {
        return GlitchCause::MachinePaused;
    }
    if (facts.lateShare >= kMostOf) {
        return GlitchCause::DriverLate;
    }
    if (!facts.thread.cpu || !facts.thread.delay || facts.heldSeconds <= 0) {
        return GlitchCause::Unknown;
    }
    const double most = kMostOf * facts.heldSeconds;
    if (isOverloaded(facts)) {
        return GlitchCause::GraphOverloaded;
    }
    if (facts.thread.delay->least >= most) {
        return GlitchCause::ProcessorWait;
    }
    if (facts.thread.cpu->least >= most) {
        return GlitchCause::ClientSlow;
    }
    if (blockedSeconds(facts) < most || (!facts.woke && facts.heldSeconds < kLongSilence)) {
        return GlitchCause::Unknown;
    }
    const bool faulted = facts.thread.majorFaults && facts.thread.majorFaults->least >= 1;
    return faulted ? GlitchCause::Memory : GlitchCause::ClientBlocked;
}

} // namespace halyard::pipewire
