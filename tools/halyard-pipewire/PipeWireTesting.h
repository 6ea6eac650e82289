// A PipeWire daemon of a test's own, with a session manager, two null sinks
// ("out.speaker" is the default, "out.headphones") and a source of silence
// ("in.microphone"), in a private folder.
#pragma once

#include <csignal>
#include <cstdint>
#include <filesystem>
#include <string>
#include <sys/types.h>
#include <vector>

#include "testing/TempTree.h"

namespace halyard::testing {

// A child process, killed at the end.
class Child final {
public:
    Child() = default;
    // Its standard input and output, where not this process's and the log.
    struct Ends {
        int input = -1;
        int output = -1;
    };

    // Looks `arguments[0]` up in the path; output goes to `logFile`, or where this
    // process's goes if that is empty.
    Child(const std::vector<std::string>& arguments, const std::filesystem::path& logFile)
        : Child(arguments, logFile, Ends()) {}
    Child(const std::vector<std::string>& arguments, const std::filesystem::path& logFile,
          const Ends& ends);
    Child(Child&& other) noexcept;
    Child& operator=(Child&& other) noexcept;
    ~Child() { kill(); }

    pid_t pid() const { return pid_; }
    // SIGSTOP is in effect when this returns: no thread of it runs any more.
    void signal(int number) const;
    void kill();
    // Waits for its end; the exit status, or -1 if a signal ended it.
    int wait();

private:
    pid_t pid_ = -1;
};

class PrivatePipeWire final {
public:
    // False when the programs are not installed.
    static bool installed();
    static bool pulseInstalled();

    // Points this process's environment, and thereby its children's, at the
    // private folder. Starts nothing yet.
    PrivatePipeWire();
    ~PrivatePipeWire();

    // Returns when the session manager knows the devices.
    void start();
    void stop();
    // Serves PulseAudio programs; requires start(). Returns when it listens.
    void startPulse();

    const std::filesystem::path& folder() const { return folder_.path(); }
    const Child& daemon() const { return daemon_; }
    const Child& sessionManager() const { return sessionManager_; }
    const Child& pulse() const { return pulse_; }

    // Of every driver; 0 leaves it to the programs again.
    void forceQuantum(std::uint32_t frames);

    // Plays silence until the result goes.
    Child play(const std::string& role);
    Child record();
    // Runs a program to its end; requires that it succeeds.
    void run(const std::vector<std::string>& arguments);

private:
    void awaitSocket(const std::string& name);
    std::filesystem::path log(const std::string& name) const { return folder_ / (name + ".log"); }

    TempTree folder_;
    Child daemon_;
    Child sessionManager_;
    Child pulse_;
};

} // namespace halyard::testing
