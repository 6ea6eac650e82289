// Writes files of measured values.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace halyard::platform {

enum class ResultsUnit { Nanoseconds };

// What a trace saw over time, for viewers of traces.
struct TraceTimeline {
    // An interval from one event to another, or either event alone.
    struct Span {
        std::uint64_t begin = 0; // ns of `clock`; meaningless without hasBegin
        std::uint64_t end = 0;
        std::uint64_t threadID = 0; // of the begin, if there is one
        std::int32_t pid = 0;
        bool hasBegin = false;
        bool hasEnd = false;
    };
    struct Track {
        std::string item;
        std::vector<Span> spans; // in the order of their last event
    };

    std::string trace;
    std::string clock;
    std::uint64_t eventsLost = 0;
    std::vector<Track> tracks;
};

// One file that is being written. One thread at a time.
class ResultsWriter {
public:
    virtual ~ResultsWriter() = default;
    virtual void newValue(std::string_view name, ResultsUnit unit, double value) = 0;
    // Kept apart from the values, beside their file.
    virtual void newTimeline(const TraceTimeline& timeline) = 0;
    // Finishes the file. Without it nothing is written.
    virtual void close() = 0;
};

class ResultsFiles {
public:
    virtual ~ResultsFiles() = default;
    // Null when the file cannot be written.
    virtual std::unique_ptr<ResultsWriter> open(std::string_view path, std::string_view name,
                                                std::uint32_t version) = 0;
};

} // namespace halyard::platform
