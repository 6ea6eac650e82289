// What driver statistics cost on this machine: a snapshot of every built-in
// channel, a report since one, and what a snapshot takes in memory.

#include <benchmark/benchmark.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "linux/drivers/LinuxHWReport.h"
#include "linux/system/LinuxFacts.h"
#include "testing/TempTree.h"

namespace {

using namespace halyard;

// Every channel there is, subscribed to at once.
struct Statistics {
    Statistics() : library(clock, {}, {}) {
        const auto all = library.copyChannelsInGroup(std::nullopt, std::nullopt);
        channels = library.getChannelCount(*all.value);
        subscribed = library.createSubscription(*all.value);
    }
    platform::HWReportSamplesRef sample() {
        return library.createSamples(subscribed.subscription, subscribed.channels.get()).value;
    }

    linux_::SystemClock clock;
    linux_::LinuxHWReport library;
    std::int64_t channels = 0;
    platform::HWReportSubscribed subscribed;
};

void snapshot(benchmark::State& state) {
    Statistics statistics;
    platform::HWReportSamplesRef samples;
    for (auto _ : state) {
        samples = statistics.sample();
        benchmark::DoNotOptimize(samples);
    }
    const auto& set = dynamic_cast<const linux_::SampleSet&>(*samples);
    state.counters["channels"] = static_cast<double>(statistics.channels);
    state.counters["bytes"] = static_cast<double>(set.footprint());
}
BENCHMARK(snapshot);

void delta(benchmark::State& state) {
    Statistics statistics;
    const auto before = statistics.sample();
    const auto after = statistics.sample();
    for (auto _ : state) {
        std::int64_t sum = 0;
        const auto change = statistics.library.createSamplesDelta(before.get(), *after).value;
        statistics.library.iterate(*change, [&](const platform::HWReportChannel& channel) {
            sum += channel.value + static_cast<std::int64_t>(channel.states.size());
            return 0;
        });
        benchmark::DoNotOptimize(sum);
    }
}
BENCHMARK(delta);

// The first look at the machine, once at the start of the service.
void discovery(benchmark::State& state) {
    for (auto _ : state) {
        Statistics statistics;
        benchmark::DoNotOptimize(statistics.channels);
    }
}
BENCHMARK(discovery);

// Eight devices of each direction whose cycles are counted, among as many files as
// the argument says that somebody else has left there.
void cycles(benchmark::State& state) {
    const testing::TempTree tree("/dev/shm");
    const auto flood = [&] {
        for (std::int64_t i = 0; i < state.range(0); ++i) {
            std::filesystem::create_symlink("nowhere",
                                            tree / ("out-" + std::to_string(i) + ".counts"));
        }
    };
    std::string histogram;
    for (int i = 0; i < 44; ++i) {
        histogram += std::to_string(i) + " " + std::to_string(i + 1) + " 12345678\n";
    }
    for (int i = 0; i < 16; ++i) {
        const std::string stem = (i % 2 == 0 ? "in-device" : "out-device") + std::to_string(i);
        for (const char* part : {".wait", ".busy", ".cycle"}) {
            tree.write(stem + part, histogram);
        }
        tree.write(stem + ".counts", "direction sink\ncycles 12345678\nmissed 12\n");
    }
    linux_::SystemClock clock;
    linux_::LinuxHWReport library(
        clock, {}, {"/nonexistent", {}, tree.path(), [](std::uint32_t) { return true; }});
    const auto all = library.copyChannelsInGroup(std::nullopt, std::nullopt);
    const auto subscribed = library.createSubscription(*all.value);
    const auto sample = [&] {
        return library.createSamples(subscribed.subscription, subscribed.channels.get()).value;
    };
    platform::HWReportSamplesRef samples = sample();
    flood();
    for (auto _ : state) {
        samples = sample();
        benchmark::DoNotOptimize(samples);
    }
    state.counters["bytes"] =
        static_cast<double>(dynamic_cast<const linux_::SampleSet&>(*samples).footprint());
}
BENCHMARK(cycles)->Arg(0)->Arg(100'000);

} // namespace
