// How many messages a second, and what each costs, until all are durable.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "load/Daemon.h"
#include "load/Options.h"

namespace halyard::load {

struct Mode {
    std::string name;
    bool requests = false;  // else notifications
    bool addressed = false; // each client to its own session, else broadcast to one
    bool analytics = true;
};

struct Measurement {
    std::string mode;
    std::uint64_t messages = 0;
    std::uint64_t bytes = 0;
    double seconds = 0;
    std::uint64_t cpuNanoseconds = 0;
    std::optional<std::uint64_t> peakBytes = {}; // unknown for the floor
    std::optional<Rows> rows = {};

    double messagesPerSecond() const { return static_cast<double>(messages) / seconds; }
    double cpuPerMessage() const {
        return static_cast<double>(cpuNanoseconds) / static_cast<double>(messages);
    }
};

const std::vector<Mode>& modes();

// A connection for each client, with a started session where the mode wants one.
std::vector<Connection> connectClients(const Daemon& daemon, const Options& options,
                                       const Mode& mode);

// Throws std::runtime_error, also when rows are missing in the store.
Measurement measure(const Options& options, const Mode& mode);

// The floor: a process that reads the bytes of notifications from as many
// connections and appends them to a file, with an fdatasync per MiB and at the
// end.
Measurement measureFloor(const Options& options);

// The streams of all clients in one mode.
std::vector<Stream> makeStreams(const Options& options, const Mode& mode);

} // namespace halyard::load
