// Kernel event traces through tracefs: one instance for each session, drained by
// a thread of its own.
//
// Without tracefs, or the right to use it, sessions do not start: start() returns
// the errno and the log says what to grant. Nothing else is harmed.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <vector>

#include "linux/trace/Tracefs.h"
#include "platform/EventTrace.h"

namespace halyard::linux_ {

class TracefsEventTrace final : public platform::EventTrace {
public:
    // At 100,000 events a second, a minute and more.
    static constexpr std::uint64_t kMostEvents = 8'000'000;

    struct Options {
        std::filesystem::path tracefs = kTracefs;
        // The processes, beside our own, whose libraries are probed. Any thread,
        // often while a session runs.
        std::function<std::vector<std::int32_t>()> clients;
        // Of one session, if the memory holds them; those beyond are counted as lost.
        std::uint64_t mostEvents = kMostEvents;
    };

    // Removes what a daemon that was killed left in the kernel.
    explicit TracefsEventTrace(Options options);

    std::unique_ptr<platform::EventTraceSession> createSession() override;

private:
    const Options options_;
};

} // namespace halyard::linux_
