// A line of the log that is written over and over, as with every message: it is put
// together anew only when it has something else to tell.
//
// Not thread-safe: whose line it is writes it on one queue.
#pragma once

#include <fmt/format.h>
#include <string>
#include <utility>
#include <vector>

#include "platform/Log.h"

namespace halyard::platform {

class KeptLine {
public:
    // `told` is all that the text depends on, as strings and integers, which are equal
    // only when they look the same; `makeText` gives the text. Requires that `where` is
    // always the same, and that somebody reads the level.
    template <class MakeText>
    void log(LogLevel level, LogCategory category, const LogPlace& where, std::vector<Value> told,
             const MakeText& makeText) {
        if (!isMade_ || !(told == told_)) {
            text_ = cutForLog(makeText());
            told_ = std::move(told);
            memo_ = {};
            isMade_ = true;
        }
        logText(level, category, where, text_, &memo_);
    }

private:
    std::vector<Value> told_;
    std::string text_;
    LogMemo memo_;
    bool isMade_ = false;
};

} // namespace halyard::platform

// A line of the log as HY_LOG, at one place only; `told` as above.
#define HY_LOG_KEPT(line, level, category, told, ...)                                              \
    do {                                                                                           \
        if (::halyard::platform::logEnabled(level)) {                                              \
            (line).log(level, category, {__FILE__, __LINE__, __func__}, told,                      \
                       [&] { return ::fmt::format(__VA_ARGS__); });                                \
        }                                                                                          \
    } while (false)
