#include "linux/queues/PooledSerialQueue.h"

#include <cassert>
#include <iterator>
#include <utility>

#include "linux/queues/BlockingSection.h"

namespace halyard::linux_ {
namespace {

// Tasks' worth of room that an idle queue keeps for its next burst.
constexpr std::size_t kKeptCapacity = 16;
// Tasks after which the queues they submitted to are let go, whatever follows.
constexpr std::size_t kTasksPerWakeUp = 64;
// More queues than this are worth waking the workers for.
constexpr std::size_t kMostQueuesHere = 4;
// Tasks after which the worker's other queues have their turn.
constexpr std::size_t kTasksPerTurn = 512;

} // namespace

ChargePtr& currentCharge() {
    thread_local ChargePtr current;
    return current;
}

WakeUpScope*& WakeUpScope::current() {
    thread_local WakeUpScope* innermost = nullptr;
    return innermost;
}

bool WakeUpScope::lendsThread() {
    const WakeUpScope* const scope = current();
    return scope != nullptr && scope->thread_ == Thread::Lent;
}

WakeUpScope::WakeUpScope(Thread thread) : outer_(std::exchange(current(), this)), thread_(thread) {}

// What a queue leaves that ran on a lent thread is done there as well.
WakeUpScope::~WakeUpScope() {
    runHere();
    current() = outer_;
    if (lendsThread()) {
        outer_->queues_.insert(outer_->queues_.end(), queues_.begin(), queues_.end());
    } else {
        flush();
    }
}

void WakeUpScope::runHere() {
    if (thread_ == Thread::Kept || queues_.empty()) {
        return;
    }
    const auto end = std::chrono::steady_clock::now() + kLoan;
    do {
        const auto queue = std::move(queues_.front());
        queues_.erase(queues_.begin());
        queue->runHere();
    } while (!queues_.empty() && queues_.size() <= kMostQueuesHere &&
             std::chrono::steady_clock::now() < end);
    thread_ = Thread::Kept;
}

void WakeUpScope::flush() {
    for (const auto& queue : queues_) {
        queue->wakeWorker();
    }
    queues_.clear();
}

void WakeableQueue::wakeSoon(WakeableQueue& queue) {
    if (WakeUpScope* const scope = WakeUpScope::current()) {
        scope->queues_.push_back(queue.shared_from_this());
    } else {
        queue.wakeWorker();
    }
}

BlockingSection::BlockingSection() : interrupted_(std::exchange(WakeUpScope::current(), nullptr)) {
    for (WakeUpScope* scope = interrupted_; scope != nullptr; scope = scope->outer_) {
        scope->flush();
    }
}

BlockingSection::~BlockingSection() {
    WakeUpScope::current() = interrupted_;
}

void PooledSerialQueue::async(platform::Task task) {
    const MutexLock lock(mutex_);
    items_.push_back({std::move(task), currentCharge()});
    scheduleLocked();
}

void PooledSerialQueue::asyncAfter(std::chrono::nanoseconds delay, platform::Task task) {
    timer_(delay, [self = shared(), task = std::move(task)] { self->async(task); });
}

void PooledSerialQueue::scheduleLocked() {
    if (!scheduled_ && !suspended_) {
        scheduled_ = true;
        wakeSoon(*this);
    }
}

void PooledSerialQueue::wakeWorker() {
    worker_.post([self = shared()] { self->drain(); });
}

void PooledSerialQueue::suspend(std::chrono::nanoseconds limit, platform::Task onTimeout) {
    std::uint64_t wait = 0;
    {
        const MutexLock lock(mutex_);
        assert(!suspended_);
        suspended_ = true;
        suspendCalled_ = true;
        wait = ++waits_;
    }
    timer_(limit, [self = shared(), wait, onTimeout = std::move(onTimeout)] {
        (void)self->resumeWait(wait, onTimeout);
    });
}

bool PooledSerialQueue::resume(platform::Task first) {
    std::uint64_t wait = 0;
    {
        const MutexLock lock(mutex_);
        wait = waits_;
    }
    return resumeWait(wait, std::move(first));
}

bool PooledSerialQueue::resumeWait(std::uint64_t wait, platform::Task first) {
    const MutexLock lock(mutex_);
    if (!suspended_ || waits_ != wait) {
        return false;
    }
    suspended_ = false;
    items_.insert(items_.begin(), Item{std::move(first), nullptr});
    scheduleLocked();
    return true;
}

void PooledSerialQueue::continueWith(platform::Task rest) {
    rest_ = Item{std::move(rest), currentCharge()};
}

bool PooledSerialQueue::isIdle() const {
    const MutexLock lock(mutex_);
    return items_.empty() && !scheduled_ && !suspended_;
}

void PooledSerialQueue::drain() {
    std::vector<Item> items;
    {
        const MutexLock lock(mutex_);
        items.swap(items_);
    }
    const std::size_t ran = runUntilSuspended(items);
    {
        const MutexLock lock(mutex_);
        if (ran < items.size()) {
            // If it has been resumed meanwhile, what it resumed with goes first.
            const auto at = items_.begin() + (suspended_ || !suspendCalled_ ? 0 : 1);
            items_.insert(at, std::make_move_iterator(items.begin() + std::ptrdiff_t(ran)),
                          std::make_move_iterator(items.end()));
        }
        if (rest_) {
            items_.insert(items_.begin(), std::move(*rest_));
            rest_.reset();
        }
        scheduled_ = false;
        if (!items_.empty()) {
            scheduleLocked(); // Behind the worker's other queues: nobody starves.
        } else if (items.capacity() <= kKeptCapacity) {
            items.clear();
            items_.swap(items);
        }
    }
}

std::size_t PooledSerialQueue::runUntilSuspended(std::vector<Item>& items) {
    suspendCalled_ = false;
    const Running running(*this);
    WakeUpScope wakeUps;
    std::size_t ran = 0;
    while (ran < items.size() && ran < kTasksPerTurn && !suspendCalled_ && !rest_) {
        if (ran % kTasksPerWakeUp == 0) {
            wakeUps.flush();
        }
        Item& item = items[ran++];
        const ChargeScope scope(std::move(item.charge));
        item.task();
        item.task = nullptr; // What it holds goes while its charge is current.
    }
    return ran;
}

} // namespace halyard::linux_
