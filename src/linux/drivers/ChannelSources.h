// The kinds of source: counters, states and histograms over the files that the
// kernel or an operator keeps them in.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "linux/drivers/ChannelSource.h"
#include "linux/drivers/SourceText.h"

namespace halyard::linux_ {

// A number that only ever rises, out of one file.
class CounterSource final : public ChannelSource {
public:
    using Parse = std::function<std::optional<std::int64_t>(std::string_view)>;

    CounterSource(SampledFile file, Parse parse)
        : file_(std::move(file)), parse_(std::move(parse)) {}
    Reading read(platform::SteadyTime now) override;

private:
    SampledFile file_;
    const Parse parse_;
};

// The interrupts of an action, over all lines and processors.
class InterruptSource final : public ChannelSource {
public:
    // Counts the lines in /sys/kernel/irq one of whose actions is `action`.
    InterruptSource(const std::string& action, SourceRoot& root);
    Reading read(platform::SteadyTime now) override;

private:
    std::vector<SampledFile> counts_;
};

// The idle states of one processor; µs.
class CpuIdleSource final : public ChannelSource {
public:
    CpuIdleSource(std::filesystem::path directory, SourceRoot& root)
        : directory_(std::move(directory)), root_(root) {}
    Reading read(platform::SteadyTime now) override;

private:
    struct State {
        SampledFile time;
        SampledFile usage;
        std::size_t place; // of its residency in a reading
    };
    // False when there are none.
    bool findStates();

    const std::filesystem::path directory_;
    SourceRoot& root_;
    ReadingShapeRef shape_;
    std::vector<State> states_;
};

// The power states of a device; ms, and no transitions.
class RuntimePowerSource final : public ChannelSource {
public:
    // The device's directory or its "power" directory.
    RuntimePowerSource(const std::filesystem::path& directory, SourceRoot& root);
    Reading read(platform::SteadyTime now) override;

private:
    SampledFile active_;
    SampledFile suspended_;
    const ReadingShapeRef shape_;
};

// States out of one file, ms, and their transitions out of another where that is
// there.
class StateTableSource final : public ChannelSource {
public:
    using Parse = std::optional<SourceStates> (*)(std::string_view);

    StateTableSource(SampledFile file, Parse parse) : file_(std::move(file)), parse_(parse) {}
    void setTransitions(SampledFile file) { transitions_.emplace(std::move(file)); }
    Reading read(platform::SteadyTime now) override;

private:
    void addTransitions(SourceStates& states);

    SampledFile file_;
    const Parse parse_;
    std::optional<SampledFile> transitions_;
    ReadingShapeRef shape_;
};

// Buckets out of one file.
class BucketSource final : public ChannelSource {
public:
    using Parse = std::optional<SourceBuckets> (*)(std::string_view);

    BucketSource(SampledFile file, Parse parse) : file_(std::move(file)), parse_(parse) {}
    Reading read(platform::SteadyTime now) override;

private:
    SampledFile file_;
    const Parse parse_;
    ReadingShapeRef shape_;
};

// What a PCM stream can be seen doing. ALSA keeps its state but no history, so
// the history is made of what each read sees: a state lasts from the read that
// saw it, or from the stream's own trigger time, to the next read, and frames add
// up over closing and starting again. It ends with the device.
class PcmSource final : public ChannelSource {
public:
    enum class What {
        Frames,   // that the hardware has passed
        Xruns,    // reads that found the stream in an xrun it was not in before
        Restarts, // times that its owner has triggered it again
        States,   // residency, µs
    };

    PcmSource(SampledFile status, What what);
    Reading read(platform::SteadyTime now) override;

private:
    // Since the device is there.
    struct Seen {
        std::uint64_t frames = 0;
        std::uint64_t xruns = 0;
        std::uint64_t restarts = 0;
        std::vector<std::uint64_t> residencies; // as in a reading
    };
    // Requires that `status` is the next after `last_`.
    void advance(const PcmStatus& status, platform::SteadyTime now);
    void addResidency(const PcmStatus& status, bool restarted, platform::SteadyTime now);
    std::uint64_t framesSinceLast(const PcmStatus& status) const;

    SampledFile file_;
    const What what_;
    const ReadingShapeRef shape_;
    std::optional<PcmStatus> last_;
    platform::SteadyTime lastTime_;
    Seen seen_;
};

} // namespace halyard::linux_
