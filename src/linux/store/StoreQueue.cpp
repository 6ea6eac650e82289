#include "linux/store/StoreQueue.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace halyard::linux_ {
namespace {

// Rows' worth of room that the queue keeps for its next burst.
constexpr std::size_t kKeptCapacity = 8192;

bool isClose(const StoreRow& row) {
    return std::holds_alternative<StoreCloseRow>(row);
}

} // namespace

StoreQueue::StoreQueue(Marks marks, Window window, PressureHandler onPressure)
    : marks_(marks), onPressure_(std::move(onPressure)), window_(window) {}

bool StoreQueue::push(StoreRow row, std::size_t hiddenBytes, OnDrop onDrop) {
    const std::size_t bytes = storeBytes(row) + hiddenBytes;
    bool nowCrowded = false;
    {
        const MutexLock lock(mutex_);
        const bool refused = stopping_ || (failing_ && crowdedLocked());
        if (refused) {
            if (onDrop == OnDrop::Count) {
                countLostLocked(failing_.value_or(StoreLoss::NoStore), tableOf(row));
            }
            return false;
        }
        appendLocked(std::move(row), bytes);
        nowCrowded = !pressure_ && !failing_ && crowdedLocked();
    }
    if (nowCrowded) {
        tellPressure();
    }
    return true;
}

void StoreQueue::pushAlways(StoreRow row) {
    const std::size_t bytes = storeBytes(row);
    const MutexLock lock(mutex_);
    if (!stopping_) {
        heldCloses_ += isClose(row) ? 1 : 0;
        appendLocked(std::move(row), bytes);
    }
}

void StoreQueue::appendLocked(StoreRow&& row, std::size_t bytes) {
    if (items_.empty()) {
        firstCame_ = std::chrono::steady_clock::now();
        due_ = firstCame_ + window_.delay;
    } else if (items_.size() % window_.rows == 0) {
        groupStarts_.push_back({items_.size(), std::chrono::steady_clock::now()});
    }
    const bool wasFull = isFullLocked();
    items_.push_back({std::move(row), bytes, platform::ClientBudget::current()});
    // What cannot be written holds nobody back: that would be for good.
    StoreItem& item = items_.back();
    item.isAwaited = item.client != nullptr && !failing_;
    if (item.isAwaited) {
        item.client->begin(platform::ClientBudget::Work::Rows, bytes);
    }
    queuedBytes_ += bytes;
    ++pushed_;
    ++heldRows_;
    heldBytes_ += bytes;
    noteTightLocked();
    // The writer sleeps through what lies between the first row and a full group.
    if (items_.size() == 1 || (!wasFull && isFullLocked())) {
        wakeUp_.notify_one();
    }
}

bool StoreQueue::isFullLocked() const {
    return items_.size() >= window_.rows || queuedBytes_ >= window_.bytes;
}

void StoreQueue::setWindow(Window window) {
    const MutexLock lock(mutex_);
    window_ = window;
    due_ = firstCame_ + window.delay;
    wakeUp_.notify_all();
}

void StoreQueue::hurry() {
    const MutexLock lock(mutex_);
    const Instant soon = std::chrono::steady_clock::now() + kUrgentDelay;
    if (!items_.empty() && soon < due_) {
        due_ = soon;
        wakeUp_.notify_all();
    }
}

void StoreQueue::flush(std::function<void()> done) {
    {
        const MutexLock lock(mutex_);
        if (settled_ != pushed_) {
            flushes_.push_back({pushed_, std::move(done)});
            takeAll_ = true;
            wakeUp_.notify_all();
            return;
        }
    }
    done();
}

void StoreQueue::wake() {
    const MutexLock lock(mutex_);
    woken_ = true;
    wakeUp_.notify_all();
}

void StoreQueue::stop() {
    const MutexLock lock(mutex_);
    stopping_ = true;
    takeAll_ = true;
    wakeUp_.notify_all();
}

bool StoreQueue::isStopping() const {
    const MutexLock lock(mutex_);
    return stopping_;
}

void StoreQueue::setFailing(std::optional<StoreLoss> reason) {
    std::vector<std::pair<platform::ClientBudgetPtr, std::size_t>> released;
    {
        const MutexLock lock(mutex_);
        failing_ = reason;
        noteTightLocked();
        for (StoreItem& item : items_) {
            if (reason && std::exchange(item.isAwaited, false)) {
                released.emplace_back(item.client, item.bytes);
            }
        }
    }
    // Those that the writer has already are one group, which is less than holds a client.
    for (const auto& [client, bytes] : released) {
        client->end(platform::ClientBudget::Work::Rows, 1, bytes);
    }
    tellPressure();
}

bool StoreQueue::crowdedLocked() const {
    return heldRows_ >= marks_.highRows || heldBytes_ >= marks_.highBytes;
}

