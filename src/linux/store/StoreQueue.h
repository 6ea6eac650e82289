// The rows between those who add them and the one thread that writes them.
//
// While the store is healthy nothing is dropped: past the high-water mark the
// queue asks, through the pressure handler, that less be read from clients.
// While the store cannot write, holding clients back would only stop them for
// good, so the queue lets go of the pressure, keeps what fits below the mark and
// counts the rest by reason.
//
// Rows are settled (committed or given up) in the order in which they came, so a
// flush is a place in that order.
#pragma once

#include <array>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <limits>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "common/Mutex.h"
#include "linux/store/StoreLosses.h"
#include "linux/store/StoreRow.h"

namespace halyard::linux_ {

class StoreQueue {
public:
    struct Marks {
        std::size_t highRows = 65536;
        std::size_t lowRows = 32768;
        std::size_t highBytes = 32 * 1024 * 1024;
        std::size_t lowBytes = 16 * 1024 * 1024;
    };
    // A group is ready when one of these is reached.
    struct Window {
        std::chrono::nanoseconds delay = std::chrono::milliseconds(50); // since its first row
        std::size_t rows = 1024;
        std::size_t bytes = std::numeric_limits<std::size_t>::max();
    };
    // What is urgent waits no longer than this, however long the window is.
    static constexpr std::chrono::milliseconds kUrgentDelay{50};
    struct Levels {
        std::size_t rows = 0;
        std::size_t bytes = 0;
        std::size_t unwritten = 0; // The same without those that only close a session.
        StoreLossesByTable lost{};
        std::chrono::nanoseconds oldest{}; // How long the first of them has waited.
    };
    enum class Wake { Rows, Idle, Stopped };
    using PressureHandler = std::function<void(bool)>;

    StoreQueue(Marks marks, Window window, PressureHandler onPressure);

    enum class OnDrop { Count, KeepQuiet };

    // Any thread. False when the row was dropped. `hiddenBytes` is what the row
    // keeps alive beside what can be seen of it.
    bool push(StoreRow row, std::size_t hiddenBytes = 0, OnDrop onDrop = OnDrop::Count)
        HY_EXCLUDES(mutex_);
    // For rows that are few by nature and must not be dropped.
    void pushAlways(StoreRow row) HY_EXCLUDES(mutex_);
    // Calls `done` once every row pushed before is settled, at once when none is
    // waiting.
    void flush(std::function<void()> done) HY_EXCLUDES(mutex_);
    // Holds at once, for the rows that wait as well.
    void setWindow(Window window) HY_EXCLUDES(mutex_);
    // What waits is due soon, however long the window is.
    void hurry() HY_EXCLUDES(mutex_);
    // Makes the writer look after the store even without rows.
    void wake() HY_EXCLUDES(mutex_);
    // What is queued is still handed out; what comes later is dropped as NoStore.
    void stop() HY_EXCLUDES(mutex_);
    bool isStopping() const HY_EXCLUDES(mutex_);

    // Whether rows are being dropped beyond the mark, and why.
    void setFailing(std::optional<StoreLoss> reason) HY_EXCLUDES(mutex_);
    // Whether rows had better come with their final size. Costs next to nothing.
    bool wantsFinishedRows() const { return tight_.load(std::memory_order_relaxed); }
    // What payloads of this client that are not built yet are taken to weigh. Any thread
    // asks, the writer's tells what one has come to.
    platform::SizeExpectation& payloadsOf(const platform::ClientBudgetPtr& client) {
        return client != nullptr ? client->laterBytes() : ownPayloads_;
    }
    Levels levels() const HY_EXCLUDES(mutex_);
    void countLost(StoreLoss reason, StoreTable table) HY_EXCLUDES(mutex_);

    // Writer's thread: waits until there is a group of rows, or its window has passed
    // since the first of fewer rows came, or they are wanted at once. Idle when there is
    // nothing for `idleDelay`, or on wake().
    Wake waitForGroup(std::chrono::nanoseconds idleDelay) HY_EXCLUDES(mutex_);
    // Writer's thread: whole groups, or all there is when it is time for the
    // rest.
    void take(std::vector<StoreItem>& items) HY_EXCLUDES(mutex_);
    // Writer's thread: waits, but not for longer than until stop().
    void pause(std::chrono::nanoseconds delay) HY_EXCLUDES(mutex_);
    // Writer's thread: these, the oldest of those that were taken, are done with.
    void settle(std::span<const StoreItem> rows) HY_EXCLUDES(mutex_);

private:
    using Instant = std::chrono::steady_clock::time_point;
    struct Flush {
        std::uint64_t upTo;
        std::function<void()> done;
    };

    void countLostLocked(StoreLoss reason, StoreTable table) HY_REQUIRES(mutex_);
    void appendLocked(StoreRow&& row, std::size_t bytes) HY_REQUIRES(mutex_);
    bool crowdedLocked() const HY_REQUIRES(mutex_);
    void noteTightLocked() HY_REQUIRES(mutex_);
    void leaveBehindLocked(std::vector<StoreItem>& items, std::size_t rest) HY_REQUIRES(mutex_);
    bool groupReadyLocked() const HY_REQUIRES(mutex_);
    bool isFullLocked() const HY_REQUIRES(mutex_);
    void tellPressure() HY_EXCLUDES(pressureMutex_);
    bool wantsPressure() HY_EXCLUDES(mutex_);

    const Marks marks_;
    const PressureHandler onPressure_;

    mutable Mutex mutex_;
    std::condition_variable_any wakeUp_;
    std::vector<StoreItem> items_ HY_GUARDED_BY(mutex_);
    std::size_t queuedBytes_ HY_GUARDED_BY(mutex_) = 0; // of items_
    Window window_ HY_GUARDED_BY(mutex_);
    Instant firstCame_ HY_GUARDED_BY(mutex_);
    // The same of each whole group behind it, and where in items_ it begins.
    struct GroupStart {
        std::size_t at;
        Instant came;
    };
    std::vector<GroupStart> groupStarts_ HY_GUARDED_BY(mutex_);
    Instant due_ HY_GUARDED_BY(mutex_);
    // When the first of the rows came that are taken and not settled.
    Instant takenCame_ HY_GUARDED_BY(mutex_);
    std::size_t heldRows_ HY_GUARDED_BY(mutex_) = 0; // queued and taken
    std::size_t heldBytes_ HY_GUARDED_BY(mutex_) = 0;
    std::size_t heldCloses_ HY_GUARDED_BY(mutex_) = 0;
    std::uint64_t pushed_ HY_GUARDED_BY(mutex_) = 0;
    std::uint64_t settled_ HY_GUARDED_BY(mutex_) = 0;
    std::vector<Flush> flushes_ HY_GUARDED_BY(mutex_);
    StoreLossesByTable lost_ HY_GUARDED_BY(mutex_){};
    std::optional<StoreLoss> failing_ HY_GUARDED_BY(mutex_);
    bool pressure_ HY_GUARDED_BY(mutex_) = false;
    bool takeAll_ HY_GUARDED_BY(mutex_) = false;
    bool woken_ HY_GUARDED_BY(mutex_) = false;
    bool stopping_ HY_GUARDED_BY(mutex_) = false;

    std::atomic<bool> tight_{false};
    platform::SizeExpectation ownPayloads_; // of the daemon itself
    Mutex pressureMutex_; // Held while the handler runs, so that it is told in order.
    bool toldPressure_ HY_GUARDED_BY(pressureMutex_) = false;
};

} // namespace halyard::linux_
