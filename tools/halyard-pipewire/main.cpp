// halyard-pipewire: one reporting session for each stream of a PipeWire daemon.

#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <fmt/core.h>
#include <getopt.h>
#include <stdexcept>
#include <string>
#include <unistd.h>
#include <utility>

#include "BusyProcesses.h"
#include "ClientSessions.h"
#include "CycleCounter.h"
#include "CycleFiles.h"
#include "GlitchWatch.h"
#include "LookOnce.h"
#include "PipeWireAdapter.h"
#include "PlainText.h"
#include "StreamTracker.h"

namespace {

using namespace halyard::pipewire;
namespace reporting = halyard::reporting;

constexpr const char* kUsage =
    R"(Usage: halyard-pipewire [OPTION]...
Reports the playback and capture streams of a PipeWire daemon to halyardd.

  -r, --remote=NAME   the PipeWire daemon to watch (its usual one)
  -s, --socket=PATH   the socket of halyardd (its usual place)
  -1, --once          look for a second, print what is there, and end
  -b, --blame         name the busiest processes in what is told of a glitch
  -v, --verbose       say on standard error what is reported
  -h, --help          show this help
  -V, --version       show the version

Waits for both daemons and finds them again after a restart. SIGTERM and SIGINT
close the sessions and end it.
)";

struct Arguments {
    std::string remote;
    std::string socket;
    bool once = false;
    bool blame = false;
    bool verbose = false;
    int exitStatus = -1; // set: nothing to run
};

Arguments parse(int argc, char** argv) {
    static const option kOptions[] = {
        {"remote", required_argument, nullptr, 'r'}, {"socket", required_argument, nullptr, 's'},
        {"once", no_argument, nullptr, '1'},         {"blame", no_argument, nullptr, 'b'},
        {"verbose", no_argument, nullptr, 'v'},      {"help", no_argument, nullptr, 'h'},
        {"version", no_argument, nullptr, 'V'},      {}};
    Arguments arguments;
    for (int found = 0; (found = getopt_long(argc, argv, "r:s:1bvhV", kOptions, nullptr)) != -1;) {
        switch (found) {
        case 'r':
            arguments.remote = optarg;
            break;
        case 's':
            arguments.socket = optarg;
            break;
        case '1':
            arguments.once = true;
            break;
        case 'b':
            arguments.blame = true;
            break;
        case 'v':
            arguments.verbose = true;
            break;
        case 'h':
            fmt::print("{}", kUsage);
            arguments.exitStatus = EXIT_SUCCESS;
            return arguments;
        case 'V':
            fmt::print("halyard-pipewire {}\n", HALYARD_VERSION);
            arguments.exitStatus = EXIT_SUCCESS;
            return arguments;
        default:
            arguments.exitStatus = 2;
            return arguments;
        }
    }
    if (optind < argc) {
        fmt::print(stderr, "halyard-pipewire: unexpected argument \"{}\"; see --help\n",
                   argv[optind]);
        arguments.exitStatus = 2;
    }
    return arguments;
}

constexpr std::size_t kLongestNote = 2000;

// Names in it are what programs call themselves.
void note(const std::string& text) {
    fmt::print(stderr, "halyard-pipewire: {}\n", plainText(text, kLongestNote));
}

// Hands everything on, and says so when asked.
class NotingSink final : public SessionSink {
public:
    NotingSink(SessionSink& next, bool verbose) : next_(next), verbose_(verbose) {}

    void open(std::int64_t id, std::uint16_t service, const Contents& configuration) override {
        if (verbose_) {
            note(fmt::format("session {} (service type {}) for {}", id, service,
                             configuration.get<std::string>("HostApplicationDisplayID")));
        }
        next_.open(id, service, configuration);
    }
    void send(std::int64_t id, const Message& message) override {
        if (verbose_) {
            note(fmt::format("session {}: category {}, type {}", id, message.category,
                             message.type));
        }
        next_.send(id, message);
    }
    void close(std::int64_t id) override {
        if (verbose_) {
            note(fmt::format("session {} closed", id));
        }
        next_.close(id);
    }

private:
    SessionSink& next_;
    const bool verbose_;
};

// Positive, apart from what an earlier run gave out, and with room for 2^20
// sessions before a run that began a millisecond later.
std::int64_t firstReporterID() {
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::duration_cast<std::chrono::milliseconds>(now).count() << 20;
}

const char* environment(const char* name) {
    return std::getenv(name);
}

