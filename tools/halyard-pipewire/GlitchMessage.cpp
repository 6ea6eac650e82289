#include "GlitchMessage.h"

#include "halyard/halyard.h"

namespace halyard::pipewire {

namespace {

// The two clocks are read one after the other.
constexpr Nanoseconds kLeastSleep = 1'000'000;

void addSeconds(Contents& to, const char* key, const std::optional<Nanoseconds>& time) {
    if (time.value_or(0) > 0) {
        to.add(key, seconds(*time));
    }
}

} // namespace

double seconds(Nanoseconds time) {
    return static_cast<double>(time) / 1e9;
}

Contents contentsOf(const GlitchEvidence& evidence) {
    Contents result;
    if (evidence.state != 0) {
        result.add("process_state", std::string(1, evidence.state));
    }
    if (evidence.threadBefore && evidence.threadAfter) {
        const ThreadSample& from = *evidence.threadBefore;
        const ThreadSample& to = *evidence.threadAfter;
        addSeconds(result, "run_delay_seconds", growth(from.delay, to.delay));
        addSeconds(result, "cpu_seconds", growth(from.cpu, to.cpu));
        if (const auto faults = growth(from.majorFaults, to.majorFaults); faults.value_or(0) > 0) {
            result.add("major_faults", static_cast<std::int64_t>(*faults));
        }
        addSeconds(result, "io_delay_seconds", growth(from.ioDelay, to.ioDelay));
    }
    if (evidence.machineBefore && evidence.machineAfter) {
        const MachineSample& from = *evidence.machineBefore;
        const MachineSample& to = *evidence.machineAfter;
        addSeconds(result, "pressure_cpu_seconds", growth(from.cpuPressure, to.cpuPressure));
        addSeconds(result, "pressure_memory_seconds",
                   growth(from.memoryPressure, to.memoryPressure));
        addSeconds(result, "pressure_io_seconds", growth(from.ioPressure, to.ioPressure));
        if (to.asleep - from.asleep >= kLeastSleep) {
            result.add("asleep_seconds", seconds(to.asleep - from.asleep));
        }
    }
    if (evidence.busyCycles > 0) {
        result.add("busy_cycles", evidence.busyCycles);
    }
    if (evidence.driverLateSeconds > 0) {
        result.add("driver_late_seconds", evidence.driverLateSeconds);
    }
    if (evidence.waitedForOthers) {
        result.add("waited_for_others", std::int64_t{1});
    }
    if (!evidence.busiest.empty()) {
        result.add("busiest", evidence.busiest);
    }
    return result;
}

Message messageOf(const Episode& episode, const GlitchMessage& glitch, Direction direction,
                  Nanoseconds realTimeOffset) {
    Contents contents{{"issue_type", std::string(nameOf(glitch.cause))},
                      {"rtaid_client", glitch.application},
                      {"node", glitch.node},
                      {"any_channel_silence_seconds", seconds(episode.missing)},
                      {"glitch_start", seconds(episode.start + realTimeOffset)},
                      {"glitch_cycles", static_cast<std::int64_t>(episode.cycles)}};
    if (!glitch.device.empty()) {
        contents.add("glitch_device", glitch.device);
    }
    contents.add("glitch_quantum_seconds", seconds(episode.cycleLength));
    if (episode.inferred) {
        contents.add("glitch_inferred", std::int64_t{1});
    }
    if (!glitch.evidence.empty()) {
        contents.add("glitch_evidence", Nested{{glitch.evidence}});
    }
    if (glitch.unreported != 0) {
        contents.add("glitches_unreported", static_cast<std::int64_t>(glitch.unreported));
    }
    const std::uint32_t category =
        direction == Direction::Playback ? HALYARD_CATEGORY_PLAYBACK : HALYARD_CATEGORY_RECORD;
    return {category, HALYARD_TYPE_ISSUE_DETECTOR, contents};
}

} // namespace halyard::pipewire
