// The daemon's work queues on real threads: one for the service queue, a small
// pool for the sessions' relay queues, one for background work.
//
// Any thread. Must outlive every queue it made, and be stopped (by destruction)
// only after those who submit have stopped.
#pragma once

#include <asio/io_context.hpp>
#include <asio/steady_timer.hpp>
#include <list>
#include <memory>
#include <vector>

#include "common/Mutex.h"
#include "linux/queues/ContextQueue.h"
#include "linux/queues/FairSerialQueue.h"
#include "linux/queues/PooledSerialQueue.h"
#include "linux/queues/Pressure.h"
#include "linux/queues/Worker.h"
#include "platform/WorkQueue.h"

namespace halyard::linux_ {

class Queues final : public platform::QueueFactory {
public:
    // More delayed background tasks than the high mark put the daemon under
    // pressure until there are fewer than the low one.
    static constexpr std::size_t kDelayedHighWater = 65536;
    static constexpr std::size_t kDelayedLowWater = 32768;

    // Timers run on `timers`, which is borrowed like `pressure`.
    Queues(asio::io_context& timers, Pressure& pressure);
    ~Queues() override;

    std::shared_ptr<platform::SerialQueue>
    makeSerialQueue(std::string_view name, platform::QueuePriority priority) override;
    platform::WorkQueue& backgroundQueue() override { return background_; }

    // Calls `done`, on some worker, once everything submitted before has run:
    // the service queue's tasks, then what they left to the relay queues, then
    // the delayed background tasks, which do not wait for their moment any more.
    // A task may wait for it, but for one of the background queue: the queue that
    // it is called on counts as drained.
    void drain(std::function<void()> done);

    // Runs a task behind what the service queue has to do now, for whomever.
    void onServiceQueue(platform::Task task) HY_EXCLUDES(mutex_);
    // A client that was held back need not be any more.
    void clientRelieved() HY_EXCLUDES(mutex_);

    // Runs a task on each thread of these queues, soon.
    void onEachThread(const platform::Task& task);

    std::size_t delayedTasks() const { return delayedCount_.load(); }
    // What clients asked for and the service queue has not come to.
    std::size_t waitingRequests() HY_EXCLUDES(mutex_);
    void stop();

private:
    class Background final : public platform::WorkQueue {
    public:
        explicit Background(Queues& owner) : owner_(owner) {}
        void async(platform::Task task) override;
        void asyncAfter(std::chrono::nanoseconds delay, platform::Task task) override;

    private:
        Queues& owner_;
    };
    struct Delayed {
        asio::steady_timer timer;
        platform::Task task;
    };

    void runDelayed(std::list<Delayed>::iterator delayed);
    void addDelayed(std::chrono::nanoseconds delay, platform::Task task);
    std::shared_ptr<FairSerialQueue> serviceQueue() HY_EXCLUDES(mutex_);
    std::vector<std::shared_ptr<PooledSerialQueue>>
    busyRelayQueues(const platform::SerialQueue* except) HY_EXCLUDES(mutex_);
    void drainRelayQueues(std::function<void()> done, const platform::SerialQueue* except);
    void drainDelayed(std::function<void()> done);

    asio::io_context& timers_;
    Pressure& pressure_;
    ContextQueue later_;
    const PooledSerialQueue::Timer timer_;
    Worker service_;
    Worker relay_;
    Worker backgroundWorker_;
    Background background_;
    std::list<Delayed> delayed_; // Only on the thread that runs timers_.
    std::atomic<std::size_t> delayedCount_{0};

    Mutex mutex_;
    std::vector<std::weak_ptr<PooledSerialQueue>> relayQueues_ HY_GUARDED_BY(mutex_);
    std::size_t sweepAt_ HY_GUARDED_BY(mutex_) = 64;
    std::weak_ptr<FairSerialQueue> serviceQueue_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard::linux_
