#pragma once

#include <string_view>

#include "common/LogCategory.h"
#include "common/Value.h"

namespace halyard::platform {

// What a sink has made of a line that will be written again, which it need not make anew
// then. None until it has.
struct LogMemo {
    Value made;
};

// All but the text are literals: whoever takes a line may keep them.
struct LogLine {
    LogLevel level;
    LogCategory category;
    std::string_view file; // base name
    int line;
    std::string_view function;
    std::string_view text;
    LogMemo* memo = nullptr; // of this very line; the caller's
};

// Where log lines go. Any thread. Must not block on whoever reads the log: an
// implementation bounds what it holds and counts what it had to drop.
class LogSink {
public:
    virtual ~LogSink() = default;
    // Cheap: asked before a line's arguments are formatted.
    virtual bool isEnabled(LogLevel level) const = 0;
    virtual void write(const LogLine& line) = 0;
};

} // namespace halyard::platform