// Removes the files at its end.
class WrittenFiles final {
public:
    explicit WrittenFiles(const std::string& socketPath)
        : files_(cycleFolders(environment, ::geteuid() == 0, socketPath), note) {}
    ~WrittenFiles() { files_.remove(); }
    WrittenFiles(const WrittenFiles&) = delete;
    WrittenFiles& operator=(const WrittenFiles&) = delete;

    void write(CycleStatistics& statistics) {
        files_.write(statistics, std::chrono::steady_clock::now());
    }

private:
    CycleFiles files_;
};

class Watcher final {
public:
    explicit Watcher(const Arguments& arguments)
        : files_(arguments.socket), graph_({.remote = arguments.remote,
                                            .cycle = [this](const Cycle& each) { cycle(each); },
                                            .note = note},
                                           [this](const GraphEvent& event) { heard(event); }),
          client_({.socketPath = arguments.socket.empty() ? nullptr : arguments.socket.c_str(),
                   .connectionChanged = [this](bool connected) { post(connected); }}),
          sessions_(client_), sink_(sessions_, arguments.verbose),
          streams_(sink_, firstReporterID()), blame_(arguments.blame),
          glitches_(sink_, {.note = arguments.verbose ? note : nullptr,
                            .busiest = [this] { return busiest(); }}) {
        streams_.observe(glitches_);
        glitches_.settled = [this](StreamKey stream) { streams_.settle(stream); };
        if (!client_) {
            throw std::runtime_error("libhalyard gives no client: is the socket's path too long?");
        }
    }

    void run() {
        graph_.quitOnSignal(SIGTERM);
        graph_.quitOnSignal(SIGINT);
        graph_.run();
        streams_.closeAll();
        sayLosses();
    }

private:
    void heard(const GraphEvent& event) {
        devices_.handle(event);
        streams_.handle(event);
        watch();
    }
    void cycle(const Cycle& cycle) {
        if (watching_) {
            glitches_.take(cycle);
            devices_.take(cycle);
        }
    }
    Dictionaries busiest() const { return blame_ ? busy_.busiest(monotonicNow()) : Dictionaries(); }
    // Nothing is looked at while nothing runs.
    void watch() {
        if (std::exchange(watching_, glitches_.watching()) == watching_) {
            return;
        }
        graph_.every(watching_ ? GlitchWatch::kTick : std::chrono::milliseconds(0), [this] {
            files_.write(devices_.statistics());
            if (blame_) {
                busy_.look(monotonicNow());
            }
            glitches_.tick();
            watch();
        });
    }

    // On libhalyard's thread.
    void post(bool connected) {
        graph_.post([this, connected] { connectionChanged(connected); });
    }

    // A daemon that comes back knows the sessions, libhalyard sees to that, but
    // not that they play.
    void connectionChanged(bool connected) {
        note(connected ? "connected to halyardd" : "waiting for halyardd");
        if (connected && wasLost_) {
            streams_.restate();
        }
        wasLost_ = !connected;
    }

    void sayLosses() const {
        if (sessions_.refused() + streams_.ignoredObjects() != 0) {
            note(fmt::format("{} reports dropped, {} PipeWire objects ignored", sessions_.refused(),
                             streams_.ignoredObjects()));
        }
    }

    CycleCounter devices_;
    WrittenFiles files_; // go after the client, which waits for the sessions' end
    PipeWireAdapter graph_;
    reporting::Client client_;
    ClientSessions sessions_;
    NotingSink sink_;
    StreamTracker streams_;
    const bool blame_;
    BusyProcesses busy_;
    GlitchWatch glitches_;
    bool watching_ = false;
    bool wasLost_ = false;
};

int printOnce(const std::string& remote) {
    const Look look = lookOnce(remote, std::chrono::seconds(1));
    if (!look.answered) {
        note(look.text);
        return EXIT_FAILURE;
    }
    fmt::print("{}", look.text);
    return EXIT_SUCCESS;
}

// Before any thread starts: one that does not block them would take the signals
// away from the loop, and end the process.
void blockSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

} // namespace

int main(int argc, char** argv) {
    const Arguments arguments = parse(argc, argv);
    if (arguments.exitStatus != -1) {
        return arguments.exitStatus;
    }
    try {
        if (arguments.once) {
            return printOnce(arguments.remote);
        }
        blockSignals();
        Watcher(arguments).run();
        return EXIT_SUCCESS;
    } catch (const std::exception& error) {
        note(error.what());
        return EXIT_FAILURE;
    }
}
