#include "linux/trace/TracefsEventTrace.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <condition_variable>
#include <system_error>
#include <thread>
#include <unistd.h>
#include <utility>

#include "common/Mutex.h"
#include "linux/queues/BlockingSection.h"
#include "linux/system/SmallFile.h"
#include "linux/trace/MarkLibraries.h"
#include "linux/trace/TraceDelivery.h"
#include "linux/trace/TraceInstance.h"
#include "linux/trace/TraceReader.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

constexpr std::chrono::milliseconds kDrainPeriod{10};
constexpr int kDrainsPerSearch = 50; // for libraries of clients that are new
// What an event takes until its results are written (see docs/performance.md).
constexpr std::uint64_t kBytesPerEvent = 320;

// Events that fit into half of the memory that nobody needs now.
std::uint64_t eventsThatFit() {
    const auto read = readSmallFile("/proc/meminfo", 64 * 1024);
    const std::string text = read.ok() ? read.value() : std::string();
    const std::size_t at = text.find("MemAvailable:");
    std::uint64_t kibibytes = 0;
    if (at != std::string::npos) {
        const std::size_t digits = text.find_first_of("0123456789", at);
        std::from_chars(text.data() + std::min(digits, text.size()), text.data() + text.size(),
                        kibibytes);
    }
    return kibibytes * 1024 / 2 / kBytesPerEvent;
}

class TracefsSession final : public platform::EventTraceSession {
public:
    explicit TracefsSession(const TracefsEventTrace::Options& options)
        : options_(options), mostEvents_(std::min(options.mostEvents, eventsThatFit())),
          instance_(options_.tracefs), reader_(instance_, options_.tracefs) {}

    ~TracefsSession() override {
        delivery_->close();
        requestStop();
        if (drainer_.joinable()) {
            const BlockingSection blocking;
            drainer_.join();
        }
    }

    void setCompletionHandler(std::function<void()> handler) override {
        delivery_->setCompletion(std::move(handler));
    }
    void setWallTimesEnabled(bool enabled) override { reader_.setWallTimes(enabled); }
    int addEventsRange(std::uint32_t first, std::uint32_t last, EventHandler handler) override {
        if (first > last) {
            return EINVAL;
        }
        first_ = first;
        last_ = last;
        delivery_->setHandler(std::move(handler));
        return 0;
    }
    int start(std::shared_ptr<platform::SerialQueue> queue) override;
    void end() override;

    // The clock counts nanoseconds.
    std::uint64_t nanoseconds(std::uint64_t timestamp) const override { return timestamp; }
    std::uint64_t eventsLost() const override { return lost_.load(); }
    std::string clockName() const override { return "CLOCK_MONOTONIC"; }

private:
    Result<void> open();
    void probeNewLibraries();
    void requestStop();
    bool waitForStop();
    void drain();
    void deliver(std::vector<trace_point> points);
    void finish();

    const TracefsEventTrace::Options options_;
    const std::uint64_t mostEvents_;
    const std::shared_ptr<TraceDelivery> delivery_ = std::make_shared<TraceDelivery>();
    std::uint32_t first_ = 0;
    std::uint32_t last_ = UINT32_MAX;
    TraceInstance instance_;
    TraceReader reader_; // before its instance goes, its files are closed
    MarkLibraries libraries_;
    std::uint64_t delivered_ = 0;
    std::uint64_t refused_ = 0;
    std::atomic<std::uint64_t> lost_{0};

    Mutex stopMutex_;
    std::condition_variable_any stopChanged_;
    bool stopRequested_ HY_GUARDED_BY(stopMutex_) = false;
    std::thread drainer_;
};

Result<void> TracefsSession::open() {
    Result<void> result = instance_.create();
    if (result.ok()) {
        probeNewLibraries();
        result = reader_.open();
    }
    return result.ok() ? instance_.record() : result;
}

// The libraries are the clients' own files. One that cannot be probed is its
// client's loss alone.
void TracefsSession::probeNewLibraries() {
    std::vector<std::int32_t> pids{::getpid()};
    if (options_.clients) {
        const auto clients = options_.clients();
        pids.insert(pids.end(), clients.begin(), clients.end());
    }
    for (const MarkLibraries::Library& library : libraries_.newLibrariesOf(pids)) {
        const auto probed = instance_.probe(library, first_, last_);
        if (!probed.ok()) {
            HY_LOG_ERROR(HYReportingTraceCategory, "a client's library is not traced: {}: {}",
                         library.name, probed.failure().message());
        }
    }
}

int TracefsSession::start(std::shared_ptr<platform::SerialQueue> queue) {
    delivery_->setQueue(std::move(queue));
    Result<void> opened = open();
    if (opened.ok()) {
        try {
            drainer_ = std::thread([this] { drain(); });
            return 0;
        } catch (const std::system_error& error) {
            opened = Failure{static_cast<std::errc>(error.code().value()), "a thread"};
        }
    }
    instance_.disable();
    HY_LOG_ERROR(HYReportingTraceCategory,
                 "no kernel event trace: {}; it needs tracefs at {} and the right to write "
                 "there (root, or CAP_DAC_OVERRIDE and, for clients of other users, "
                 "CAP_SYS_PTRACE); see docs/tracing.md",
                 opened.failure().message(), options_.tracefs.string());
    return static_cast<int>(opened.failure().code);
}

void TracefsSession::end() {
    if (drainer_.joinable()) {
        requestStop(); // Its thread completes.
    } else {
        delivery_->complete();
    }
}

void TracefsSession::requestStop() {
    const MutexLock lock(stopMutex_);
    stopRequested_ = true;
    stopChanged_.notify_one();
}

bool TracefsSession::waitForStop() {
    const MutexLock lock(stopMutex_);
    const auto until = std::chrono::steady_clock::now() + kDrainPeriod;
    while (!stopRequested_ &&
           stopChanged_.wait_until(stopMutex_, until) != std::cv_status::timeout) {
    }
    return stopRequested_;
}

void TracefsSession::drain() {
    for (int drains = 1; !waitForStop(); ++drains) {
        deliver(reader_.read(false));
        if (drains % kDrainsPerSearch == 0) {
            probeNewLibraries();
        }
    }
    finish();
}

void TracefsSession::deliver(std::vector<trace_point> points) {
    const std::uint64_t room = mostEvents_ - delivered_;
    if (points.size() > room) {
        refused_ += points.size() - room;
        points.resize(room);
    }
    delivered_ += points.size();
    if (!points.empty()) {
        delivery_->deliver(std::move(points));
    }
}

void TracefsSession::finish() {
    instance_.disable();
    // A read may stop before the buffers are empty.
    for (auto points = reader_.read(true); !points.empty(); points = reader_.read(true)) {
        deliver(std::move(points));
    }
    lost_.store(instance_.eventsLost() + refused_);
    if (lost_.load() > 0) {
        HY_LOG_ERROR(HYReportingTraceCategory,
                     "{} trace events lost: {} by the kernel, {} beyond "
                     "the {} that are kept",
                     lost_.load(), lost_.load() - refused_, refused_, mostEvents_);
    }
    delivery_->complete();
}

} // namespace

TracefsEventTrace::TracefsEventTrace(Options options) : options_(std::move(options)) {
    if (const std::size_t removed = removeTraceLeftovers(options_.tracefs); removed > 0) {
        HY_LOG_DEFAULT(HYReportingTraceCategory,
                       "removed {} trace instances and probes of daemons that are gone", removed);
    }
}

std::unique_ptr<platform::EventTraceSession> TracefsEventTrace::createSession() {
    return std::make_unique<TracefsSession>(options_);
}

} // namespace halyard::linux_
