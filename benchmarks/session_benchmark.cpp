// What a running session's batch costs: accepting a message, a million of them,
// and what is left to do when the session stops. The bytes are those of
// the process, so run one benchmark at a time for them (--benchmark_filter).

#include <benchmark/benchmark.h>

#include <fstream>
#include <memory>
#include <string>

#include "common/KeyTable.h"
#include "protocol/Wire.h"
#include "session/MessageBatch.h"

namespace halyard {
namespace {

constexpr int kMessages = 1'000'000;

// About 300 bytes and eight keys, never a repeat, as it comes off the wire.
std::string frame(int number) {
    protocol::Arguments arguments;
    arguments.dictionary = Dictionary{
        {"VQSessionVolume", 0.25 + number % 3},
        {"VQSessionVolumePlayingState", number % 2},
        {"hyreporting_timestamp", 1700000000.0 + number},
        {"session_selected_format", "F32LE 2ch 48000 Hz interleaved"},
        {"active_devices", List{"out.speaker", "alsa_output.pci-0000_00_1f.3"}},
        {"process", Dictionary{{"name", "a player of music"}, {"pid", 1000 + number % 7}}},
        {"counter", number},
        {"title", "something that changes " + std::to_string(number)}};
    arguments.category = kAudioEventCategoryVolume;
    arguments.type = kAudioEventTypeSetup;
    arguments.reporterIDs = protocol::ReporterIDs{1};
    std::string bytes;
    protocol::appendCall(bytes, std::nullopt, protocol::Method::SendMessage, arguments);
    return bytes;
}

std::size_t residentBytes() {
    std::ifstream statm("/proc/self/statm");
    std::size_t size = 0;
    std::size_t resident = 0;
    statm >> size >> resident;
    return resident * 4096;
}

std::unique_ptr<MessageBatch> filledBatch(bool keepsMessages) {
    auto batch = std::make_unique<MessageBatch>(
        MessageBatch::Options{.keepsMessages = keepsMessages, .minimumPlaytime = 0.5});
    protocol::CallDecoder decoder;
    for (int i = 0; i < kMessages; ++i) {
        const auto call = decoder.decode(frame(i));
        (void)batch->addUnlessRedundant(
            kAudioEventCategoryVolume, kAudioEventTypeSetup,
            HYReportingUtilityAddAudioMessageTag(call->arguments.dictionary,
                                                 kAudioEventCategoryVolume, kAudioEventTypeSetup));
    }
    return batch;
}

// Argument: whether the messages are kept, as internal builds do.
void BM_Fill(benchmark::State& state) {
    for (auto _ : state) {
        const std::size_t before = residentBytes();
        const auto batch = filledBatch(state.range(0) != 0);
        state.counters["bytes/message"] = static_cast<double>(residentBytes() - before) / kMessages;
    }
    state.SetItemsProcessed(state.iterations() * kMessages);
}
BENCHMARK(BM_Fill)->Arg(0)->Arg(1)->Iterations(1)->Unit(benchmark::kMillisecond);

// One message accepted, everything at hand.
void BM_Accept(benchmark::State& state) {
    protocol::CallDecoder decoder;
    std::vector<Dictionary> messages;
    for (int i = 0; i < 1000; ++i) {
        messages.push_back(decoder.decode(frame(i))->arguments.dictionary);
    }
    MessageBatch batch({.keepsMessages = false, .minimumPlaytime = 0.5});
    std::size_t next = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(batch.addUnlessRedundant(
            kAudioEventCategoryVolume, kAudioEventTypeSetup, messages[next++ % messages.size()]));
    }
}
BENCHMARK(BM_Accept);

// What a stop has left to do.
void BM_Stop(benchmark::State& state) {
    auto batch = filledBatch(state.range(0) != 0);
    for (auto _ : state) {
        benchmark::DoNotOptimize(batch->volumeEvents());
        benchmark::DoNotOptimize(batch->takeSummary(kAudioServiceTypeGeneric));
        batch.reset();
    }
    state.SetItemsProcessed(state.iterations() * kMessages);
}
BENCHMARK(BM_Stop)->Arg(0)->Arg(1)->Iterations(1)->Unit(benchmark::kMillisecond);

} // namespace
} // namespace halyard
