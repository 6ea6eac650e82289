#include "linux/trace/TraceReader.h"

#include <algorithm>
#include <charconv>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include "linux/system/SmallFile.h"

extern "C" {
#include <kbuffer.h>
}

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

// How long after the start of a pass events of its past may still turn up.
constexpr std::uint64_t kHoldBack = 1'000'000;
constexpr int kMostPagesPerPass = 1024; // of one processor
constexpr std::size_t kMostThreads = 4096;
constexpr std::size_t kThreadOffset = 4; // of common_pid in every event
constexpr std::uint64_t kSecond = 1'000'000'000;

std::uint64_t nanosecondsOf(clockid_t clock) {
    timespec time{};
    ::clock_gettime(clock, &time);
    return static_cast<std::uint64_t>(time.tv_sec) * kSecond +
           static_cast<std::uint64_t>(time.tv_nsec);
}

template <class T> T valueAt(const unsigned char* data, std::size_t offset) {
    T value{};
    std::memcpy(&value, data + offset, sizeof value);
    return value;
}

std::int32_t numberAfter(std::string_view text, std::string_view label) {
    const std::size_t at = text.find(label);
    std::int32_t number = 0;
    if (at != std::string_view::npos) {
        std::from_chars(text.data() + at + label.size(), text.data() + text.size(), number);
    }
    return number;
}

} // namespace

void TraceReader::FreeBuffer::operator()(kbuffer* buffer) const {
    ::kbuffer_free(buffer);
}

TraceReader::TraceReader(const TraceInstance& instance, const fs::path& tracefs)
    : instance_(instance), tracefs_(tracefs),
      buffer_(::kbuffer_alloc(KBUFFER_LSIZE_SAME_AS_HOST, KBUFFER_ENDIAN_SAME_AS_HOST)),
      page_(static_cast<std::size_t>(::sysconf(_SC_PAGESIZE))) {}

TraceReader::~TraceReader() {
    for (const Processor& processor : processors_) {
        ::close(processor.fd);
    }
}

Result<void> TraceReader::open() {
    constexpr const char* kStep = "per_cpu/cpu*/trace_pipe_raw";
    std::error_code error;
    for (const auto& entry : fs::directory_iterator(instance_.directory() / "per_cpu", error)) {
        const std::string name = entry.path().filename().string();
        const int fd =
            ::open((entry.path() / "trace_pipe_raw").c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
        if (fd < 0) {
            return Failure::ofErrno(kStep);
        }
        processors_.push_back({static_cast<std::uint32_t>(numberAfter(name, "cpu")), fd});
    }
    if (error) {
        return Failure{static_cast<std::errc>(error.value()), kStep};
    }
    return {};
}

std::vector<trace_point> TraceReader::read(bool all) {
    const std::uint64_t now = nanosecondsOf(CLOCK_MONOTONIC);
    std::uint64_t complete = now - std::min(now, kHoldBack);
    for (const Processor& processor : processors_) {
        complete = std::min(complete, readPages(processor, complete));
    }
    const auto byTime = [](const trace_point& left, const trace_point& right) {
        return left.timestamp < right.timestamp;
    };
    std::stable_sort(held_.begin(), held_.end(), byTime);
    auto end = held_.end();
    if (!all) {
        trace_point edge{};
        edge.timestamp = complete;
        end = std::upper_bound(held_.begin(), held_.end(), edge, byTime);
    }
    std::vector<trace_point> ready(held_.begin(), end);
    held_.erase(held_.begin(), end);
    if (wallTimes_) {
        addWallTimes(ready);
    }
    return ready;
}

std::uint64_t TraceReader::readPages(const Processor& processor, std::uint64_t now) {
    std::uint64_t last = 0;
    for (int pages = 0; pages < kMostPagesPerPass; ++pages) {
        const ssize_t got = ::read(processor.fd, page_.data(), page_.size());
        if (got <= 0) {
            return now; // Emptied, or it cannot be read: nobody waits for it.
        }
        // The rest of a page that is not full is not read.
        std::fill(page_.begin() + got, page_.end(), static_cast<unsigned char>(0));
        last = std::max(last, addEventsOfPage(processor));
    }
    return last;
}

std::uint64_t TraceReader::addEventsOfPage(const Processor& processor) {
    std::uint64_t last = 0;
    if (::kbuffer_load_subbuffer(buffer_.get(), page_.data()) != 0) {
        return last;
    }
    unsigned long long time = 0;
    for (const void* event = ::kbuffer_read_event(buffer_.get(), &time); event != nullptr;
         event = ::kbuffer_next_event(buffer_.get(), &time)) {
        addEvent(processor, static_cast<const unsigned char*>(event),
                 static_cast<std::size_t>(std::max(::kbuffer_event_size(buffer_.get()), 0)), time);
        last = time;
    }
    return last;
}

void TraceReader::addEvent(const Processor& processor, const unsigned char* data, std::size_t size,
                           std::uint64_t time) {
    const TraceInstance::Layout& layout = instance_.layout();
    if (size < layout.size || !instance_.isOurs(valueAt<std::uint16_t>(data, 0))) {
        return;
    }
    trace_point& point = held_.emplace_back();
    const auto thread = valueAt<std::int32_t>(data, kThreadOffset);
    point.timestamp = time;
    point.code = valueAt<std::uint32_t>(data, layout.code);
    point.arg1 = valueAt<std::uint64_t>(data, layout.arguments[0]);
    point.arg2 = valueAt<std::uint64_t>(data, layout.arguments[1]);
    point.arg3 = valueAt<std::uint64_t>(data, layout.arguments[2]);
    point.arg4 = valueAt<std::uint64_t>(data, layout.arguments[3]);
    point.threadID = static_cast<std::uint64_t>(thread);
    point.processor = processor.number;
    point.pid = processOf(thread);
}

std::int32_t TraceReader::processOf(std::int32_t thread) {
    const auto known = processes_.find(thread);
    if (known != processes_.end()) {
        return known->second;
    }
    const auto status = readSmallFile(fmt::format("/proc/{}/status", thread), 16 * 1024);
    const std::int32_t process =
        status.ok() ? numberAfter(status.value(), "\nTgid:\t") : savedProcessOf(thread);
    if (processes_.size() >= kMostThreads) {
        processes_.clear();
    }
    processes_.emplace(thread, process);
    return process;
}

// Lines of "THREAD PROCESS", for threads that have ended.
std::int32_t TraceReader::savedProcessOf(std::int32_t thread) const {
    const auto saved = readSmallFile(tracefs_ / "saved_tgids", 1024 * 1024);
    return saved.ok() ? numberAfter('\n' + saved.value(), fmt::format("\n{} ", thread)) : 0;
}

void TraceReader::addWallTimes(std::vector<trace_point>& points) const {
    const std::uint64_t ahead = nanosecondsOf(CLOCK_REALTIME) - nanosecondsOf(CLOCK_MONOTONIC);
    for (trace_point& point : points) {
        const std::uint64_t time = point.timestamp + ahead;
        point.wallTime.seconds = static_cast<std::int64_t>(time / kSecond);
        point.wallTime.microseconds = static_cast<std::int32_t>(time % kSecond / 1000);
    }
}

} // namespace halyard::linux_
