// The structured log: native fields under journald, one line on standard error
// otherwise.
//
// Lines are handed to a thread of the log's own, because whoever reads the log
// (a pipe, a terminal, journald) may stop reading. What does not fit the bounded
// queue meanwhile is dropped, counted, and told in one line once there is room.
//
// Any thread.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "common/Value.h"
#include "platform/LogSink.h"

namespace halyard::linux_ {

// A finished line on its way out. The views are of literals.
struct LogRecord {
    LogLevel level;
    std::string_view category;
    Value message; // prefix and text; one of a line that recurs is shared
    std::string_view file;
    int line;
    std::string_view function;
};

// `%25s:%-5d `, then the text.
std::string logMessage(const platform::LogLine& line);
// The standard-error form, control characters and backslashes escaped, so that
// no text can pass for a line of its own. Ends in a line break.
std::string standardErrorLine(const LogRecord& record);
void appendStandardErrorLine(std::string& out, const LogRecord& record);
// Whether `fd` leads to journald.
bool leadsToJournal(int fd);

class LogWriter final : public platform::LogSink {
public:
    static constexpr std::size_t kMaxQueuedBytes = 4 * 1024 * 1024;
    static constexpr std::size_t kRecentLines = 256;

    // Where records go, the oldest first; called on the log's own thread.
    using Output = std::function<void(std::span<const LogRecord>)>;

    // Lines that come this soon after more than so many were written at once are gathered,
    // unless they are many themselves or one tells of an error.
    struct Gathering {
        std::chrono::nanoseconds time = std::chrono::milliseconds(10);
        std::size_t lines = 64;
    };

    explicit LogWriter(Output output) : LogWriter(std::move(output), Gathering{}) {}
    LogWriter(Output output, Gathering gathering);
    // Writes what is queued, for a second at most.
    ~LogWriter() override;

    // Journald when standard error leads there, else standard error.
    static Output defaultOutput();
    // Lines on a file, pipe or terminal, several at a time.
    static Output linesOn(int fd);

    bool isEnabled(LogLevel level) const override { return level >= level_.load(); }
    void write(const platform::LogLine& line) override;

    void setLevel(LogLevel level) { level_.store(level); }
    // Waits until what is queued has been written, for a second at most.
    void flush();
    std::uint64_t droppedLines() const { return dropped_.load(); }
    // The newest lines in their standard-error form, oldest first.
    std::vector<std::string> recentLines() const;

private:
    struct State;
    static void run(const std::shared_ptr<State>& state, const Output& output);

    // Shared with the thread, which is left behind if its output hangs for good.
    const std::shared_ptr<State> state_;
    std::atomic<LogLevel> level_{LogLevel::Info};
    std::atomic<std::uint64_t> dropped_{0};
    std::thread thread_;
};

} // namespace halyard::linux_
