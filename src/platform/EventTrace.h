// The kernel's event trace facility: sessions that record the marks which
// programs make with evmark_trace.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/WorkQueue.h"

namespace halyard {

// One recorded event.
struct trace_point {
    struct WallTime {
        std::int64_t seconds;
        std::int32_t microseconds;
        std::int32_t padding;
    };

    std::uint64_t timestamp; // in the session's own units
    std::uint64_t arg1;
    std::uint64_t arg2;
    std::uint64_t arg3;
    std::uint64_t arg4;
    std::uint64_t threadID;
    std::uint32_t code;
    std::uint32_t processor;
    WallTime wallTime; // zero unless the session has wall times enabled
    const char* texts[2];
    std::int32_t pid; // 0 when nobody knows any more
    std::int32_t padding;
};

static_assert(sizeof(trace_point) == 96);
static_assert(offsetof(trace_point, arg1) == 8 && offsetof(trace_point, arg4) == 32);
static_assert(offsetof(trace_point, threadID) == 40 && offsetof(trace_point, code) == 48);
static_assert(offsetof(trace_point, processor) == 52 && offsetof(trace_point, wallTime) == 56);
static_assert(offsetof(trace_point, texts) == 72 && offsetof(trace_point, pid) == 88);

} // namespace halyard

namespace halyard::platform {

// Set up, started, ended and destroyed by one thread; the handlers run on the
// queue that start() was given. Destroying it releases all it holds in the
// kernel; no handler is called after that, and none but the completion handler
// may do it.
class EventTraceSession {
public:
    using EventHandler = std::function<void(const trace_point&)>;

    virtual ~EventTraceSession() = default;

    // Called once, after end() and after the last event; also for a session that
    // could not be started. Requires that the session is not started.
    virtual void setCompletionHandler(std::function<void()> handler) = 0;
    virtual void setWallTimesEnabled(bool enabled) = 0;
    // Every event from `first` to `last` goes to `handler`, in the order of time.
    // Returns 0 or an errno. Requires that the session is not started.
    [[nodiscard]] virtual int addEventsRange(std::uint32_t first, std::uint32_t last,
                                             EventHandler handler) = 0;
    // Starts recording. Returns 0 or an errno.
    [[nodiscard]] virtual int start(std::shared_ptr<SerialQueue> queue) = 0;
    // Asks it to stop; the completion handler follows. Requires start().
    virtual void end() = 0;

    [[nodiscard]] virtual std::uint64_t nanoseconds(std::uint64_t timestamp) const = 0;
    // Events that were recorded by nobody, known once it has completed.
    virtual std::uint64_t eventsLost() const = 0;
    // The kernel's name of the clock behind nanoseconds().
    virtual std::string clockName() const = 0;
};

class EventTrace {
public:
    virtual ~EventTrace() = default;
    virtual std::unique_ptr<EventTraceSession> createSession() = 0;
};

} // namespace halyard::platform
