// A daemon of our own, in private directories, and what it costs.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <sys/types.h>

#include "load/Connection.h"
#include "load/Options.h"
#include "testing/TempTree.h"

namespace halyard::load {

struct DaemonSettings {
    bool analytics = true; // as shipped: every message is an analytics event as well
    std::string logLevel;
    bool tracing = false; // sessions of type test are traced
};

struct MemoryUse {
    std::uint64_t residentBytes = 0;
    std::uint64_t peakBytes = 0;
};

struct Rows {
    std::uint64_t uploads = 0;
    std::uint64_t analytics = 0;
};

// Kills its process when destroyed; the process dies with us in any case.
class Daemon {
public:
    // Returns when the daemon takes connections. Throws std::runtime_error.
    Daemon(const Options& options, const DaemonSettings& settings);
    ~Daemon();
    Daemon(const Daemon&) = delete;
    Daemon& operator=(const Daemon&) = delete;

    Connection connect() const;
    std::string socketPath() const;
    std::filesystem::path logsDirectory() const { return directory_.path() / "log"; }
    // CPU time of all its threads since it started.
    std::uint64_t cpuNanoseconds() const;
    MemoryUse memory() const;
    // What any SQLite reader sees in the store now.
    Rows rows() const;
    // Ends it as a service manager does. Throws unless it exits with 0.
    void stop();

private:
    void writeConfiguration(const DaemonSettings& settings) const;
    void spawn();
    [[noreturn]] void run() const;
    void awaitSocket();
    [[noreturn]] void failWithLog(const std::string& what) const;

    const Options& options_;
    testing::TempTree directory_;
    pid_t pid_ = -1;
};

} // namespace halyard::load
