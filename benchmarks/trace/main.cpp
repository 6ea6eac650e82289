// What kernel event traces cost those who are traced and the daemon, and what
// they lose: a program marks pairs at a steady rate, from several threads, while
// a daemon of its own traces it; then every mark must be in the results.
//
//     halyard-trace-load [--rate=EVENTS-PER-SECOND] [--seconds=N] DAEMON
//
// Ends with 77 where there is no tracefs to write to, with 1 when marks are
// missing that the daemon did not count as lost.

#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <future>
#include <stdexcept>
#include <string>
#include <thread>
#include <unistd.h>
#include <vector>

#include "halyard/halyard.h"
#include "load/Daemon.h"
#include "trace/Results.h"

namespace halyard::load {
namespace {

using Clock = std::chrono::steady_clock;
using namespace std::chrono_literals;

// Nobody else's, so that whatever runs beside it does not count.
constexpr std::uint32_t kBegin = 0x21040080;
constexpr std::uint32_t kEnd = 0x21040081;
constexpr std::uint32_t kOutOfRange = 0x21050000;
constexpr int kThreads = 4;
constexpr std::uint32_t kPatience = 60'000; // ms
constexpr int kSkipped = 77;
constexpr const char* kTracefs = "/sys/kernel/tracing/uprobe_events";

constexpr const char* kParameters =
    "{ Children = ({ Name = load; TraceType = evtap; Children = ({ Name = pair; Type = Interval;"
    " EvtapCodeBegin = 21040080; EvtapCodeEnd = 21040081; EventsMatchedBy = Thread; }); }); }";

struct Arguments {
    std::uint64_t rate = 100'000;
    std::uint64_t seconds = 20;
    std::string daemon;
};

// A session of type test, traced from its construction to stop().
class TracedSession {
public:
    TracedSession(const std::string& socket, const std::string& parameters)
        : client_(::halyard_client_create(socket.c_str())),
          session_(::halyard_session_create(client_, 0)) {
        ::halyard_session_set_service_type(session_, HALYARD_SERVICE_TEST);
        halyard_dictionary* const configuration = ::halyard_dictionary_create(0);
        ::halyard_dictionary_set_string(configuration, "HYReportingLoomisPlistFilePath",
                                        parameters.c_str());
        ::halyard_session_set_configuration(session_, configuration);
        ::halyard_dictionary_destroy(configuration);
        await(::halyard_session_start, "the start");
    }
    ~TracedSession() {
        ::halyard_session_destroy(session_);
        ::halyard_client_destroy(client_, kPatience);
    }
    TracedSession(const TracedSession&) = delete;
    TracedSession& operator=(const TracedSession&) = delete;

    // Returns when the results are written.
    void stop() { await(::halyard_session_stop, "the stop"); }

private:
    template <class Request> void await(Request request, const char* what) {
        std::promise<bool> done;
        request(
            session_,
            [](void* promise, const halyard_error* error) {
                static_cast<std::promise<bool>*>(promise)->set_value(error == nullptr);
            },
            &done);
        if (!done.get_future().get()) {
            throw std::runtime_error(std::string(what) + " of the session failed");
        }
    }

