// What it costs a thread to report: the time of one halyard_session_send(), as a
// distribution, because an audio thread is hurt by the worst and not by the mean
// (which is why this is not one of the Google Benchmark programs beside it).
//
// The daemon's place is taken by a thread that reads and throws away. The lines
// of nothing are what the measurement itself adds; they are not subtracted from the others.
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "halyard/halyard.hpp"
#include "testing/TempTree.h"

namespace {

using namespace halyard::reporting;
using Clock = std::chrono::steady_clock;
using std::chrono::microseconds;
using std::chrono::milliseconds;

class Sink {
public:
    explicit Sink(const std::string& path)
        : listener_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
        if (::bind(listener_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0 ||
            ::listen(listener_, 1) != 0) {
            std::perror("client_benchmark: socket");
            std::exit(1);
        }
        thread_ = std::thread([this] { drain(); });
    }
    ~Sink() {
        thread_.join();
        ::close(listener_);
    }

private:
    void drain() const {
        const int peer = ::accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC);
        std::vector<char> room(65536);
        while (::read(peer, room.data(), room.size()) > 0) {
        }
        ::close(peer);
    }

    int listener_;
    std::thread thread_;
};

struct Case {
    const char* name;
    int threads;
    int messages; // of each thread
    microseconds pause;
    bool build; // the message anew each time
    bool issue = false;
};

void fill(Dictionary& message, int number) {
    message.clear()
        .set("sample_rate", 48000)
        .set("buffer_frames", 512U)
        .set("volume", 0.4)
        .set("device_name", "alsa_output.pci-0000_00_1f.3.analog-stereo")
        .set("route", "speaker")
        .set("is_muted", false)
        .set("application", "org.example.player")
        .set("count", number);
}

constexpr Issue kIssue{.category = HALYARD_CATEGORY_PLAYBACK,
                       .issueType = "client_slow",
                       .rtaidClient = "org.example.player",
                       .node = "Example Player",
                       .anyChannelSilenceSeconds = 0.02};

void waitUntil(Clock::time_point due, microseconds pause) {
    if (pause >= milliseconds(1)) {
        std::this_thread::sleep_until(due);
    }
    while (Clock::now() < due) {
    }
}

double since(Clock::time_point before) {
    return std::chrono::duration<double, std::nano>(Clock::now() - before).count();
}

void report(Session& session, const Case& what, std::vector<double>& times) {
    Dictionary message;
    fill(message, 0);
    for (int i = 0; i < what.messages; ++i) {
        waitUntil(Clock::now() + what.pause, what.pause);
        const Clock::time_point before = Clock::now();
        if (what.build) {
            fill(message, i);
        }
        if (what.issue) {
            session.reportIssue(kIssue, message);
        } else {
            session.send(message, HALYARD_CATEGORY_IO, HALYARD_TYPE_STATE);
        }
        times.push_back(since(before));
    }
}

double at(const std::vector<double>& sorted, double part) {
    return sorted[static_cast<std::size_t>(part * static_cast<double>(sorted.size() - 1))];
}

void print(const char* name, std::vector<double> times, std::uint64_t dropped) {
    std::sort(times.begin(), times.end());
    std::printf("%-46s %8.0f %8.0f %8.0f %9.0f %9llu\n", name, at(times, 0.5), at(times, 0.99),
                at(times, 0.999), times.back(), static_cast<unsigned long long>(dropped));
}

void run(const Case& what, const std::string& path) {
    ::unlink(path.c_str());
    Sink sink(path);
    Client client(path.c_str());
    const Session first = client.createSession();
    client.flush(5000);
    std::vector<std::vector<double>> times(static_cast<std::size_t>(what.threads));
    std::vector<std::thread> threads;
    for (std::vector<double>& mine : times) {
        mine.reserve(static_cast<std::size_t>(what.messages));
        threads.emplace_back([&] {
            Session session = client.createSession();
            report(session, what, mine);
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    std::vector<double> all;
    for (const std::vector<double>& mine : times) {
        all.insert(all.end(), mine.begin(), mine.end());
    }
    print(what.name, std::move(all), client.statistics().dropped_queue_full);
}

void measureNothing(const char* name, int times, microseconds pause) {
    std::vector<double> all;
    for (int i = 0; i < times; ++i) {
        waitUntil(Clock::now() + pause, pause);
        all.push_back(since(Clock::now()));
    }
    print(name, std::move(all), 0);
}

} // namespace

int main() {
    const halyard::testing::TempTree directory;
    const std::string path = directory / "reporting.sock";
    std::printf("%-46s %8s %8s %8s %9s %9s\n", "ns per hand-over", "median", "99 %", "99.9 %",
                "max", "dropped");
    measureNothing("nothing", 100'000, microseconds(0));
    measureNothing("nothing, every 5 ms (cold caches)", 1000, milliseconds(5));
    const Case cases[] = {
        {"every 20 us", 1, 200'000, microseconds(20), false},
        {"every 20 us, message built anew", 1, 200'000, microseconds(20), true},
        {"every 20 us, an issue beside the message", 1, 200'000, microseconds(20), false, true},
        {"every 20 us, in each of 4 threads", 4, 50'000, microseconds(20), false},
        {"back to back", 1, 500'000, microseconds(0), false},
        {"every 5 ms", 1, 1000, milliseconds(5), false},
        {"every 30 ms", 1, 200, milliseconds(30), false},
        {"every 1.2 s (the reader sleeps: one wake-up)", 1, 10, milliseconds(1200), false},
    };
    for (const Case& what : cases) {
        run(what, path);
    }
    return 0;
}
