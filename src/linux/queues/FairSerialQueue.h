// A serial queue on which each client has its turn.
//
// Whatever one client asks for in advance, another's request waits for the end of the
// turn, which is some milliseconds, and not for all of it. A client's own tasks stay in
// the order of their submission; the daemon's own count as one more client's. Between
// clients nobody can tell the order anyway, but for those who ask to come behind
// everything that is there: they do.
//
// Whose a task is is said by the charge that is current when it is submitted. A client
// whose earlier work has piled up elsewhere (see ClientBudget) is left out of the turns
// until clientRelieved().
//
// A task that takes long gives others their turn by continueWith().
//
// What a thread submits that it is lent by, and is all there is to do, runs on that
// thread (see WakeUpScope); everything else on the worker.
#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <unordered_map>
#include <vector>

#include "common/Mutex.h"
#include "linux/queues/Charge.h"
#include "linux/queues/PooledSerialQueue.h"

namespace halyard::linux_ {

class FairSerialQueue final : public WakeableQueue {
public:
    // After which others have theirs.
    static constexpr std::chrono::milliseconds kTurn{2};

    // Borrows both, which must outlive every queue.
    FairSerialQueue(Worker& worker, const PooledSerialQueue::Timer& timer)
        : worker_(worker), timer_(timer) {}

    void async(platform::Task task) override HY_EXCLUDES(mutex_);
    void asyncAfter(std::chrono::nanoseconds delay, platform::Task task) override;
    // Runs the task once everything that was submitted before has run.
    void asyncBehindAll(platform::Task task) HY_EXCLUDES(mutex_);
    void suspend(std::chrono::nanoseconds limit, platform::Task onTimeout) override
        HY_EXCLUDES(mutex_);
    bool resume(platform::Task first) override HY_EXCLUDES(mutex_);
    void continueWith(platform::Task rest) override;

    void clientRelieved() HY_EXCLUDES(mutex_);

    // How many tasks of clients wait for their turn, also those of clients held back.
    std::size_t waitingTasks() const HY_EXCLUDES(mutex_);

private:
    struct Item {
        platform::Task task;
        ChargePtr charge;
        std::uint64_t number; // in the order of submission
        bool runsAnywhere;    // else on the worker only
    };
    enum class Where { Worker, Here };
    struct Lane {
        platform::ClientBudgetPtr client; // null: the daemon itself
        std::deque<Item> items;
    };
    using LanePtr = std::shared_ptr<Lane>;
    struct Behind {
        std::uint64_t number;
        platform::Task task;
    };

    void wakeWorker() override;
    void runHere() override HY_EXCLUDES(mutex_);
    bool resumeWait(std::uint64_t wait, platform::Task first) HY_EXCLUDES(mutex_);
    void scheduleLocked() HY_REQUIRES(mutex_);
    bool hasWorkLocked() const HY_REQUIRES(mutex_);
    void giveTurn() HY_EXCLUDES(mutex_);
    // What runs next: null when nothing may.
    LanePtr nextLane(platform::Task& urgent) HY_EXCLUDES(mutex_);
    // The same on a thread that is lent: null when it is the worker's affair.
    LanePtr laneToRunHere() HY_EXCLUDES(mutex_);
    bool isNextBehindLocked() const HY_REQUIRES(mutex_);
    void runLane(Lane& lane, Where where) HY_EXCLUDES(mutex_);
    std::optional<Item> takeFrom(Lane& lane, Where where) HY_EXCLUDES(mutex_);
    void putBack(LanePtr lane) HY_EXCLUDES(mutex_);
    void endTurn() HY_EXCLUDES(mutex_);

    Worker& worker_;
    const PooledSerialQueue::Timer& timer_;
    mutable Mutex mutex_;
    // Those that have items, or whose turn it is.
    std::unordered_map<const void*, LanePtr> lanes_ HY_GUARDED_BY(mutex_);
    std::deque<LanePtr> turns_ HY_GUARDED_BY(mutex_);
    std::vector<LanePtr> held_ HY_GUARDED_BY(mutex_);
    std::deque<Behind> behind_ HY_GUARDED_BY(mutex_);
    std::deque<platform::Task> urgent_ HY_GUARDED_BY(mutex_); // what a wait ended with
    std::uint64_t submitted_ HY_GUARDED_BY(mutex_) = 0;
    bool scheduled_ HY_GUARDED_BY(mutex_) = false;
    bool suspended_ HY_GUARDED_BY(mutex_) = false;
    std::uint64_t waits_ HY_GUARDED_BY(mutex_) = 0;

    // Touched only by whose turn it is.
    bool suspendCalled_ = false;
    std::uint64_t running_ = 0; // the number of the task at hand
    std::optional<Item> rest_;
};

} // namespace halyard::linux_
