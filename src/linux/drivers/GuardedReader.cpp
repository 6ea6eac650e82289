#include "linux/drivers/GuardedReader.h"

#include <algorithm>
#include <condition_variable>
#include <optional>
#include <pthread.h>
#include <utility>

#include "common/Mutex.h"
#include "linux/queues/BlockingSection.h"

namespace halyard::linux_ {
namespace {

Reading stuckReading() {
    Reading reading;
    reading.fault = "reading it does not come to an end";
    return reading;
}

} // namespace

// Where the caller hands sources to a thread, and gets readings back.
//
// Whoever leaves it leaves it to the thread, which may come back at any time or
// never: a reading that is there then says that it has.
struct GuardedReader::Desk {
    struct Job {
        std::shared_ptr<ChannelSource> source;
        platform::SteadyTime now;
    };

    // The caller's. Readings of the first sources: of all, or of those in time.
    std::vector<Reading> read(Sources wanted, platform::SteadyTime at,
                              std::chrono::milliseconds patience) HY_EXCLUDES(mutex);
    void leave() HY_EXCLUDES(mutex);
    bool isThreadBack() HY_EXCLUDES(mutex);

    // The thread's. No job, and the thread is back, when it has been left.
    std::optional<Job> takeJob() HY_EXCLUDES(mutex);
    void hand(Reading reading) HY_EXCLUDES(mutex);

    Mutex mutex;
    std::condition_variable_any changed;
    Sources sources HY_GUARDED_BY(mutex);
    std::vector<Reading> readings HY_GUARDED_BY(mutex); // of the first sources
    platform::SteadyTime now HY_GUARDED_BY(mutex);
    bool left HY_GUARDED_BY(mutex) = false;
    bool threadIsBack HY_GUARDED_BY(mutex) = false;
};

std::vector<Reading> GuardedReader::Desk::read(Sources wanted, platform::SteadyTime at,
                                               std::chrono::milliseconds patience) {
    const BlockingSection blocking;
    const MutexLock lock(mutex);
    sources = std::move(wanted);
    readings.clear();
    now = at;
    changed.notify_all();
    const auto until = std::chrono::steady_clock::now() + patience;
    while (readings.size() < sources.size() &&
           changed.wait_until(mutex, until) != std::cv_status::timeout) {
    }
    left = readings.size() < sources.size();
    sources.clear();
    return std::exchange(readings, {});
}

void GuardedReader::Desk::leave() {
    const MutexLock lock(mutex);
    left = true;
    changed.notify_all();
}

bool GuardedReader::Desk::isThreadBack() {
    const MutexLock lock(mutex);
    return threadIsBack;
}

std::optional<GuardedReader::Desk::Job> GuardedReader::Desk::takeJob() {
    const MutexLock lock(mutex);
    while (!left && readings.size() == sources.size()) {
        changed.wait(mutex);
    }
    threadIsBack = left;
    return left ? std::nullopt : std::optional(Job{sources[readings.size()], now});
}

void GuardedReader::Desk::hand(Reading reading) {
    const MutexLock lock(mutex);
    readings.push_back(std::move(reading));
    if (readings.size() == sources.size()) {
        changed.notify_all();
    }
}

GuardedReader::~GuardedReader() {
    if (thread_.joinable()) {
        desk_->leave();
        const BlockingSection blocking;
        thread_.join();
    }
}

void GuardedReader::work(const std::shared_ptr<Desk>& desk) {
    while (auto job = desk->takeJob()) {
        desk->hand(job->source->read(job->now));
    }
}

void GuardedReader::startThread() {
    desk_ = std::make_shared<Desk>();
    thread_ = std::thread([desk = desk_] {
        ::pthread_setname_np(::pthread_self(), "driver reads");
        work(desk);
    });
}

void GuardedReader::leaveThread(const std::shared_ptr<ChannelSource>& source) {
    thread_.detach();
    stuck_.push_back({std::move(desk_), source});
    desk_.reset();
}

void GuardedReader::forgetThoseThatCameBack() {
    std::erase_if(stuck_, [](const Stuck& each) { return each.desk->isThreadBack(); });
}

bool GuardedReader::isStuck(const ChannelSource& source) const {
    return std::any_of(stuck_.begin(), stuck_.end(),
                       [&](const Stuck& each) { return each.source.get() == &source; });
}

std::vector<Reading> GuardedReader::read(std::span<const std::shared_ptr<ChannelSource>> sources,
                                         platform::SteadyTime now) {
    forgetThoseThatCameBack();
    std::vector<Reading> result(sources.size(), stuckReading());
    std::vector<std::size_t> waiting; // places of those that are to be read
    for (std::size_t place = 0; place < sources.size(); ++place) {
        if (!isStuck(*sources[place])) {
            waiting.push_back(place);
        }
    }
    while (!waiting.empty() && stuck_.size() < kMaxStuck) {
        if (desk_ == nullptr) {
            startThread();
        }
        Sources wanted;
        for (const std::size_t place : waiting) {
            wanted.push_back(sources[place]);
        }
        std::vector<Reading> readings = desk_->read(std::move(wanted), now, patience_);
        for (std::size_t i = 0; i < readings.size(); ++i) {
            result[waiting[i]] = std::move(readings[i]);
        }
        waiting.erase(waiting.begin(),
                      waiting.begin() + static_cast<std::ptrdiff_t>(readings.size()));
        if (!waiting.empty()) {
            leaveThread(sources[waiting.front()]);
            waiting.erase(waiting.begin());
        }
    }
    return result;
}

} // namespace halyard::linux_
