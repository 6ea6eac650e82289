// A serial queue that owns no thread: it borrows one of a worker's, or of whoever lends
// its own, while it has tasks to run and may run them.
//
// An idle or suspended queue is a few hundred bytes, so each session can have
// its own.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "common/Mutex.h"
#include "linux/queues/Charge.h"
#include "linux/queues/Worker.h"
#include "platform/WorkQueue.h"

namespace halyard::linux_ {

// A queue that runs on a worker's thread once it has been woken, or on one that is lent.
class WakeableQueue : public platform::SerialQueue,
                      public std::enable_shared_from_this<WakeableQueue> {
protected:
    friend class WakeUpScope;

    virtual void wakeWorker() = 0;
    // Instead of wakeWorker(), on a thread that is lent: runs what may run here now.
    virtual void runHere() = 0;
    // At the end of the calling thread's scope; at once outside of any.
    static void wakeSoon(WakeableQueue& queue);
};

// While one lives, queues that the thread submits to are not run before the
// scope ends: they find all of what it submitted, where each task by itself
// would wake a worker that goes back to sleep after it. Scopes may be nested;
// the innermost counts. A thread that blocks within one opens a BlockingSection.
//
// A scope may lend its thread for the work that it leads to: queues that were idle then
// run at its end, here, which for a single request costs less than waking a thread for
// each. What cannot be done at once is left to the workers.
class WakeUpScope {
public:
    enum class Thread { Kept, Lent };
    // For so long, or as long as the last task takes.
    static constexpr std::chrono::milliseconds kLoan{1};

    explicit WakeUpScope(Thread thread = Thread::Kept);
    ~WakeUpScope();
    WakeUpScope(const WakeUpScope&) = delete;
    WakeUpScope& operator=(const WakeUpScope&) = delete;

    // Lets the queues run now; the scope goes on.
    void flush();
    // Ends the loan: what is submitted from now on may wait for something.
    void keepThread() { thread_ = Thread::Kept; }
    // Whether the calling thread's innermost scope lends it.
    static bool lendsThread();

private:
    friend class BlockingSection;
    friend class WakeableQueue;

    // The calling thread's innermost scope; null outside of any.
    static WakeUpScope*& current();
    void runHere();

    WakeUpScope* const outer_;
    Thread thread_;
    std::vector<std::shared_ptr<WakeableQueue>> queues_;
};

class PooledSerialQueue final : public WakeableQueue {
public:
    // Runs a task once a time has passed; see Queues.
    using Timer = std::function<void(std::chrono::nanoseconds, platform::Task)>;

    // Borrows both, which must outlive every queue.
    PooledSerialQueue(Worker& worker, const Timer& timer) : worker_(worker), timer_(timer) {}

    void async(platform::Task task) override HY_EXCLUDES(mutex_);
    void asyncAfter(std::chrono::nanoseconds delay, platform::Task task) override;
    void suspend(std::chrono::nanoseconds limit, platform::Task onTimeout) override
        HY_EXCLUDES(mutex_);
    bool resume(platform::Task first) override HY_EXCLUDES(mutex_);
    void continueWith(platform::Task rest) override HY_EXCLUDES(mutex_);

    // Nothing runs and nothing waits, also not for the end of a suspension.
    bool isIdle() const HY_EXCLUDES(mutex_);

private:
    struct Item {
        platform::Task task;
        ChargePtr charge;
    };

    std::shared_ptr<PooledSerialQueue> shared() {
        return std::static_pointer_cast<PooledSerialQueue>(shared_from_this());
    }
    bool resumeWait(std::uint64_t wait, platform::Task first) HY_EXCLUDES(mutex_);
    void scheduleLocked() HY_REQUIRES(mutex_);
    void wakeWorker() override;
    void runHere() override { drain(); }
    void drain();
    // How many ran: as many as have their turn, or up to the one that suspended the
    // queue or has more to do.
    std::size_t runUntilSuspended(std::vector<Item>& items) HY_EXCLUDES(mutex_);

    Worker& worker_;
    const Timer& timer_;
    mutable Mutex mutex_;
    std::vector<Item> items_ HY_GUARDED_BY(mutex_);
    bool scheduled_ HY_GUARDED_BY(mutex_) = false;
    bool suspended_ HY_GUARDED_BY(mutex_) = false;
    std::uint64_t waits_ HY_GUARDED_BY(mutex_) = 0;
    // Touched only by whoever drains.
    bool suspendCalled_ = false;
    std::optional<Item> rest_; // of the task that ran last
};

} // namespace halyard::linux_
