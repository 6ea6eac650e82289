// The store's writing side: takes rows out of the queue, writes them in groups,
// and keeps at it when they cannot be written.
//
// Lives in shared ownership of the store and of its threads, because a thread
// that hangs in a dead file system cannot be waited for.
#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "common/Mutex.h"
#include "linux/store/StoreAge.h"
#include "linux/store/StoreDatabase.h"
#include "linux/store/StoreFacts.h"
#include "linux/store/StoreKeeper.h"
#include "linux/store/StoreLimits.h"
#include "linux/store/StoreOptions.h"
#include "linux/store/StoreQueue.h"
#include "linux/store/StoreRetention.h"
#include "linux/store/StoreShares.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

// Where the operator has asked for more than this, groups grow rather than be many.
inline constexpr std::chrono::milliseconds kPromptInterval{500};
StoreQueue::Window storeWindow(const StoreOptions& options, const StoreLimits& limits);

struct StoreStatus {
    bool open = false;
    bool failing = false;
    StoreDatabase::RowCounts rows{}; // stored, by table
    std::uint64_t commits = 0;
    std::size_t queuedRows = 0;
    std::size_t queuedBytes = 0;
    double oldestWaiting = 0; // seconds
    StoreLossesByTable lost{};
    StoreDatabase::RowCounts removed{}; // by retention
    std::uint64_t fileBytes = 0;
    std::uint64_t logBytes = 0;
};

class StoreWriter {
public:
    // Borrows `clock`. `onWork` is called on the writer's thread whenever it begins
    // something that may hang.
    StoreWriter(const StoreOptions& options, const platform::Clock& clock,
                std::shared_ptr<StoreQueue> queue, std::function<void()> onWork);

    // False when there is no store to be had. Before run().
    [[nodiscard]] bool open();
    // The writer's thread, until the queue is stopped and empty.
    void run();
    // Looks whether run() hangs. Any thread.
    void watch();
    bool isWorking() const { return busySince_.load() != 0; }
    // Says what run() has not come to, which will be lost. Any thread.
    void tellUnwritten() const;

    // Removes every row that was committed by then, see StoreDatabase. The answer comes
    // on the writer's thread, or not at all when that has ended.
    using PurgeReply = std::function<void(const Result<std::uint64_t, StoreFailure>&)>;
    void purge(PurgeReply reply) HY_EXCLUDES(mutex_);

    // Runs a task on the writer's thread, when it is not writing.
    void onThread(std::function<void()> task) HY_EXCLUDES(mutex_);

    void setLimits(StoreLimits limits) HY_EXCLUDES(mutex_);
    void setConsent(bool given);
    StoreStatus status() const HY_EXCLUDES(mutex_);

private:
    struct Episode {
        StoreLoss reason;
        platform::SteadyTime began;
        std::uint64_t lostBefore;
    };

    void closeDatabase();
    void writeTaken();
    std::chrono::nanoseconds idleDelay() const HY_EXCLUDES(mutex_);
    void writeGroup(std::span<StoreItem> group);
    void maintain();
    void purgeIfAsked() HY_EXCLUDES(mutex_);
    void runTasks() HY_EXCLUDES(mutex_);
    Result<std::uint64_t, StoreFailure> purgeRows();
    Result<std::uint64_t, StoreFailure> purgeOnce();
    StoreResult attempt(std::span<StoreItem> group);
    StoreResult tryOnce(std::span<StoreItem> group);
    void beginWork();
    StoreResult writeRows(std::span<StoreItem> group);
    StoreResult writeFacts();
    StoreResult insertAll(std::span<StoreItem> group);
    StoreResult insertSome(std::span<StoreItem> items);
    StoreResult insertTogether(StoreTable table, std::span<StoreItem* const> items);
    StoreResult insertOne(StoreItem& item);
    // Of one row: a failure that concerns it alone is noted, others are handed back.
    StoreResult refuse(const StoreItem& item, StoreResult result);
    StoreResult trim(const StoreLimits& bounds, bool ageDue, bool& more);
    void buildPayload(StoreItem& item);
    void noteRemoved() HY_EXCLUDES(mutex_);
    void noteSizes() HY_EXCLUDES(mutex_);
    void settle(std::span<StoreItem> group);
    void giveUp(std::span<StoreItem> group, StoreLoss reason);
    [[nodiscard]] bool isAgeDue() const;

    void beginEpisode(StoreLoss reason, const std::string& text) HY_EXCLUDES(mutex_);
    void endEpisode() HY_EXCLUDES(mutex_);
    StoreLimits limits() const HY_EXCLUDES(mutex_);

    const StoreOptions options_;
    const platform::Clock& clock_;
    const std::shared_ptr<StoreQueue> queue_;
    StoreDatabase database_;
    StoreRetention retention_;
    StoreShares shares_;
    StoreKeeper keeper_;
    StoreAge age_;
    StoreFacts facts_;
    const std::function<void()> onWork_;
    std::vector<StoreItem> taken_;
    std::vector<StoreItem*> messages_; // that wait to be inserted together
    std::vector<StoreItem*> events_;
    StoreDatabase::InsertedEach inserted_;
    std::vector<StoreTable> rejected_; // rows of the running attempt
    std::string rejection_;            // why the last of them was
    bool trimMore_ = false;
    std::chrono::nanoseconds commitTime_{}; // what the last one took
    // Set once stop() has found that rows cannot be written: no more attempts.
    std::optional<StoreLoss> surrendered_;
    platform::SteadyTime agedAt_{};
    std::atomic<bool> limitsChanged_{false};
    std::atomic<std::int64_t> busySince_{0}; // steady time, 0 while not busy

    mutable Mutex mutex_;
    StoreLimits limits_ HY_GUARDED_BY(mutex_);
    std::optional<Episode> episode_ HY_GUARDED_BY(mutex_);
    StoreStatus status_ HY_GUARDED_BY(mutex_);
    std::vector<PurgeReply> purges_ HY_GUARDED_BY(mutex_);
    std::vector<std::function<void()>> tasks_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard::linux_
