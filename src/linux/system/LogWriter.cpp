#include "linux/system/LogWriter.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <fmt/format.h>
#include <iterator>
#include <pthread.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

// With SUPPRESS_LOCATION the fields below are the caller's, not this file's.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

#include "common/Mutex.h"
#include "linux/queues/BlockingSection.h"

namespace halyard::linux_ {
namespace {

constexpr std::chrono::seconds kFlushLimit{1};

std::string_view levelName(LogLevel level) {
    switch (level) {
    case LogLevel::Debug:
        return "debug";
    case LogLevel::Info:
        return "info";
    case LogLevel::Default:
        return "default";
    case LogLevel::Error:
        break;
    }
    return "error";
}

int journalPriority(LogLevel level) {
    switch (level) {
    case LogLevel::Debug:
        return 7;
    case LogLevel::Info:
        return 6;
    case LogLevel::Default:
        return 5;
    case LogLevel::Error:
        break;
    }
    return 3;
}

void appendEscaped(std::string& out, std::string_view text) {
    for (const char c : text) {
        switch (c) {
        case '\n':
            out += "\\n";
            break;
        case '\r':
            out += "\\r";
            break;
        case '\t':
            out += "\\t";
            break;
        case '\\':
            out += "\\\\";
            break;
        default:
            if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) {
                fmt::format_to(std::back_inserter(out), "\\x{:02x}", static_cast<unsigned>(c));
            } else {
                out += c;
            }
        }
    }
}

void writeAll(int fd, std::string_view text) {
    while (!text.empty()) {
        const ssize_t written = ::write(fd, text.data(), text.size());
        if (written > 0) {
            text.remove_prefix(static_cast<std::size_t>(written));
        } else if (errno != EINTR) {
            return; // Nobody is left to read it.
        }
    }
}

void sendToJournal(const LogRecord& record) {
    const std::string fields[] = {
        "MESSAGE=" + record.message,
        fmt::format("PRIORITY={}", journalPriority(record.level)),
        fmt::format("SUBSYSTEM={}", kLogSubsystem),
        "CATEGORY=" + record.category,
        "CODE_FILE=" + record.file,
        fmt::format("CODE_LINE={}", record.line),
        "CODE_FUNC=" + record.function,
        "SYSLOG_IDENTIFIER=halyardd",
    };
    iovec parts[std::size(fields)];
    for (std::size_t i = 0; i < std::size(fields); ++i) {
        parts[i] = {const_cast<char*>(fields[i].data()), fields[i].size()};
    }
    (void)sd_journal_sendv(parts, std::size(parts));
}

bool matchesJournalStream(int fd) {
    const char* stream = std::getenv("JOURNAL_STREAM"); // device:inode
    struct stat facts {};
    return stream != nullptr && ::fstat(fd, &facts) == 0 &&
           fmt::format("{}:{}", facts.st_dev, facts.st_ino) == stream;
}

bool isConnectedToJournal(int fd) {
    sockaddr_un peer{};
    socklen_t length = sizeof peer;
    if (::getpeername(fd, reinterpret_cast<sockaddr*>(&peer), &length) != 0 ||
        peer.sun_family != AF_UNIX) {
        return false;
    }
    return std::strncmp(peer.sun_path, "/run/systemd/journal/", 21) == 0;
}

std::size_t cost(const LogRecord& record) {
    return sizeof record + record.message.size();
}

} // namespace

bool leadsToJournal(int fd) {
    return matchesJournalStream(fd) || isConnectedToJournal(fd);
}

std::string logMessage(const platform::LogLine& line) {
    return fmt::format("{:>25}:{:<5} {}", line.file, line.line, line.text);
}

std::string standardErrorLine(const LogRecord& record) {
    std::string out = fmt::format("{} {} ", levelName(record.level), record.category);
    appendEscaped(out, record.message);
    out += '\n';
    return out;
}

struct LogWriter::State {
    // All that waits to be written, once there is some; nothing at the end.
    std::deque<LogRecord> take() HY_EXCLUDES(mutex);
    void written(std::deque<LogRecord> records) HY_EXCLUDES(mutex);
    bool isIdleLocked() const HY_REQUIRES(mutex) { return queued.empty() && !writing; }

