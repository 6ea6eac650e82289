#include "linux/system/LogWriter.h"

#include <chrono>
#include <condition_variable>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <fmt/format.h>
#include <mutex>
#include <pthread.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

// With SUPPRESS_LOCATION the fields below are the caller's, not this file's.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

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
    std::mutex mutex;
    std::condition_variable changed;
    std::deque<LogRecord> queued;
    std::deque<LogRecord> recent;
    std::size_t queuedBytes = 0;
    std::uint64_t untoldDrops = 0;
    bool writing = false;
    bool stopping = false;
};

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
    {
        const std::lock_guard lock(state_->mutex);
        state_->stopping = true;
    }
    state_->changed.notify_all();
    std::unique_lock lock(state_->mutex);
    const bool stuck = state_->writing;
    lock.unlock();
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
    const std::lock_guard lock(state_->mutex);
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
    std::unique_lock lock(state->mutex);
    for (;;) {
        state->changed.wait(lock, [&] { return state->stopping || !state->queued.empty(); });
        if (state->queued.empty()) {
            return;
        }
        std::deque<LogRecord> taken = std::exchange(state->queued, {});
        state->queuedBytes = 0;
        if (const auto drops = std::exchange(state->untoldDrops, 0); drops > 0) {
            taken.push_back(
                {LogLevel::Error, std::string(HYReportingPlatformCategory),
                 fmt::format("{:>25}:{:<5} {} messages dropped", "LogWriter.cpp", __LINE__, drops),
                 "LogWriter.cpp", __LINE__, __func__});
        }
        state->writing = true;
        lock.unlock();
        for (const LogRecord& record : taken) {
            output(record);
        }
        lock.lock();
        state->writing = false;
        for (LogRecord& record : taken) {
            state->recent.push_back(std::move(record));
        }
        while (state->recent.size() > kRecentLines) {
            state->recent.pop_front();
        }
        state->changed.notify_all();
    }
}

void LogWriter::flush() {
    const BlockingSection blocking;
    std::unique_lock lock(state_->mutex);
    (void)state_->changed.wait_for(lock, kFlushLimit,
                                   [&] { return state_->queued.empty() && !state_->writing; });
}

std::vector<std::string> LogWriter::recentLines() const {
    const std::lock_guard lock(state_->mutex);
    std::vector<std::string> lines;
    for (const LogRecord& record : state_->recent) {
        lines.push_back(standardErrorLine(record));
    }
    return lines;
}

} // namespace halyard::linux_
