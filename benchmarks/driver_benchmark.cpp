// What driver statistics cost on this machine: a snapshot of every built-in
// channel, a report since one, and what a snapshot takes in memory.

#include <benchmark/benchmark.h>

#include "linux/drivers/LinuxHWReport.h"
#include "linux/system/LinuxFacts.h"

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

} // namespace
