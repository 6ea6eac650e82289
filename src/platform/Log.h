// Writes log lines through the installed platform. Text is formatted only when
// the line's level is on, so a silent line costs one branch:
//
//     HY_LOG_DEBUG(HYReportingClientCategory, "creating session for reporter {}", id);
#pragma once

#include <fmt/core.h>
#include <string>

#include "common/Description.h"
#include "platform/LogSink.h"

// A Value prints as its description.
template <> struct fmt::formatter<halyard::Value> {
    constexpr auto parse(fmt::format_parse_context& context) { return context.begin(); }
    fmt::format_context::iterator format(const halyard::Value& value,
                                         fmt::format_context& context) const;
};

namespace halyard::platform {

// Where a line stands in the sources.
struct LogPlace {
    const char* file;
    int line;
    const char* function;
};

[[nodiscard]] bool logEnabled(LogLevel level);
void logFormatted(LogLevel level, LogCategory category, const LogPlace& where,
                  fmt::string_view format, fmt::format_args arguments);
// As much of a text as a line has room for.
[[nodiscard]] std::string cutForLog(std::string text);
void logText(LogLevel level, LogCategory category, const LogPlace& where, std::string_view text,
             LogMemo* memo);

template <class... Arguments>
void log(LogLevel level, LogCategory category, const LogPlace& where,
         fmt::format_string<Arguments...> format, Arguments&&... arguments) {
    logFormatted(level, category, where, format, fmt::make_format_args(arguments...));
}

} // namespace halyard::platform

#define HY_LOG(level, category, ...)                                                               \
    do {                                                                                           \
        if (::halyard::platform::logEnabled(level)) {                                              \
            ::halyard::platform::log(level, category, {__FILE__, __LINE__, __func__},              \
                                     __VA_ARGS__);                                                 \
        }                                                                                          \
    } while (false)

#define HY_LOG_DEBUG(category, ...) HY_LOG(::halyard::LogLevel::Debug, category, __VA_ARGS__)
#define HY_LOG_INFO(category, ...) HY_LOG(::halyard::LogLevel::Info, category, __VA_ARGS__)
#define HY_LOG_DEFAULT(category, ...) HY_LOG(::halyard::LogLevel::Default, category, __VA_ARGS__)
#define HY_LOG_ERROR(category, ...) HY_LOG(::halyard::LogLevel::Error, category, __VA_ARGS__)
