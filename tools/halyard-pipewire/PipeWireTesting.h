// A PipeWire daemon of a test's own, with a session manager and two null sinks
// ("out.speaker" is the default, "out.headphones"), in a private folder.
#pragma once

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
    // Looks `arguments[0]` up in the path; output goes to `logFile`.
    Child(const std::vector<std::string>& arguments, const std::filesystem::path& logFile);
    Child(Child&& other) noexcept;
    Child& operator=(Child&& other) noexcept;
    ~Child() { kill(); }

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

    // Points this process's environment, and thereby its children's, at the
    // private folder. Starts nothing yet.
    PrivatePipeWire();
    ~PrivatePipeWire();

    void start();
    void stop();

    // Plays silence until the result goes.
    Child play(const std::string& role);
    Child record();
    // Runs a program to its end; requires that it succeeds.
    void run(const std::vector<std::string>& arguments);

private:
    std::filesystem::path log(const std::string& name) const { return folder_ / (name + ".log"); }

    TempTree folder_;
    Child daemon_;
    Child sessionManager_;
};

} // namespace halyard::testing
