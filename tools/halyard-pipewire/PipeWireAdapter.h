// Watches the graph of a PipeWire daemon and tells it as plain events; waits for
// the daemon when there is none, and again when it goes away.
//
// Only looks on: it subscribes to nodes, clients, links and
// the profiler, and changes nothing.
// libpipewire stays behind this header, because its headers need warnings
// switched off.
//
// Threads: everything on the thread that runs the loop, but for post(),
// which any thread may call.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "GraphEvents.h"
#include "ProfileReader.h"

namespace halyard::pipewire {

class PipeWireAdapter final {
public:
    struct Options {
        std::string remote; // the daemon's name; empty for the usual one
        // A burst is over when nothing came for `quiet`, or after `longestBurst`.
        std::chrono::milliseconds quiet{20};
        std::chrono::milliseconds longestBurst{100};
        // The wait before the next attempt to connect, doubled each time.
        std::chrono::milliseconds firstRetry{100};
        std::chrono::milliseconds lastRetry{5000};
        // Hears of each cycle of each driver that runs, up to a second later.
        CycleListener cycle = nullptr;
        // Takes a line for people, once an episode.
        std::function<void(const std::string&)> note = nullptr;
    };

    // `listener` hears events from the loop's thread. Throws std::runtime_error
    // when libpipewire cannot be set up at all.
    PipeWireAdapter(Options options, GraphListener listener);
    ~PipeWireAdapter();
    PipeWireAdapter(const PipeWireAdapter&) = delete;
    PipeWireAdapter& operator=(const PipeWireAdapter&) = delete;

    // Runs until a signal of quitOnSignal().
    void run();
    // Handles what is due, waiting for `timeout` at most.
    void iterate(std::chrono::milliseconds timeout);
    // Calls `work` from the loop.
    void post(std::function<void()> work);
    // Calls `work` again and again; zero: no more.
    void every(std::chrono::milliseconds period, std::function<void()> work);
    // Quits on this signal. Requires that every thread of the process blocks it.
    void quitOnSignal(int signal);

    [[nodiscard]] bool connected() const;

private:
    class Impl;
    std::unique_ptr<Impl> impl_;
};

} // namespace halyard::pipewire
