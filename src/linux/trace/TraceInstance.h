// A buffer of the kernel's tracing directory that records the calls of
// evmark_trace in a range of codes: an instance of its own and, for each file of
// the library, a probe. Gone from the kernel when it is destroyed.
//
// For one thread at a time.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "common/Result.h"
#include "linux/trace/MarkLibraries.h"

namespace halyard::linux_ {

class TraceInstance {
public:
    // Where the values of a recorded event lie.
    struct Layout {
        std::size_t code = 0;
        std::size_t arguments[4] = {};
        std::size_t size = 0; // that an event has at least
    };

    explicit TraceInstance(std::filesystem::path tracefs);
    ~TraceInstance();
    TraceInstance(const TraceInstance&) = delete;
    TraceInstance& operator=(const TraceInstance&) = delete;

    // Sets the buffer up; nothing is recorded yet.
    Result<void> create();
    // Records from now on what the probes see. Requires create().
    Result<void> record();
    // Probes one more file, also while recording.
    Result<void> probe(const MarkLibraries::Library& library, std::uint32_t first,
                       std::uint32_t last);
    // Stops recording, probes first: a probe that records nowhere still costs its
    // callers. What is buffered can still be read.
    void disable();

    const std::filesystem::path& directory() const { return directory_; }
    const Layout& layout() const { return layout_; }
    bool isOurs(std::uint16_t eventID) const;
    // Events that did not fit into the buffer.
    std::uint64_t eventsLost() const;

private:
    Result<void> readFormat(const std::filesystem::path& event);

    const std::filesystem::path tracefs_;
    const std::string name_;
    const std::filesystem::path directory_;
    bool created_ = false;
    std::vector<std::string> probes_;
    std::vector<std::uint16_t> eventIDs_;
    Layout layout_;
};

} // namespace halyard::linux_
