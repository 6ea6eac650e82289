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
    : timers_(timers), pressure_(pressure), later_(timers),
      timer_([this](std::chrono::nanoseconds delay, platform::Task task) {
          later_.asyncAfter(delay, std::move(task));
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
    if (isService) {
        auto fair = std::make_shared<FairSerialQueue>(service_, timer_);
        const MutexLock lock(mutex_);
        serviceQueue_ = fair;
        return fair;
    }
    auto queue = std::make_shared<PooledSerialQueue>(relay_, timer_);
    const MutexLock lock(mutex_);
    if (relayQueues_.size() >= sweepAt_) {
        std::erase_if(relayQueues_, [](const auto& each) { return each.expired(); });
        sweepAt_ = std::max(kLeastSweep, relayQueues_.size() * 2);
    }
    relayQueues_.push_back(queue);
    return queue;
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

std::vector<std::shared_ptr<PooledSerialQueue>>
Queues::busyRelayQueues(const platform::SerialQueue* except) {
    std::vector<std::shared_ptr<PooledSerialQueue>> busy;
    const MutexLock lock(mutex_);
    for (const auto& weak : relayQueues_) {
        auto queue = weak.lock();
        if (queue != nullptr && queue.get() != except && !queue->isIdle()) {
            busy.push_back(std::move(queue));
        }
    }
    return busy;
}

std::shared_ptr<FairSerialQueue> Queues::serviceQueue() {
    const MutexLock lock(mutex_);
    return serviceQueue_.lock();
}

void Queues::onServiceQueue(platform::Task task) {
    const auto service = serviceQueue();
    if (service != nullptr) {
        service->asyncBehindAll(std::move(task));
    } else {
        task(); // It has gone, and with it what it had to do.
    }
}

std::size_t Queues::waitingRequests() {
    const auto service = serviceQueue();
    return service != nullptr ? service->waitingTasks() : 0;
}

void Queues::clientRelieved() {
    if (const auto service = serviceQueue()) {
        service->clientRelieved();
    }
}

void Queues::onEachThread(const platform::Task& task) {
    for (Worker* const worker : {&service_, &relay_, &backgroundWorker_}) {
        worker->onEachThread(task);
    }
}

// Draining follows the work down the stairs that it takes: requests on the service
// queue leave deliveries to the relay queues, these leave single messages to the
// background queue a second later, and all three leave rows to the store, which is
// flushed behind. Nothing goes up again, so one pass over the stairs is enough:
// each is asked for a sign once the one above has given its own.
//
// A relay queue gives the sign from behind what it has to do. One that is
// suspended gives it when its session's back ends have answered or the session's
// patience is at an end, so draining ends whatever they do. What is submitted
// meanwhile is not waited for; whoever ends the process sees to it that nothing
// is, or that it need not be kept.
//
// The queue of a task that waits for the draining cannot give a sign. It need not:
// what came before that task has run.
void Queues::drain(std::function<void()> done) {
    const platform::SerialQueue* const own = platform::SerialQueue::current();
    auto next = [this, done = std::move(done), own] { drainRelayQueues(done, own); };
    if (own != nullptr && own == serviceQueue().get()) {
        next();
    } else {
        onServiceQueue(std::move(next));
    }
}

void Queues::drainRelayQueues(std::function<void()> done, const platform::SerialQueue* except) {
    const auto last = whenReleased([this, done = std::move(done)] { drainDelayed(done); });
    for (const auto& queue : busyRelayQueues(except)) {
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
