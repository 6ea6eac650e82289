// Reads a trace parameter file: a property list that says which kernel trace
// events make up a performance trace. docs/tracing.md describes the file.
//
// Never fails: what is wrong is logged, and the record holds what was right.
//
// Any thread; blocks on the file.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "common/Value.h"

namespace halyard {

// Of the file.
inline constexpr std::string_view TraceParamChildrenNodes = "Children";
// Of each of its traces.
inline constexpr std::string_view TraceDataDescription = "Name";
inline constexpr std::string_view TraceDataType = "TraceType";
inline constexpr std::string_view TraceDataTypeEvtap = "evtap";
inline constexpr std::string_view TraceDataTypeOSSignpost = "OSSignpost";
inline constexpr std::string_view TraceDataIsCritical = "IsCritical"; // nobody reads it
inline constexpr std::string_view TraceDataChildrenNodes = "Children";
// Of each item of a trace.
inline constexpr std::string_view TracePointDescription = "Name";
inline constexpr std::string_view TracePointType = "Type";
inline constexpr std::string_view TracePointTypeInterval = "Interval";
inline constexpr std::string_view TracePointTypeImpulse = "Impulse";
inline constexpr std::string_view TracePointTypeLevel = "Level";
inline constexpr std::string_view TracePointBeginCode = "EvtapCodeBegin";
inline constexpr std::string_view TracePointEndCode = "EvtapCodeEnd";
inline constexpr std::string_view TracePointEventsMatchedBy = "EventsMatchedBy";
inline constexpr std::string_view TracePointEventsMatchedByThread = "Thread";
inline constexpr std::string_view TracePointEventsMatchedByProcess = "Process";

struct TraceDataParams {
    enum Type : std::uint32_t { Impulse = 0, Interval = 1, Level = 2 };

    std::string name;
    std::uint32_t type = Impulse;
    std::uint32_t beginCode = 0;
    std::uint32_t endCode = 0; // beginCode's value for an impulse
    bool matchByThread = false;
};

// All traces of one file together; the first name in it is theirs.
struct TraceParams {
    std::string name;
    std::int32_t isSignpost = 0;
    std::vector<TraceDataParams> items; // in file order
};

class TraceParamsParser {
public:
    static constexpr std::size_t kMostBytes = 1024 * 1024;

    explicit TraceParamsParser(std::string fileName) : traceParamsFile_(std::move(fileName)) {}

    const std::string& traceParamsFile() const { return traceParamsFile_; }
    void setTraceParamsFile(std::string fileName) { traceParamsFile_ = std::move(fileName); }

    // A relative file name counts from the process's current directory. Requires
    // an installed platform.
    TraceParams loadTraceParams() const;

private:
    Value loadFile() const;
    static void readTrace(const Dictionary& trace, TraceParams& params);
    static void readItem(const Dictionary& item, TraceParams& params);

    std::string traceParamsFile_;
};

} // namespace halyard
