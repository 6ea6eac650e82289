#include "linux/trace/TraceCmdRecorder.h"

#include <algorithm>
#include <atomic>
#include <sys/eventfd.h>
#include <thread>
#include <unistd.h>
#include <vector>

#include "common/Mutex.h"
#include "linux/system/ChildProcess.h"
#include "linux/system/LinuxFiles.h"
#include "linux/system/PrivateFiles.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr const char* kExtension = ".dat";
// Of one processor; older events give way.
constexpr const char* kMostKiBPerProcessor = "65536";
constexpr std::chrono::milliseconds kNoLimit{-1};
// An abandoned recorder has nothing to write.
constexpr std::chrono::milliseconds kAbandonedPatience{1000};

using platform::PerformanceTraceDelegate;

// What the session and the recording's thread share.
class Recording {
public:
    explicit Recording(TraceCmdRecorder::Options options)
        : options_(std::move(options)), name_(uniqueTraceName()),
          file_(options_.directory / (name_ + kExtension)), wake_(::eventfd(0, EFD_CLOEXEC)) {}
    ~Recording() { ::close(wake_); }
    Recording(const Recording&) = delete;
    Recording& operator=(const Recording&) = delete;

    void setDelegate(std::weak_ptr<PerformanceTraceDelegate> delegate) HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        delegate_ = std::move(delegate);
    }
    void stop() {
        const std::uint64_t one = 1;
        (void)!::write(wake_, &one, sizeof one);
    }
    void abandon() {
        setDelegate({});
        abandoned_.store(true);
        stop();
    }
    void run();
    void fail(const Error& error);

private:
    std::shared_ptr<PerformanceTraceDelegate> delegate() HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        return delegate_.lock();
    }
    std::vector<std::string> arguments() const;
    Result<void> makeRoom() const;
    MaybeError record(ChildProcess& child);
    void removeInstance() const;
    void removeFiles() const;

    const TraceCmdRecorder::Options options_;
    const std::string name_;
    const fs::path file_;
    const int wake_;
    std::atomic<bool> abandoned_{false};
    Mutex mutex_;
    std::weak_ptr<PerformanceTraceDelegate> delegate_ HY_GUARDED_BY(mutex_);
};

std::vector<std::string> Recording::arguments() const {
    // An instance of its own leaves other traces alone.
    return {options_.program,
            "record",
            "-q",
            "-B",
            name_,
            "-o",
            file_,
            "-m",
            kMostKiBPerProcessor,
            "-e",
            "sched:sched_switch",
            "-e",
            "sched:sched_wakeup",
            "-e",
            "irq",
            "-e",
            "power:cpu_frequency"};
}

// Removes the oldest traces; this one will be one more.
Result<void> Recording::makeRoom() const {
    std::error_code error;
    fs::create_directories(options_.directory.parent_path(), error);
    if (const auto made = makePrivateDirectory(options_.directory); !made.ok()) {
        return made;
    }
    std::vector<std::pair<fs::file_time_type, fs::path>> traces;
    for (const auto& entry : fs::directory_iterator(options_.directory, error)) {
        if (entry.path().extension() == kExtension) {
            traces.emplace_back(entry.last_write_time(error), entry.path());
        }
    }
    std::sort(traces.begin(), traces.end());
    for (std::size_t i = 0; i + TraceCmdRecorder::kKept <= traces.size(); ++i) {
        fs::remove(traces[i].second, error);
    }
    return {};
}

void Recording::fail(const Error& error) {
    if (const auto told = delegate()) {
        told->performanceTraceDidStart(error);
        told->performanceTraceDidComplete("", "", error);
    }
}

void Recording::run() {
    if (const auto room = makeRoom(); !room.ok()) {
        fail(systemError(room.failure()));
        return;
    }
    ChildProcess child;
    if (const auto started = child.start(arguments()); !started.ok()) {
        fail(systemError({started.failure().code, options_.program}));
        return;
    }
    if (const auto told = delegate()) {
        told->performanceTraceDidStart(std::nullopt);
    }
    const MaybeError error = record(child);
    removeInstance();
    if (error) {
        removeFiles();
    } else {
        (void)keepPrivate(file_); // Readers or not: it is told where it lies.
    }
    if (const auto told = delegate()) {
        told->performanceTraceDidStop(error);
        told->performanceTraceDidComplete(error ? "" : file_.string(), name_, error);
    }
}

MaybeError Recording::record(ChildProcess& child) {
    const bool endedItself = child.wait(wake_, kNoLimit);
    child.interrupt();
    const bool ended =
        endedItself || child.wait(-1, abandoned_ ? kAbandonedPatience : options_.patience);
    const int status = child.finish();
    std::error_code ignored;
    if (endedItself) {
        return Error{"posix", status, options_.program + " ended by itself"};
    }
    if (!ended) {
        return Error{"posix", ETIMEDOUT, options_.program + " did not finish"};
    }
    if (!fs::exists(file_, ignored)) {
        return Error{"posix", ENOENT, options_.program + " wrote no trace"};
    }
    return std::nullopt;
}

// A recorder that was killed leaves it; its name is ours alone.
void Recording::removeInstance() const {
    const fs::path instance = options_.tracefs / "instances" / name_;
    (void)writeTracefs(instance / "events/enable", "0");
    (void)::rmdir(instance.c_str());
}

// Of a recorder that failed: its parts for each processor.
void Recording::removeFiles() const {
    std::error_code error;
    std::vector<fs::path> parts;
    for (const auto& entry : fs::directory_iterator(options_.directory, error)) {
        if (entry.path().filename().string().starts_with(name_ + kExtension)) {
            parts.push_back(entry.path());
        }
    }
    for (const fs::path& part : parts) {
        fs::remove(part, error);
    }
}

class TraceCmdSession final : public platform::PerformanceTraceSession {
public:
    explicit TraceCmdSession(std::shared_ptr<Recording> recording)
        : recording_(std::move(recording)) {}
    ~TraceCmdSession() override { recording_->abandon(); }

    void setDelegate(std::weak_ptr<PerformanceTraceDelegate> delegate) override {
        recording_->setDelegate(std::move(delegate));
    }
    void startPerformanceTrace() override {
        try {
            // On its own: the child must not outlive the thread that made it, and
            // nobody is to wait for either.
            std::thread([recording = recording_] { recording->run(); }).detach();
        } catch (const std::system_error& error) {
            recording_->fail({"posix", error.code().value(), error.what()});
        }
    }
    void stopPerformanceTrace() override { recording_->stop(); }

private:
    const std::shared_ptr<Recording> recording_;
};

} // namespace

std::shared_ptr<platform::PerformanceTraceSession>
TraceCmdRecorder::initWithConfig(const platform::PerformanceTraceConfig& /*config*/) {
    return std::make_shared<TraceCmdSession>(std::make_shared<Recording>(options_));
}

} // namespace halyard::linux_
