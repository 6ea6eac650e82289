// Reads the events of a trace instance, in the order of time over all
// processors.
//
// For one thread at a time.
#pragma once

#include <cstdint>
#include <memory>
#include <sys/types.h>
#include <unordered_map>
#include <vector>

#include "common/Result.h"
#include "linux/trace/TraceInstance.h"
#include "platform/EventTrace.h"

struct kbuffer;

namespace halyard::linux_ {

class TraceReader {
public:
    // Borrows both.
    TraceReader(const TraceInstance& instance, const std::filesystem::path& tracefs);
    ~TraceReader();
    TraceReader(const TraceReader&) = delete;
    TraceReader& operator=(const TraceReader&) = delete;

    Result<void> open();
    // What has been recorded meanwhile, but for the newest: an event of another
    // processor may still come before those. With `all` they are returned, too.
    // Returns after a bounded number of pages; what is left comes next time.
    [[nodiscard]] std::vector<trace_point> read(bool all);
    void setWallTimes(bool wanted) { wallTimes_ = wanted; }

private:
    struct Processor {
        std::uint32_t number;
        int fd;
    };
    struct FreeBuffer {
        void operator()(kbuffer* buffer) const;
    };

    // The time up to which everything has been read.
    std::uint64_t readPages(const Processor& processor, std::uint64_t now);
    std::uint64_t addEventsOfPage(const Processor& processor);
    void addEvent(const Processor& processor, const unsigned char* data, std::size_t size,
                  std::uint64_t time);
    std::int32_t processOf(std::int32_t thread);
    std::int32_t savedProcessOf(std::int32_t thread) const;
    void addWallTimes(std::vector<trace_point>& points) const;

    const TraceInstance& instance_;
    const std::filesystem::path tracefs_;
    std::vector<Processor> processors_;
    std::unique_ptr<kbuffer, FreeBuffer> buffer_;
    std::vector<unsigned char> page_;
    std::vector<trace_point> held_;                            // sorted by time between two calls
    std::unordered_map<std::int32_t, std::int32_t> processes_; // by thread
    bool wallTimes_ = false;
};

} // namespace halyard::linux_
