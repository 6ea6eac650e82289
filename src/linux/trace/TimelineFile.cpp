#include "linux/trace/TimelineFile.h"

#include <fmt/format.h>

#include "common/Utf8.h"

namespace halyard::linux_ {
namespace {

constexpr const char* kCategory = "evmark";

} // namespace

TimelineFile::TimelineFile(std::unique_ptr<AtomicFile> file)
    : file_(std::move(file)), stream_(file_->stream(), buffer_, sizeof buffer_), json_(stream_) {
    json_.StartObject();
    key("displayTimeUnit");
    text("ns");
    key("traceEvents");
    json_.StartArray();
}

void TimelineFile::key(std::string_view name) {
    json_.Key(name.data(), static_cast<rapidjson::SizeType>(name.size()));
}

void TimelineFile::text(std::string_view value) {
    const std::string valid = replaceInvalidUtf8(value);
    json_.String(valid.data(), static_cast<rapidjson::SizeType>(valid.size()));
}

void TimelineFile::add(const platform::TraceTimeline& timeline) {
    Summary& summary = summaries_.emplace_back();
    summary.trace = timeline.trace;
    summary.clock = timeline.clock;
    summary.eventsLost = timeline.eventsLost;
    nameProcess(timeline.trace);
    for (const platform::TraceTimeline::Track& track : timeline.tracks) {
        for (const platform::TraceTimeline::Span& span : track.spans) {
            addSpan(span, track.item, summary);
        }
    }
}

void TimelineFile::nameProcess(std::string_view name) {
    json_.StartObject();
    key("ph");
    text("M");
    key("name");
    text("process_name");
    key("pid");
    json_.Uint64(summaries_.size());
    key("args");
    json_.StartObject();
    key("name");
    text(name);
    json_.EndObject();
    json_.EndObject();
}

void TimelineFile::addSpan(const platform::TraceTimeline::Span& span, std::string_view item,
                           Summary& to) {
    if (span.hasBegin && span.hasEnd) {
        event("b", item, span.begin, span);
        event("e", item, span.end, span);
        ++to.pairs;
    } else if (span.hasBegin) {
        event("n", fmt::format("{}: start without stop", item), span.begin, span);
        ++to.startsAlone;
    } else {
        event("n", fmt::format("{}: stop without start", item), span.end, span);
        ++to.stopsAlone;
    }
    ++nextID_;
}

void TimelineFile::event(const char* phase, std::string_view name, std::uint64_t nanoseconds,
                         const platform::TraceTimeline::Span& span) {
    json_.StartObject();
    key("ph");
    text(phase);
    key("cat");
    text(kCategory);
    key("name");
    text(name);
    key("id");
    text(fmt::format("0x{:x}", nextID_));
    key("pid");
    json_.Uint64(summaries_.size());
    key("tid");
    json_.Uint64(span.threadID);
    key("ts"); // microseconds, exactly
    const std::string time = fmt::format("{}.{:03}", nanoseconds / 1000, nanoseconds % 1000);
    json_.RawValue(time.data(), time.size(), rapidjson::kNumberType);
    key("args");
    json_.StartObject();
    key("pid");
    json_.Int(span.pid);
    key("tid");
    json_.Uint64(span.threadID);
    json_.EndObject();
    json_.EndObject();
}

void TimelineFile::writeMetadata() {
    key("otherData");
    json_.StartObject();
    key("traces");
    json_.StartArray();
    for (const Summary& summary : summaries_) {
        json_.StartObject();
        key("name");
        text(summary.trace);
        key("clock");
        text(summary.clock);
        const std::pair<const char*, std::uint64_t> counts[] = {
            {"eventsLost", summary.eventsLost},
            {"pairs", summary.pairs},
            {"startsWithoutStop", summary.startsAlone},
            {"stopsWithoutStart", summary.stopsAlone}};
        for (const auto& [name, count] : counts) {
            key(name);
            json_.Uint64(count);
        }
        json_.EndObject();
    }
    json_.EndArray();
    json_.EndObject();
}

Result<void> TimelineFile::commit() {
    json_.EndArray();
    writeMetadata();
    json_.EndObject();
    stream_.Put('\n');
    stream_.Flush();
    return file_->commit();
}

} // namespace halyard::linux_
