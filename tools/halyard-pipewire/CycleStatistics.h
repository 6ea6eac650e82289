// How the cycles of devices went: how many there were, how many were missed, and
// how long they waited, worked and took.
//
// Only ever counts up, so that readers can subtract two looks; and of times only
// the bucket is kept that each fell into, so that a device takes a KiB however
// long it runs. Pure; one thread.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace halyard::pipewire {

class CycleHistogram {
public:
    // In microseconds, from each to below the next; longer times are in the last.
    static constexpr std::int64_t kBounds[] = {0,         1,         2,          3,
                                               5,         7,         10,         15,
                                               20,        30,        50,         70,
                                               100,       150,       200,        300,
                                               500,       700,       1'000,      1'500,
                                               2'000,     3'000,     5'000,      7'000,
                                               10'000,    15'000,    20'000,     30'000,
                                               50'000,    70'000,    100'000,    150'000,
                                               200'000,   300'000,   500'000,    700'000,
                                               1'000'000, 1'500'000, 2'000'000,  3'000'000,
                                               5'000'000, 7'000'000, 10'000'000, 1'000'000'000};
    static constexpr std::size_t kBuckets = std::size(kBounds) - 1;
    static_assert(kBuckets <= 64);

    // A time that is no number or negative was not measured, and is left out.
    void add(double seconds) noexcept;
    // A line "LOWER UPPER HITS" for each bucket.
    std::string text() const;

private:
    std::array<std::uint64_t, kBuckets> hits_{};
};

struct DeviceCycles {
    std::string device; // the name of its node
    bool isSink = false;
    std::uint64_t cycles = 0;
    std::uint64_t missed = 0; // of them
    CycleHistogram wait;
    CycleHistogram busy;
    CycleHistogram cycle;

    // Lines "KEY VALUE": direction (sink or source), cycles, missed.
    std::string countsText() const;
};

class CycleStatistics {
public:
    static constexpr std::size_t kMaxDevices = 32;

    struct Cycle {
        double waitSeconds = 0;
        double busySeconds = 0;
        double cycleSeconds = 0;
        bool missed = false;
    };

    // Counts one cycle of the device. Of more than kMaxDevices, and of one without
    // a name, it is ignored.
    void add(std::string_view device, bool isSink, const Cycle& cycle);
    // Makes the device's counts begin anew. Requires place < devices().size().
    void restart(std::size_t place);

    // In the order in which they came; none ever goes.
    const std::vector<DeviceCycles>& devices() const { return devices_; }
    std::uint64_t ignoredCycles() const { return ignored_; }

private:
    DeviceCycles* find(std::string_view device, bool isSink);

    std::vector<DeviceCycles> devices_;
    std::uint64_t ignored_ = 0;
};

} // namespace halyard::pipewire
