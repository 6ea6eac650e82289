#include "linux/queues/Queues.h"

#include <algorithm>
#include <asio/post.hpp>
#include <utility>

namespace halyard::linux_ {
namespace {

constexpr int kRelayThreads = 2;
constexpr std::size_t kLeastSweep = 64;

// Calls `done` when the last copy of the returned pointer goes.
std::shared_ptr<void> whenReleased(std::function<void()> done) {
    return {nullptr, [done = std::move(done)](void*) { done(); }};
}

} // namespace

Queues::Queues(asio::io_context& timers, Pressure& pressure)
    : timers_(timers), pressure_(pressure),
      timer_([this](std::chrono::nanoseconds delay, platform::Task task) {
          after(delay, std::move(task));
      }),
      service_("hy-service", 1, platform::QueuePriority::UserInteractive),
      relay_("hy-relay", kRelayThreads, platform::QueuePriority::Utility),
      backgroundWorker_("hy-background", 1, platform::QueuePriority::Background),
      background_(*this) {}

Queues::~Queues() {
    stop();
}

void Queues::stop() {
    service_.stop();
    relay_.stop();
    backgroundWorker_.stop();
}

std::shared_ptr<platform::SerialQueue> Queues::makeSerialQueue(std::string_view /*name*/,
                                                               platform::QueuePriority priority) {
    const bool isService = priority == platform::QueuePriority::UserInteractive;
    auto queue = std::make_shared<PooledSerialQueue>(isService ? service_ : relay_, timer_);
    const MutexLock lock(mutex_);
    if (isService) {
        serviceQueue_ = queue;
        return queue;
    }
    if (relayQueues_.size() >= sweepAt_) {
        std::erase_if(relayQueues_, [](const auto& each) { return each.expired(); });
        sweepAt_ = std::max(kLeastSweep, relayQueues_.size() * 2);
    }
    relayQueues_.push_back(queue);
    return queue;
}

void Queues::after(std::chrono::nanoseconds delay, platform::Task task) {
    asio::post(timers_, [this, delay, task = std::move(task)] {
        auto timer = std::make_shared<asio::steady_timer>(
            timers_, std::chrono::duration_cast<asio::steady_timer::duration>(delay));
        timer->async_wait([timer, task](const asio::error_code& error) {
            if (!error) {
                task();
            }
        });
    });
}

void Queues::Background::async(platform::Task task) {
    owner_.backgroundWorker_.post(std::move(task));
}

void Queues::Background::asyncAfter(std::chrono::nanoseconds delay, platform::Task task) {
    if (owner_.delayedCount_.fetch_add(1) + 1 == kDelayedHighWater) {
        owner_.pressure_.set(Pressure::DelayedTasks, true);
    }
    asio::post(owner_.timers_, [&owner = owner_, delay, task = std::move(task)]() mutable {
        owner.addDelayed(delay, std::move(task));
    });
}

void Queues::addDelayed(std::chrono::nanoseconds delay, platform::Task task) {
    delayed_.push_back({asio::steady_timer(timers_, delay), std::move(task)});
    const auto delayed = std::prev(delayed_.end());
    // Cancelled means drained: it runs all the same, only earlier.
    delayed->timer.async_wait([this, delayed](const asio::error_code&) { runDelayed(delayed); });
}

void Queues::runDelayed(std::list<Delayed>::iterator delayed) {
    backgroundWorker_.post([this, task = std::move(delayed->task)] {
        task();
        if (delayedCount_.fetch_sub(1) == kDelayedLowWater) {
            pressure_.set(Pressure::DelayedTasks, false);
        }
    });
    delayed_.erase(delayed);
}

std::vector<std::shared_ptr<PooledSerialQueue>> Queues::busyRelayQueues() {
    std::vector<std::shared_ptr<PooledSerialQueue>> busy;
    const MutexLock lock(mutex_);
    for (const auto& weak : relayQueues_) {
        if (auto queue = weak.lock(); queue != nullptr && !queue->isIdle()) {
            busy.push_back(std::move(queue));
        }
    }
    return busy;
}

void Queues::onServiceQueue(platform::Task task) {
    std::shared_ptr<PooledSerialQueue> service;
    {
        const MutexLock lock(mutex_);
        service = serviceQueue_.lock();
    }
    if (service != nullptr) {
        service->async(std::move(task));
    } else {
        task(); // It has gone, and with it what it had to do.
    }
}

void Queues::drain(std::function<void()> done) {
    onServiceQueue([this, done = std::move(done)] { drainRelayQueues(done); });
}

void Queues::drainRelayQueues(std::function<void()> done) {
    const auto last = whenReleased([this, done = std::move(done)] { drainDelayed(done); });
    for (const auto& queue : busyRelayQueues()) {
        queue->async([last] {});
    }
}

void Queues::drainDelayed(std::function<void()> done) {
    asio::post(timers_, [this, done = std::move(done)] {
        for (Delayed& delayed : delayed_) {
            delayed.timer.cancel();
        }
        // Behind the handlers that the cancelling has queued.
        asio::post(timers_, [this, done] { backgroundWorker_.post(done); });
    });
}

} // namespace halyard::linux_
