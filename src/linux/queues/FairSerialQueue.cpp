#include "linux/queues/FairSerialQueue.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace halyard::linux_ {
namespace {

using Clock = std::chrono::steady_clock;

// Tasks after which the queues they submitted to are let go, whatever follows.
constexpr std::size_t kTasksPerWakeUp = 64;

} // namespace

void FairSerialQueue::async(platform::Task task) {
    const ChargePtr& charge = currentCharge();
    const MutexLock lock(mutex_);
    const platform::ClientBudgetPtr client = charge != nullptr ? charge->client() : nullptr;
    LanePtr& lane = lanes_[client.get()];
    if (lane == nullptr) {
        lane = std::make_shared<Lane>();
        lane->client = client;
        turns_.push_back(lane);
    }
    lane->items.push_back({std::move(task), charge, ++submitted_, WakeUpScope::lendsThread()});
    scheduleLocked();
}

void FairSerialQueue::asyncAfter(std::chrono::nanoseconds delay, platform::Task task) {
    timer_(delay, [self = shared_from_this(), task = std::move(task)] { self->async(task); });
}

void FairSerialQueue::asyncBehindAll(platform::Task task) {
    const MutexLock lock(mutex_);
    behind_.push_back({++submitted_, std::move(task)});
    scheduleLocked();
}

void FairSerialQueue::continueWith(platform::Task rest) {
    assert(isCurrent() && !rest_);
    rest_ = Item{std::move(rest), currentCharge(), running_, false};
}

bool FairSerialQueue::hasWorkLocked() const {
    return !suspended_ && (!urgent_.empty() || !turns_.empty() || isNextBehindLocked());
}

void FairSerialQueue::scheduleLocked() {
    if (!scheduled_ && hasWorkLocked()) {
        scheduled_ = true;
        wakeSoon(*this);
    }
}

void FairSerialQueue::wakeWorker() {
    worker_.post([self = std::static_pointer_cast<FairSerialQueue>(shared_from_this())] {
        self->giveTurn();
    });
}

void FairSerialQueue::suspend(std::chrono::nanoseconds limit, platform::Task onTimeout) {
    std::uint64_t wait = 0;
    {
        const MutexLock lock(mutex_);
        assert(!suspended_);
        suspended_ = true;
        suspendCalled_ = true;
        wait = ++waits_;
    }
    timer_(limit, [self = std::static_pointer_cast<FairSerialQueue>(shared_from_this()), wait,
                   onTimeout = std::move(onTimeout)] { (void)self->resumeWait(wait, onTimeout); });
}

bool FairSerialQueue::resume(platform::Task first) {
    std::uint64_t wait = 0;
    {
        const MutexLock lock(mutex_);
        wait = waits_;
    }
    return resumeWait(wait, std::move(first));
}

bool FairSerialQueue::resumeWait(std::uint64_t wait, platform::Task first) {
    const MutexLock lock(mutex_);
    if (!suspended_ || waits_ != wait) {
        return false;
    }
    suspended_ = false;
    urgent_.push_back(std::move(first));
    scheduleLocked();
    return true;
}

void FairSerialQueue::clientRelieved() {
    const MutexLock lock(mutex_);
    turns_.insert(turns_.end(), held_.begin(), held_.end());
    held_.clear();
    scheduleLocked();
}

std::size_t FairSerialQueue::waitingTasks() const {
    const MutexLock lock(mutex_);
    std::size_t tasks = 0;
    for (const auto& [key, lane] : lanes_) {
        tasks += lane->client != nullptr ? lane->items.size() : 0;
    }
    return tasks;
}

bool FairSerialQueue::isNextBehindLocked() const {
    if (behind_.empty()) {
        return false;
    }
    const std::uint64_t number = behind_.front().number;
    return std::all_of(lanes_.begin(), lanes_.end(), [number](const auto& each) {
        return each.second->items.empty() || each.second->items.front().number > number;
    });
}

FairSerialQueue::LanePtr FairSerialQueue::nextLane(platform::Task& urgent) {
    const MutexLock lock(mutex_);
    if (!urgent_.empty()) {
        urgent = std::move(urgent_.front());
        urgent_.pop_front();
        return nullptr;
    }
    if (isNextBehindLocked()) {
        urgent = std::move(behind_.front().task);
        behind_.pop_front();
        return nullptr;
    }
    while (!turns_.empty()) {
        LanePtr lane = std::move(turns_.front());
        turns_.pop_front();
        if (lane->client == nullptr || !lane->client->isBacklogged()) {
            return lane;
        }
        held_.push_back(std::move(lane)); // clientRelieved() brings it back.
    }
    return nullptr;
}

void FairSerialQueue::giveTurn() {
    const Running running(*this);
    suspendCalled_ = false;
    platform::Task urgent;
    const LanePtr lane = nextLane(urgent);
    if (urgent) {
        const WakeUpScope wakeUps;
        urgent();
        urgent = nullptr;
    } else if (lane != nullptr) {
        runLane(*lane, Where::Worker);
        putBack(lane);
    }
    endTurn();
}

void FairSerialQueue::endTurn() {
    const MutexLock lock(mutex_);
    scheduled_ = false;
    scheduleLocked();
}

// The queue is scheduled, so this is its turn as it would be the worker's.
void FairSerialQueue::runHere() {
    LanePtr lane = laneToRunHere();
    if (lane == nullptr) {
        return wakeWorker();
    }
    const Running running(*this);
    suspendCalled_ = false;
    runLane(*lane, Where::Here);
    putBack(std::move(lane));
    endTurn();
}

FairSerialQueue::LanePtr FairSerialQueue::laneToRunHere() {
    const MutexLock lock(mutex_);
    if (suspended_ || !urgent_.empty() || !behind_.empty() || turns_.size() != 1) {
        return nullptr;
    }
    const LanePtr& lane = turns_.front();
    if (!lane->items.front().runsAnywhere ||
        (lane->client != nullptr && lane->client->isBacklogged())) {
        return nullptr;
    }
    LanePtr taken = lane;
    turns_.pop_front();
    return taken;
}

void FairSerialQueue::runLane(Lane& lane, Where where) {
    WakeUpScope wakeUps;
    const Clock::time_point end = Clock::now() + kTurn;
    std::size_t ran = 0;
    do {
        std::optional<Item> item = takeFrom(lane, where);
        if (!item) {
            return;
        }
        if (++ran % kTasksPerWakeUp == 0) {
            wakeUps.flush();
        }
        running_ = item->number;
        const ChargeScope scope(std::move(item->charge));
        item->task();
        item->task = nullptr; // What it holds goes while its charge is current.
    } while (!suspendCalled_ && !rest_ && Clock::now() < end &&
             (lane.client == nullptr || !lane.client->isBacklogged()));
}

std::optional<FairSerialQueue::Item> FairSerialQueue::takeFrom(Lane& lane, Where where) {
    const MutexLock lock(mutex_);
    if (lane.items.empty() || (where == Where::Here && !lane.items.front().runsAnywhere)) {
        return std::nullopt;
    }
    std::optional<Item> item(std::move(lane.items.front()));
    lane.items.pop_front();
    return item;
}

void FairSerialQueue::putBack(LanePtr lane) {
    const MutexLock lock(mutex_);
    if (rest_) {
        lane->items.push_front(std::move(*rest_));
        rest_.reset();
    }
    if (lane->items.empty()) {
        lanes_.erase(lane->client.get());
    } else {
        turns_.push_back(std::move(lane));
    }
}

} // namespace halyard::linux_