    halyard_client* const client_;
    halyard_session* const session_;
};

// The time of one mark in this loop, which takes less than a nanosecond itself.
double nanosecondsPerMark(std::uint32_t code, int marks) {
    const auto begin = Clock::now();
    for (int i = 0; i < marks; ++i) {
        ::evmark_trace(code, 0, 0, 0, 0);
    }
    return std::chrono::duration<double, std::nano>(Clock::now() - begin).count() / marks;
}

// Pairs at `rate` events a second, in bursts of a millisecond.
std::uint64_t markSteadily(double rate, std::chrono::seconds duration) {
    const auto begin = Clock::now();
    std::uint64_t events = 0;
    for (auto now = begin; now < begin + duration; now = Clock::now()) {
        const double due = rate * std::chrono::duration<double>(now - begin).count();
        for (; static_cast<double>(events) < due; events += 2) {
            ::evmark_trace(kBegin, events, 0, 0, 0);
            ::evmark_trace(kEnd, events, 0, 0, 0);
        }
        std::this_thread::sleep_for(1ms);
    }
    return events;
}

std::uint64_t markFromThreads(const Arguments& arguments) {
    std::atomic<std::uint64_t> events{0};
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
        threads.emplace_back([&] {
            events += markSteadily(static_cast<double>(arguments.rate) / kThreads,
                                   std::chrono::seconds(arguments.seconds));
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    return events.load();
}

void measureMarks(const Daemon& daemon, const std::string& parameters) {
    constexpr int kUntraced = 20'000'000;
    constexpr int kTraced = 200'000;
    std::printf("a mark, nobody tracing        %8.1f ns\n", nanosecondsPerMark(kBegin, kUntraced));
    TracedSession session(daemon.socketPath(), parameters);
    std::printf("a mark, recorded              %8.0f ns\n", nanosecondsPerMark(kBegin, kTraced));
    std::printf("a mark, filtered out          %8.0f ns\n",
                nanosecondsPerMark(kOutOfRange, kTraced));
    session.stop();
}

bool measureLoss(const Daemon& daemon, const std::string& parameters, const Arguments& arguments) {
    const std::uint64_t before = daemon.cpuNanoseconds();
    TracedSession session(daemon.socketPath(), parameters);
    const std::uint64_t sent = markFromThreads(arguments);
    const std::uint64_t recording = daemon.cpuNanoseconds() - before;
    const auto stopping = Clock::now();
    session.stop();
    const double stopSeconds = std::chrono::duration<double>(Clock::now() - stopping).count();
    const TraceResults results =
        readTraceResults(daemon.logsDirectory() / "Traces" / "tracing_results.trace.json");
    const std::uint64_t missing = sent - results.events;
    std::printf("marks made                    %8llu in %llu s, %d threads\n",
                static_cast<unsigned long long>(sent),
                static_cast<unsigned long long>(arguments.seconds), kThreads);
    std::printf("marks in the results          %8llu\n",
                static_cast<unsigned long long>(results.events));
    std::printf("marks lost                    %8llu (%.3f in a million), %llu of them counted\n",
                static_cast<unsigned long long>(missing),
                1e6 * static_cast<double>(missing) / static_cast<double>(sent),
                static_cast<unsigned long long>(results.lost));
    std::printf("the daemon, while recording   %8.0f ns CPU an event\n",
                static_cast<double>(recording) / static_cast<double>(sent));
    std::printf("the daemon, peak memory       %8.0f bytes an event (%.0f MiB)\n",
                static_cast<double>(daemon.memory().peakBytes) / static_cast<double>(sent),
                static_cast<double>(daemon.memory().peakBytes) / (1 << 20));
    std::printf("the stop, results written     %8.2f s\n", stopSeconds);
    return missing == results.lost;
}

Arguments parse(int count, char** values) {
    Arguments arguments;
    for (int i = 1; i < count; ++i) {
        const std::string value = values[i];
        if (value.starts_with("--rate=")) {
            arguments.rate = std::stoull(value.substr(std::strlen("--rate=")));
        } else if (value.starts_with("--seconds=")) {
            arguments.seconds = std::stoull(value.substr(std::strlen("--seconds=")));
        } else {
            arguments.daemon = value;
        }
    }
    if (arguments.daemon.empty()) {
        throw std::runtime_error("usage: halyard-trace-load [--rate=N] [--seconds=N] DAEMON");
    }
    return arguments;
}

int run(int count, char** values) {
    const Arguments arguments = parse(count, values);
    if (::access(kTracefs, W_OK) != 0) {
        std::printf("halyard-trace-load: no tracefs that we may write to: skipped\n");
        return kSkipped;
    }
    Options options;
    options.daemon = arguments.daemon;
    const Daemon daemon(options, {.logLevel = "error", .tracing = true});
    const std::string parameters = daemon.logsDirectory() / "parameters.plist";
    std::ofstream(parameters) << kParameters;
    measureMarks(daemon, parameters);
    return measureLoss(daemon, parameters, arguments) ? 0 : 1;
}

} // namespace
} // namespace halyard::load

int main(int count, char** values) {
    try {
        return halyard::load::run(count, values);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "halyard-trace-load: %s\n", error.what());
        return 1;
    }
}