StoreQueue::Levels StoreQueue::levels() const {
    const MutexLock lock(mutex_);
    const bool taken = heldRows_ > items_.size();
    const auto oldest = heldRows_ == 0
                            ? std::chrono::nanoseconds(0)
                            : std::chrono::steady_clock::now() - (taken ? takenCame_ : firstCame_);
    return {heldRows_, heldBytes_, heldRows_ - heldCloses_, lost_, oldest};
}

void StoreQueue::countLost(StoreLoss reason, StoreTable table) {
    const MutexLock lock(mutex_);
    countLostLocked(reason, table);
}

void StoreQueue::countLostLocked(StoreLoss reason, StoreTable table) {
    ++lost_[static_cast<std::size_t>(table)][static_cast<std::size_t>(reason)];
}

void StoreQueue::noteTightLocked() {
    tight_.store(failing_.has_value() || crowdedLocked(), std::memory_order_relaxed);
}

bool StoreQueue::groupReadyLocked() const {
    return isFullLocked() || takeAll_ || std::chrono::steady_clock::now() >= due_;
}

StoreQueue::Wake StoreQueue::waitForGroup(std::chrono::nanoseconds idleDelay) {
    const MutexLock lock(mutex_);
    while (items_.empty()) {
        if (stopping_) {
            return Wake::Stopped;
        }
        takeAll_ = false;
        if (std::exchange(woken_, false) ||
            wakeUp_.wait_for(mutex_, idleDelay) == std::cv_status::timeout) {
            return Wake::Idle;
        }
    }
    while (!groupReadyLocked()) {
        wakeUp_.wait_until(mutex_, due_);
    }
    return Wake::Rows;
}

void StoreQueue::take(std::vector<StoreItem>& items) {
    items.clear();
    if (items.capacity() > kKeptCapacity) {
        std::vector<StoreItem>().swap(items);
    }
    const MutexLock lock(mutex_);
    const bool all =
        takeAll_ || std::chrono::steady_clock::now() >= due_ || queuedBytes_ >= window_.bytes;
    const std::size_t rest = all ? 0 : items_.size() % window_.rows;
    items.swap(items_);
    takeAll_ = false;
    takenCame_ = firstCame_;
    queuedBytes_ = 0;
    if (rest != 0) {
        leaveBehindLocked(items, rest);
    }
    groupStarts_.clear();
}

// When the window was changed meanwhile, they may look a little older than they are.
void StoreQueue::leaveBehindLocked(std::vector<StoreItem>& items, std::size_t rest) {
    const std::size_t from = items.size() - rest;
    for (const GroupStart& start : groupStarts_) {
        firstCame_ = start.at <= from ? start.came : firstCame_;
    }
    due_ = firstCame_ + window_.delay;
    const auto cut = std::prev(items.end(), static_cast<std::ptrdiff_t>(rest));
    for (auto item = cut; item != items.end(); ++item) {
        queuedBytes_ += item->bytes;
    }
    std::move(cut, items.end(), std::back_inserter(items_));
    items.erase(cut, items.end());
}

void StoreQueue::pause(std::chrono::nanoseconds delay) {
    const MutexLock lock(mutex_);
    const Instant until = std::chrono::steady_clock::now() + delay;
    while (!stopping_ && wakeUp_.wait_until(mutex_, until) != std::cv_status::timeout) {
    }
}

void StoreQueue::settle(std::span<const StoreItem> rows) {
    std::vector<Flush> finished;
    bool relieved = false;
    std::size_t bytes = 0;
    std::size_t closes = 0;
    for (const StoreItem& item : rows) {
        bytes += item.bytes;
        closes += isClose(item.row) ? 1 : 0;
        if (item.isAwaited) {
            item.client->end(platform::ClientBudget::Work::Rows, 1, item.bytes);
        }
    }
    {
        const MutexLock lock(mutex_);
        settled_ += rows.size();
        heldRows_ -= rows.size();
        heldCloses_ -= closes;
        heldBytes_ -= std::min(bytes, heldBytes_);
        noteTightLocked();
        const auto rest =
            std::find_if(flushes_.begin(), flushes_.end(),
                         [upTo = settled_](const Flush& flush) { return flush.upTo > upTo; });
        std::move(flushes_.begin(), rest, std::back_inserter(finished));
        flushes_.erase(flushes_.begin(), rest);
        relieved = pressure_;
    }
    if (relieved) {
        tellPressure();
    }
    for (const Flush& flush : finished) {
        flush.done();
    }
}

bool StoreQueue::wantsPressure() {
    const MutexLock lock(mutex_);
    if (failing_) {
        pressure_ = false;
    } else if (crowdedLocked()) {
        pressure_ = true;
    } else if (heldRows_ <= marks_.lowRows && heldBytes_ <= marks_.lowBytes) {
        pressure_ = false;
    }
    return pressure_;
}

void StoreQueue::tellPressure() {
    const MutexLock lock(pressureMutex_);
    const bool wanted = wantsPressure();
    if (wanted != toldPressure_) {
        toldPressure_ = wanted;
        if (onPressure_) {
            onPressure_(wanted);
        }
    }
}

} // namespace halyard::linux_
