// A child in a process group of its own, which is told to finish (SIGINT) when
// the thread that started it ends.
//
// Belongs to the thread that starts it.
#pragma once

#include <chrono>
#include <string>
#include <sys/types.h>
#include <vector>

#include "common/Result.h"

namespace halyard::linux_ {

class ChildProcess {
public:
    ChildProcess() = default;
    // Ends the group at once if it still runs.
    ~ChildProcess();
    ChildProcess(const ChildProcess&) = delete;
    ChildProcess& operator=(const ChildProcess&) = delete;

    // The program is looked up in PATH; its output goes nowhere.
    Result<void> start(const std::vector<std::string>& arguments);
    void interrupt();
    // Waits for the child, for `wake` to become readable, or for `limit` (negative
    // is none). True when the child has ended.
    bool wait(int wake, std::chrono::milliseconds limit);
    // Ends what is left of the group and reaps the child; its wait status.
    int finish();

    ::pid_t pid() const { return pid_; }

private:
    ::pid_t pid_ = -1;
    int pidfd_ = -1;
};

} // namespace halyard::linux_
