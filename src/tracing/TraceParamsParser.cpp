#include "tracing/TraceParamsParser.h"

#include <algorithm>
#include <charconv>
#include <variant>

#include "common/Description.h"
#include "common/PropertyListText.h"
#include "platform/Files.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "tracing/PropertyList.h"

namespace halyard {
namespace {

// How every value of the file is read. An absent one reads as the empty text.
std::string textOf(const Value& value) {
    return value.isNone() ? std::string() : describe(value);
}

Error wrongKind(std::string_view expected) {
    return {std::string(kPropertyListErrorDomain), 2, std::string(expected) + " is expected here"};
}

// Containers are read through their text, too: what a file holds as a text that
// spells a list is a list.
std::variant<Value, Error> reparsed(const Value& value) {
    return parsePropertyList(textOf(value));
}

std::variant<List, Error> listOf(const Value& value) {
    const auto result = reparsed(value);
    if (const auto* const error = std::get_if<Error>(&result)) {
        return *error;
    }
    const auto& whole = std::get<Value>(result);
    if (!whole.isList()) {
        return wrongKind("a list");
    }
    return whole.list();
}

std::variant<Dictionary, Error> dictionaryOf(const Value& value) {
    const auto result = reparsed(value);
    if (const auto* const error = std::get_if<Error>(&result)) {
        return *error;
    }
    const auto& whole = std::get<Value>(result);
    if (!whole.isDictionary()) {
        return wrongKind("a dictionary");
    }
    return whole.dictionary();
}

// With or without "0x"; what is no such number leaves 0. Kept: a number of the file
// is read by its decimal digits, as if they were hexadecimal.
std::uint32_t scanHexadecimal(std::string_view text) {
    text.remove_prefix(std::min(text.find_first_not_of(" \t\r\n"), text.size()));
    if (text.starts_with("0x") || text.starts_with("0X")) {
        text.remove_prefix(2);
    }
    std::uint32_t code = 0;
    const auto result = std::from_chars(text.data(), text.data() + text.size(), code, 16);
    return result.ec == std::errc{} ? code : 0;
}

std::uint32_t codeOf(const Dictionary& item, std::string_view key) {
    return scanHexadecimal(textOf(item[key]));
}

} // namespace

Value TraceParamsParser::loadFile() const {
    platform::Files& files = *platform::current().files;
    std::string path = traceParamsFile_;
    if (!path.starts_with('/')) {
        path = files.currentDirectory();
        path.append(path.ends_with('/') ? "" : "/").append(traceParamsFile_);
    }
    std::string bytes;
    auto read = files.readFile(path, kMostBytes);
    if (const auto* const error = std::get_if<Error>(&read)) {
        HY_LOG_ERROR(HYReportingTraceCategory, "Reading from plist file failed with error: {}",
                     error->message);
    } else {
        bytes = std::get<std::string>(std::move(read));
    }
    const auto parsed = parsePropertyList(bytes);
    if (const auto* const error = std::get_if<Error>(&parsed)) {
        HY_LOG_ERROR(HYReportingTraceCategory, "Reading from plist file failed with error: {}",
                     error->message);
        HY_LOG_ERROR(HYReportingTraceCategory, "No valid input found in plist.");
        return {};
    }
    return std::get<Value>(parsed);
}

TraceParams TraceParamsParser::loadTraceParams() const {
    const Value root = loadFile();
    TraceParams params;
    const auto traces = listOf(root.dictionary()[TraceParamChildrenNodes]);
    if (const auto* const error = std::get_if<Error>(&traces)) {
        HY_LOG_ERROR(HYReportingTraceCategory,
                     "Failed to load Trace Parameter Array with error: {}", error->message);
        return params;
    }
    for (const Value& each : std::get<List>(traces)) {
        const auto trace = dictionaryOf(each);
        if (const auto* const error = std::get_if<Error>(&trace)) {
            HY_LOG_ERROR(HYReportingTraceCategory,
                         "Failed to load Trace Parameter dictionary with error : {}",
                         error->message);
        } else {
            readTrace(std::get<Dictionary>(trace), params);
        }
    }
    return params;
}

void TraceParamsParser::readTrace(const Dictionary& trace, TraceParams& params) {
    if (params.name.empty()) {
        params.name = textOf(trace[TraceDataDescription]);
        if (params.name.empty()) {
            HY_LOG_ERROR(HYReportingTraceCategory, "Description not found in the plist file");
        }
    }
    if (params.isSignpost == 0) {
        params.isSignpost = textOf(trace[TraceDataType]) == TraceDataTypeOSSignpost ? 1 : 0;
    }
    const auto items = listOf(trace[TraceDataChildrenNodes]);
    if (const auto* const error = std::get_if<Error>(&items)) {
        HY_LOG_ERROR(HYReportingTraceCategory,
                     "Failed to read the Trace Points from the plist file with error: {}",
                     error->message);
        return;
    }
    for (const Value& each : std::get<List>(items)) {
        const auto item = dictionaryOf(each);
        if (const auto* const error = std::get_if<Error>(&item)) {
            HY_LOG_ERROR(
                HYReportingTraceCategory,
                "Failed to read Trace Point from Trace Points dictionary. Failed with error: {}",
                error->message);
        } else {
            readItem(std::get<Dictionary>(item), params);
        }
    }
}

void TraceParamsParser::readItem(const Dictionary& item, TraceParams& params) {
    TraceDataParams data;
    data.name = textOf(item[TracePointDescription]);
    data.matchByThread = textOf(item[TracePointEventsMatchedBy]) == TracePointEventsMatchedByThread;
    // Kept: what is not recognised has the type of the item before it.
    data.type = params.items.empty() ? TraceDataParams::Impulse : params.items.back().type;
    const std::string type = textOf(item[TracePointType]);
    std::uint32_t endCode = 0;
    if (type == TracePointTypeInterval) {
        data.type = TraceDataParams::Interval;
        data.beginCode = codeOf(item, TracePointBeginCode);
        endCode = codeOf(item, TracePointEndCode);
    } else if (type == TracePointTypeImpulse) {
        data.type = TraceDataParams::Impulse;
        data.beginCode = codeOf(item, TracePointBeginCode);
    } else if (type == TracePointTypeLevel) {
        data.type = TraceDataParams::Level;
        data.beginCode = codeOf(item, TracePointBeginCode);
    } else {
        HY_LOG_ERROR(HYReportingTraceCategory, "TracePointType field not recognized or is empty.");
    }
    HY_LOG_INFO(HYReportingTraceCategory, "Loading tracepoint : {} and {} \n finished parsing.",
                static_cast<std::int32_t>(data.beginCode), static_cast<std::int32_t>(endCode));
    data.endCode = data.type == TraceDataParams::Impulse ? data.beginCode : endCode;
    params.items.push_back(std::move(data));
}

} // namespace halyard
