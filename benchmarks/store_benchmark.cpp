// What one row costs from the caller's hands to the commit: on the caller's
// thread, and in CPU time of the whole process (JSON, INSERT, commit, checkpoint
// and retention included).
#include <benchmark/benchmark.h>
#include <ctime>
#include <functional>
#include <future>
#include <string>

#include "common/Json.h"
#include "linux/store/Store.h"
#include "linux/system/LinuxFacts.h"
#include "testing/TempTree.h"

namespace {

using namespace halyard;
using namespace halyard::linux_;

// 9 keys and about 300 bytes of JSON, as a session hands them over.
Dictionary message() {
    return {{"hyreporting_timestamp", 1700000000.25},
            {"systemuptime_sec", 86400},
            {"processuptime_ms", 123456789},
            {"application_bundle", "com.example.player.music"},
            {"audio_route_description", "Speaker, built in, two channels"},
            {"underrun_frame_counts", List{128, 256, 512, 1024}},
            {"stream_is_spatial", true},
            {"output_format_details",
             Dictionary{{"sample_rate", 48000.0}, {"encoding_name", "linear PCM float"}}},
            {"audiotag", "Playback_Start"}};
}

double processCpuSeconds() {
    timespec time{};
    ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

class BenchmarkStore {
public:
    explicit BenchmarkStore(std::uint64_t maxBytes) {
        StoreOptions options;
        options.path = directory_ / "telemetry.db";
        options.limits.maxBytes = maxBytes;
        store_ = std::make_unique<Store>(std::move(options), clock_);
    }
    BenchmarkStore(const BenchmarkStore&) = delete;
    BenchmarkStore& operator=(const BenchmarkStore&) = delete;

    Store& operator*() { return *store_; }
    void flush() {
        std::promise<void> done;
        store_->flush([&done] { done.set_value(); });
        done.get_future().wait();
    }

private:
    SystemClock clock_;
    testing::TempTree directory_;
    std::unique_ptr<Store> store_;
};

// Adds rows, each with a payload of its own, and waits until they are on disk.
void writeRows(benchmark::State& state, std::uint64_t maxBytes,
               const std::function<void(Store&, const StoreUploadPtr&, const Dictionary&)>& add) {
    constexpr int kRows = 32 * 1024;
    BenchmarkStore store(maxBytes);
    const auto upload = (*store).openUpload(1, {}, {});
    const Dictionary payload = message();
    double cpu = 0;
    for (auto _ : state) {
        const double before = processCpuSeconds();
        for (int i = 0; i < kRows; ++i) {
            add(*store, upload, payload);
        }
        store.flush();
        cpu += processCpuSeconds() - before;
    }
    const auto rows = static_cast<double>(state.iterations()) * kRows;
    state.SetItemsProcessed(state.iterations() * kRows);
    state.counters["cpu_ns_per_row"] = cpu / rows * 1e9;
    state.SetLabel(std::to_string(toJson(payload).size()) + " bytes");
}

void addMessage(Store& store, const StoreUploadPtr& upload, const Dictionary& payload) {
    benchmark::DoNotOptimize(store.addMessage(upload, 4, 1, payload));
}

void sessionMessages(benchmark::State& state) {
    writeRows(state, 4ULL << 30, addMessage);
}
BENCHMARK(sessionMessages)->UseRealTime()->Unit(benchmark::kMillisecond)->Iterations(8);

// The store is full: as many rows go as come.
void sessionMessagesIntoAFullStore(benchmark::State& state) {
    writeRows(state, 16ULL << 20, addMessage);
}
BENCHMARK(sessionMessagesIntoAFullStore)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond)
    ->Iterations(8);

void singleMessages(benchmark::State& state) {
    const Dictionary info{{"kRelayReportingSessionInfoClientType", 19},
                          {"kRelayReportingSessionInfoClientVersion", 2.1F},
                          {"kRelayReportingSessionInfoSessionID", -1}};
    const Dictionary user{{"kRelayReportingUserInfoClientName", "com.kestrel.halyard"},
                          {"kRelayReportingUserInfoServiceName", "alarms"}};
    writeRows(state, 4ULL << 30,
              [&](Store& store, const StoreUploadPtr&, const Dictionary& payload) {
                  benchmark::DoNotOptimize(store.addSingleMessage(info, user, 4, 1, payload));
              });
}
BENCHMARK(singleMessages)->UseRealTime()->Unit(benchmark::kMillisecond)->Iterations(8);

void analyticsEvents(benchmark::State& state) {
    const Value name("com.kestrel.halyard.Playback.Start");
    writeRows(state, 4ULL << 30,
              [&](Store& store, const StoreUploadPtr&, const Dictionary& payload) {
                  store.addAnalyticsEvent(name, [payload] { return payload; });
              });
}
BENCHMARK(analyticsEvents)->UseRealTime()->Unit(benchmark::kMillisecond)->Iterations(8);

// The part of it that is the JSON text.
void json(benchmark::State& state) {
    const Value payload(message());
    JsonWriter writer;
    for (auto _ : state) {
        benchmark::DoNotOptimize(writer.write(payload));
    }
}
BENCHMARK(json);

} // namespace
