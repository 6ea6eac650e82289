// What a run of halyard-load measures, as its command line says it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace halyard::load {

struct Options {
    std::string daemon;
    std::string directory = "/var/tmp"; // private directories are made in it
    std::string logLevel = "info";      // the daemon's default
    std::string mode;                   // only this one; empty: all
    std::string syncInterval;           // of the daemon's store; empty: its default
    // Of the sessions started at once, the daemon uploads five.
    std::uint32_t clients = 4;
    std::uint32_t messages = 200000; // per round and mode, of all clients together
    std::uint32_t repeats = 0;       // percent that repeat their predecessor
    std::uint32_t inFlight = 64;
    std::uint32_t rounds = 3;
    std::uint32_t connections = 1000;
    std::uint32_t sessions = 10000;
    std::uint32_t holdSeconds = 0;
    std::uint32_t pacedSeconds = 0;
    std::uint32_t churn = 0;
    std::uint32_t rate = 2000; // held or paced messages per second, of all clients together
    std::uint32_t timeoutSeconds = 120; // for one answer or one write
    bool throughput = true;
    bool memory = true;
    bool json = false;
};

// Nullopt after --help, which it prints. Throws std::runtime_error.
std::optional<Options> parseOptions(int count, const char* const* arguments);

} // namespace halyard::load
