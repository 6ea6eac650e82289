// Performance traces by trace-cmd: a child records what the scheduler and the
// interrupts do to a file below the logs directory, from start to stop.
//
// A recorder never outlives its session, nor the daemon: whoever gives a trace up
// ends its whole process group, and when the daemon dies the kernel tells the
// child to finish.
//
// Any thread. Each trace has a thread of its own, on which the delegate is called.
#pragma once

#include <chrono>
#include <filesystem>
#include <string>

#include "linux/trace/Tracefs.h"
#include "platform/PerformanceTrace.h"

namespace halyard::linux_ {

class TraceCmdRecorder final : public platform::PerformanceTraces {
public:
    static constexpr std::size_t kKept = 8; // finished traces

    struct Options {
        std::filesystem::path directory; // of the traces; made when needed
        std::string program = "trace-cmd";
        // How long a recorder that was told to stop may take to write its file.
        std::chrono::milliseconds patience{20000};
        std::filesystem::path tracefs = kTracefs;
    };

    explicit TraceCmdRecorder(Options options) : options_(std::move(options)) {}

    std::shared_ptr<platform::PerformanceTraceSession>
    initWithConfig(const platform::PerformanceTraceConfig& config) override;

private:
    const Options options_;
};

} // namespace halyard::linux_
