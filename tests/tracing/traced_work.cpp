// A program that times what it does to sounds while a session of its own has it
// traced. Several threads decode two voices each and mix them ("render"); blocks
// go to another thread, which adds them to what has been played ("handover").
// Prints a line "ITEM NANOSECONDS" for each stretch that it timed.
//
// usage: traced_work SOCKET TRACE-PARAMETER-FILE

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <thread>
#include <vector>

#include "Sound.h"
#include "halyard/halyard.h"

namespace {

using namespace halyard::tracing_test;

constexpr std::uint32_t kRender = 0x21040010; // the stop is one more
constexpr std::uint32_t kHandover = 0x21040020;
constexpr int kThreads = 4;
constexpr int kTimes = 250;
constexpr std::uint32_t kPatience = 60'000; // ms

std::int64_t now() {
    return std::chrono::nanoseconds(std::chrono::steady_clock::now().time_since_epoch()).count();
}

class Renderer {
public:
    explicit Renderer(int number)
        : low_(compressedTone(220.0 + number)), high_(compressedTone(660.0 + number)) {}

    // How long it took.
    std::int64_t render(Block& block) {
        evmark_trace(kRender, 0, 0, 0, 0);
        const std::int64_t begin = now();
        block.fill(0);
        low_.decode(voice_);
        mix(voice_, 0.7F, block);
        high_.decode(voice_);
        mix(voice_, 0.3F, block);
        const std::int64_t end = now();
        evmark_trace(kRender + 1, 0, 0, 0, 0);
        return end - begin;
    }

private:
    Voice low_;
    Voice high_;
    Block voice_{};
};

// Begins here, ends on another thread.
std::int64_t handOver(const Block& block, Block& played) {
    evmark_trace(kHandover, 0, 0, 0, 0);
    const std::int64_t begin = now();
    std::int64_t end = 0;
    std::thread([&] {
        mix(block, 0.5F, played);
        end = now();
        evmark_trace(kHandover + 1, 0, 0, 0, 0);
    }).join();
    return end - begin;
}

void measure() {
    std::vector<std::int64_t> rendered[kThreads];
    std::vector<Block> blocks(kThreads);
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
        threads.emplace_back([i, &times = rendered[i], &block = blocks[std::size_t(i)]] {
            Renderer renderer(i);
            for (int time = 0; time < kTimes; ++time) {
                times.push_back(renderer.render(block));
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    for (const auto& times : rendered) {
        for (const std::int64_t time : times) {
            std::printf("render %lld\n", static_cast<long long>(time));
        }
    }
    Block played{};
    for (int i = 0; i < kTimes; ++i) {
        const Block& block = blocks[std::size_t(i % kThreads)];
        std::printf("handover %lld\n", static_cast<long long>(handOver(block, played)));
    }
}

void require(bool holds, const char* what) {
    if (!holds) {
        std::fprintf(stderr, "traced_work: %s\n", what);
        std::exit(1);
    }
}

void answered(void* promise, const halyard_error* error) {
    static_cast<std::promise<bool>*>(promise)->set_value(error == nullptr);
}

} // namespace

int main(int argc, char** argv) {
    require(argc == 3, "usage: traced_work SOCKET TRACE-PARAMETER-FILE");
    halyard_client* const client = halyard_client_create(argv[1]);
    halyard_session* const session = halyard_session_create(client, 0);
    require(session != nullptr, "no session");
    halyard_session_set_service_type(session, HALYARD_SERVICE_TEST);
    halyard_dictionary* const configuration = halyard_dictionary_create(0);
    halyard_dictionary_set_string(configuration, "HYReportingLoomisPlistFilePath", argv[2]);
    halyard_session_set_configuration(session, configuration);
    halyard_dictionary_destroy(configuration);

    // A session of type test that is traced is answered once it runs.
    std::promise<bool> started;
    halyard_session_start(session, answered, &started);
    require(started.get_future().get(), "the session was not started");
    measure();
    // The results are there when the stop is answered.
    std::promise<bool> stopped;
    halyard_session_stop(session, answered, &stopped);
    require(stopped.get_future().get(), "the session was not stopped");
    halyard_session_destroy(session);
    halyard_client_destroy(client, kPatience);
    return 0;
}