    Mutex mutex;
    std::condition_variable_any changed;
    std::deque<LogRecord> queued HY_GUARDED_BY(mutex);
    std::deque<LogRecord> recent HY_GUARDED_BY(mutex);
    std::size_t queuedBytes HY_GUARDED_BY(mutex) = 0;
    std::uint64_t untoldDrops HY_GUARDED_BY(mutex) = 0;
    bool writing HY_GUARDED_BY(mutex) = false;
    bool stopping HY_GUARDED_BY(mutex) = false;
};

std::deque<LogRecord> LogWriter::State::take() {
    const MutexLock lock(mutex);
    while (!stopping && queued.empty()) {
        changed.wait(mutex);
    }
    if (queued.empty()) {
        return {};
    }
    std::deque<LogRecord> taken = std::exchange(queued, {});
    queuedBytes = 0;
    writing = true;
    if (const auto drops = std::exchange(untoldDrops, 0); drops > 0) {
        taken.push_back(
            {LogLevel::Error, std::string(HYReportingPlatformCategory),
             fmt::format("{:>25}:{:<5} {} messages dropped", "LogWriter.cpp", __LINE__, drops),
             "LogWriter.cpp", __LINE__, __func__});
    }
    return taken;
}

void LogWriter::State::written(std::deque<LogRecord> records) {
    const MutexLock lock(mutex);
    writing = false;
    std::move(records.begin(), records.end(), std::back_inserter(recent));
    while (recent.size() > kRecentLines) {
        recent.pop_front();
    }
    changed.notify_all();
}

LogWriter::Output LogWriter::defaultOutput() {
    if (leadsToJournal(STDERR_FILENO)) {
        return sendToJournal;
    }
    return [](const LogRecord& record) { writeAll(STDERR_FILENO, standardErrorLine(record)); };
}

LogWriter::LogWriter(Output output)
    : state_(std::make_shared<State>()), thread_([state = state_, output = std::move(output)] {
          sigset_t all;
          sigfillset(&all);
          pthread_sigmask(SIG_BLOCK, &all, nullptr);
          pthread_setname_np(pthread_self(), "hy-log");
          run(state, output);
      }) {}

LogWriter::~LogWriter() {
    flush();
    bool stuck = false;
    {
        const MutexLock lock(state_->mutex);
        state_->stopping = true;
        stuck = state_->writing;
        state_->changed.notify_all();
    }
    if (stuck) {
        thread_.detach();
    } else {
        thread_.join();
    }
}

void LogWriter::write(const platform::LogLine& line) {
    LogRecord record{line.level,       std::string(line.category),
                     logMessage(line), std::string(line.file),
                     line.line,        std::string(line.function)};
    const MutexLock lock(state_->mutex);
    if (state_->queuedBytes + cost(record) > kMaxQueuedBytes) {
        ++state_->untoldDrops;
        dropped_.fetch_add(1, std::memory_order_relaxed);
        return;
    }
    state_->queuedBytes += cost(record);
    state_->queued.push_back(std::move(record));
    if (state_->queued.size() == 1) {
        state_->changed.notify_all();
    }
}

void LogWriter::run(const std::shared_ptr<State>& state, const Output& output) {
    for (auto records = state->take(); !records.empty(); records = state->take()) {
        for (const LogRecord& record : records) {
            output(record);
        }
        state->written(std::move(records));
    }
}

void LogWriter::flush() {
    const BlockingSection blocking;
    const MutexLock lock(state_->mutex);
    const auto until = std::chrono::steady_clock::now() + kFlushLimit;
    while (!state_->isIdleLocked() &&
           state_->changed.wait_until(state_->mutex, until) != std::cv_status::timeout) {
    }
}

std::vector<std::string> LogWriter::recentLines() const {
    const MutexLock lock(state_->mutex);
    std::vector<std::string> lines;
    for (const LogRecord& record : state_->recent) {
        lines.push_back(standardErrorLine(record));
    }
    return lines;
}

} // namespace halyard::linux_
