#include "linux/system/LogWriter.h"

#include <algorithm>
#include <chrono>
#include <climits>
#include <condition_variable>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <fmt/format.h>
#include <iterator>
#include <optional>
#include <pthread.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>
#include <vector>

// With SUPPRESS_LOCATION the fields below are the caller's, not this file's.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

#include "common/Mutex.h"
#include "common/TextScan.h"
#include "linux/queues/BlockingSection.h"

namespace halyard::linux_ {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::seconds kFlushLimit{1};
// What is kept for the next lines, and no more than that is gathered.
constexpr std::size_t kKeptCapacity = 1024; // records
constexpr std::size_t kKeptBytes = 128 * 1024;
// What is written to a file at a time, which takes it all in one piece.
constexpr std::size_t kPieceOfFile = 64 * 1024;

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

void appendEscaped(std::string& out, char c) {
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
        fmt::format_to(std::back_inserter(out), "\\x{:02x}", static_cast<unsigned>(c));
    }
}

void appendEscaped(std::string& out, std::string_view text) {
    while (!text.empty()) {
        const std::size_t plain = plainLength<'\x7F', '\\'>(text);
        out += text.substr(0, plain);
        if (plain < text.size()) {
            appendEscaped(out, text[plain]);
        }
        text.remove_prefix(std::min(plain + 1, text.size()));
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
        fmt::format("MESSAGE={}", record.message.text()),
        fmt::format("PRIORITY={}", journalPriority(record.level)),
        fmt::format("SUBSYSTEM={}", kLogSubsystem),
        fmt::format("CATEGORY={}", record.category),
        fmt::format("CODE_FILE={}", record.file),
        fmt::format("CODE_LINE={}", record.line),
        fmt::format("CODE_FUNC={}", record.function),
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

bool isRegularFile(int fd) {
    struct stat facts {};
    return ::fstat(fd, &facts) == 0 && S_ISREG(facts.st_mode);
}

std::size_t cost(const LogRecord& record) {
    return sizeof record + record.message.text().size();
}

void appendMessage(fmt::memory_buffer& out, const platform::LogLine& line) {
    constexpr std::size_t kFileWidth = 25;
    constexpr std::size_t kLineWidth = 5;
    constexpr std::string_view kBlanks = "                         ";
    static_assert(kBlanks.size() == kFileWidth);
    const fmt::format_int number(line.line);
    out.append(kBlanks.substr(std::min(kFileWidth, line.file.size())));
    out.append(line.file);
    out.push_back(':');
    out.append(std::string_view(number.data(), number.size()));
    out.append(kBlanks.substr(kFileWidth - kLineWidth + std::min(kLineWidth, number.size())));
    out.push_back(' ');
    out.append(line.text);
}

Value messageOf(const platform::LogLine& line) {
    if (line.memo != nullptr && !line.memo->made.isNone()) {
        return line.memo->made;
    }
    fmt::memory_buffer text;
    appendMessage(text, line);
    Value made(std::string_view(text.data(), text.size()));
    if (line.memo != nullptr) {
        line.memo->made = made;
    }
    return made;
}

} // namespace

bool leadsToJournal(int fd) {
    return matchesJournalStream(fd) || isConnectedToJournal(fd);
}

std::string logMessage(const platform::LogLine& line) {
    fmt::memory_buffer text;
    appendMessage(text, line);
    return fmt::to_string(text);
}

void appendStandardErrorLine(std::string& out, const LogRecord& record) {
    out.append(levelName(record.level)).append(1, ' ').append(record.category).append(1, ' ');
    appendEscaped(out, record.message.text());
    out += '\n';
}

std::string standardErrorLine(const LogRecord& record) {
    std::string out;
    appendStandardErrorLine(out, record);
    return out;
}

struct LogWriter::State {
    explicit State(Gathering gathers) : gathering(gathers) {}

    // All that waits to be written, once there is some; nothing at the end.
    void take(std::vector<LogRecord>& taken) HY_EXCLUDES(mutex);
    void waitForLinesLocked() HY_REQUIRES(mutex);
    void hurryLocked() HY_REQUIRES(mutex);
    void written(std::vector<LogRecord>& records) HY_EXCLUDES(mutex);
    bool isIdleLocked() const HY_REQUIRES(mutex) { return queued.empty() && !writing; }

    const Gathering gathering;

    Mutex mutex;
    std::condition_variable_any changed;
    std::vector<LogRecord> queued HY_GUARDED_BY(mutex);
    std::deque<LogRecord> recent HY_GUARDED_BY(mutex);
    std::size_t queuedBytes HY_GUARDED_BY(mutex) = 0;
    std::uint64_t untoldDrops HY_GUARDED_BY(mutex) = 0;
    // Until when lines are gathered; none while they are few.
    std::optional<Clock::time_point> gatheredUntil HY_GUARDED_BY(mutex);
    bool writing HY_GUARDED_BY(mutex) = false;
    bool hurried HY_GUARDED_BY(mutex) = false;
    bool stopping HY_GUARDED_BY(mutex) = false;
};

// A line now and then is written at once. Where they are many, each waking and each write
// costs more than the lines.
void LogWriter::State::waitForLinesLocked() {
    while (!stopping && queued.empty()) {
        changed.wait(mutex);
    }
    while (gatheredUntil && !stopping && !hurried &&
           changed.wait_until(mutex, *gatheredUntil) != std::cv_status::timeout) {
    }
    hurried = false;
}

// What is there now.
void LogWriter::State::hurryLocked() {
    if (!queued.empty() && !std::exchange(hurried, true)) {
        changed.notify_all();
    }
}

void LogWriter::State::take(std::vector<LogRecord>& taken) {
    taken.clear();
    const MutexLock lock(mutex);
    waitForLinesLocked();
    if (queued.empty()) {
        return;
    }
    taken.swap(queued);
    if (queued.capacity() > kKeptCapacity) {
        std::vector<LogRecord>().swap(queued);
    }
    queuedBytes = 0;
    writing = true;
    if (const auto drops = std::exchange(untoldDrops, 0); drops > 0) {
        taken.push_back({LogLevel::Error, HYReportingPlatformCategory,
                         Value(fmt::format("{:>25}:{:<5} {} messages dropped", "LogWriter.cpp",
                                           __LINE__, drops)),
                         "LogWriter.cpp", __LINE__, __func__});
    }
}

void LogWriter::State::written(std::vector<LogRecord>& records) {
    const std::size_t newest = std::min(records.size(), kRecentLines);
    const MutexLock lock(mutex);
    writing = false;
    gatheredUntil = records.size() > gathering.lines ? std::optional(Clock::now() + gathering.time)
                                                     : std::nullopt;
    std::move(std::prev(records.end(), static_cast<std::ptrdiff_t>(newest)), records.end(),
              std::back_inserter(recent));
    while (recent.size() > kRecentLines) {
        recent.pop_front();
    }
    changed.notify_all();
}

LogWriter::Output LogWriter::defaultOutput() {
    if (leadsToJournal(STDERR_FILENO)) {
        return [](std::span<const LogRecord> records) {
            std::for_each(records.begin(), records.end(), sendToJournal);
        };
    }
    return linesOn(STDERR_FILENO);
}

// As many lines at a time as a pipe takes in one piece: others may write to it, too.
LogWriter::Output LogWriter::linesOn(int fd) {
    const std::size_t most = isRegularFile(fd) ? kPieceOfFile : PIPE_BUF;
    return [fd, most, text = std::string()](std::span<const LogRecord> records) mutable {
        for (const LogRecord& record : records) {
            const std::size_t before = text.size();
            appendStandardErrorLine(text, record);
            if (text.size() > most && before > 0) {
                writeAll(fd, std::string_view(text).substr(0, before));
                text.erase(0, before);
            }
        }
        writeAll(fd, text);
        text.clear();
        if (text.capacity() > kKeptBytes) {
            text.shrink_to_fit();
        }
    };
}

LogWriter::LogWriter(Output output, Gathering gathering)
    : state_(std::make_shared<State>(gathering)),
      thread_([state = state_, output = std::move(output)] {
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
    LogRecord record{line.level, line.category, messageOf(line),
                     line.file,  line.line,     line.function};
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
    if (line.level == LogLevel::Error || state_->queued.size() >= kKeptCapacity ||
        state_->queuedBytes >= kKeptBytes) {
        state_->hurryLocked();
    }
}

void LogWriter::run(const std::shared_ptr<State>& state, const Output& output) {
    std::vector<LogRecord> records;
    for (state->take(records); !records.empty(); state->take(records)) {
        output(records);
        state->written(records);
    }
}

void LogWriter::flush() {
    const BlockingSection blocking;
    const MutexLock lock(state_->mutex);
    const auto until = Clock::now() + kFlushLimit;
    state_->hurryLocked();
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
