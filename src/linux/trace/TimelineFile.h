// Time lines in the JSON form of trace events that Perfetto's viewer opens (and
// chrome://tracing): a process for each trace, an asynchronous track for each
// item, an id for each pair.
//
// For one thread at a time. Appears whole or, without commit(), not at all.
#pragma once

#include <memory>
#include <rapidjson/filewritestream.h>
#include <rapidjson/writer.h>
#include <string>
#include <string_view>
#include <vector>

#include "linux/system/AtomicFile.h"
#include "platform/ResultsWriter.h"

namespace halyard::linux_ {

class TimelineFile {
public:
    // Requires a file that is open.
    explicit TimelineFile(std::unique_ptr<AtomicFile> file);

    void add(const platform::TraceTimeline& timeline);
    // Once, last.
    Result<void> commit();

private:
    // What the metadata tells of a trace.
    struct Summary {
        std::string trace;
        std::string clock;
        std::uint64_t eventsLost = 0;
        std::uint64_t pairs = 0;
        std::uint64_t startsAlone = 0;
        std::uint64_t stopsAlone = 0;
    };

    void addSpan(const platform::TraceTimeline::Span& span, std::string_view item, Summary& to);
    void event(const char* phase, std::string_view name, std::uint64_t nanoseconds,
               const platform::TraceTimeline::Span& span);
    void nameProcess(std::string_view name);
    void writeMetadata();
    void key(std::string_view name);
    void text(std::string_view value);

    const std::unique_ptr<AtomicFile> file_;
    char buffer_[16384];
    rapidjson::FileWriteStream stream_;
    rapidjson::Writer<rapidjson::FileWriteStream> json_;
    std::vector<Summary> summaries_;
    std::uint64_t nextID_ = 1;
};

} // namespace halyard::linux_
