#include "linux/store/StoreWriter.h"

#include <algorithm>
#include <fmt/format.h>
#include <utility>

#include "platform/Log.h"

// What happens when a group cannot be written.
//
// A group is one transaction, which is repeated as a whole: rows keep their order,
// and none is in the file twice. What may go wrong, and what is lost by it:
//
// - One row is refused for itself (too big): it alone is lost (Rejected), and the
//   rest of its group is written.
// - The disk is full, read-only, locked or broken: nothing of the group is lost. It
//   is tried again and again, at growing intervals. Meanwhile the queue drops what
//   comes beyond its mark, under the reason that was seen last. That is an episode:
//   one line when it begins, one when it ends.
// - The file is gone or another one: it is opened, or made, anew, and the group goes
//   there. Sessions that had a row in the old file get one in the new.
// - The file looks damaged: the keeper looks again, and if need be sets it aside and
//   carries its rows over; the group is written to whatever is open then, in the same
//   attempt. What cannot be read is an ordinary failure.
// - An operation does not come back: this thread cannot tell, so the watch begins the
//   episode, which lets the clients go. The attempt's own end ends it. The end may
//   slip in between the watch's look and its episode, which nobody would end then;
//   therefore the watch looks once more.
// - The daemon ends: one attempt more for the group at hand; when that fails, it and
//   all behind it are given up and counted, without a further attempt for each, since
//   a disk that takes seconds to say no would take them for each group.
//
// Rows are settled only once they are committed or counted as lost, so a flush never
// answers for rows that are neither.
namespace halyard::linux_ {
namespace {

// The write-ahead log is moved into the file at this length, or earlier in a
// small store.
constexpr std::uint64_t kCheckpointBytes = 4 * 1024 * 1024;
constexpr std::uint64_t kLeastCheckpointBytes = 64 * 1024;
// A commit that takes longer makes groups larger.
constexpr std::chrono::milliseconds kSlowCommit{20};
// What a reader that stays in one transaction may make the log grow to, beside
// the size of the store.
constexpr std::uint64_t kLogAllowance = 16 * 1024 * 1024;

int pageBytes(const StoreOptions& options) {
    return options.limits.syncInterval > kPromptInterval ? options.patientPageBytes
                                                         : StoreDatabase::kPageBytes;
}

} // namespace

StoreWriter::StoreWriter(const StoreOptions& options, const platform::Clock& clock,
                         std::shared_ptr<StoreQueue> queue, std::function<void()> onWork)
    : options_(options), clock_(clock), queue_(std::move(queue)),
      database_({options_.path, options_.busyTimeout, options_.vfs, pageBytes(options_)}),
      retention_(platform::secondsSince1970(clock.wallTime())),
      keeper_(options_, clock, database_, retention_), age_(clock), facts_(clock),
      onWork_(std::move(onWork)), limits_(options_.limits) {}

bool StoreWriter::open() {
    const StoreResult opened = keeper_.open();
    const bool usable = opened.ok() || opened.failure().mayPass();
    if (!usable) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "running without a store: {}: {}",
                     options_.path.string(), opened.failure().text);
        queue_->stop();
    } else if (!opened.ok()) {
        beginEpisode(lossOf(opened.failure()), opened.failure().text);
    }
    noteSizes();
    const MutexLock lock(mutex_);
    status_.open = usable;
    return usable;
}

void StoreWriter::closeDatabase() {
    if (surrendered_) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "closing {}, {} rows lost: {}",
                     options_.path.string(), sum(queue_->levels().lost), nameOf(*surrendered_));
    }
    const bool moved = database_.hasMoved();
    if (!surrendered_ && !moved && database_.isOpen() && age_.hasNews()) {
        (void)attempt({}); // The next run could not tell a jump from having been off.
    }
    retention_.reset();
    if (moved || !keeper_.keepLog().ok()) {
        database_.abandon(); // What lies at its path is not ours.
    } else {
        database_.close();
    }
}

void StoreWriter::run() {
    for (;;) {
        purgeIfAsked();
        runTasks();
        switch (queue_->waitForGroup(idleDelay())) {
        case StoreQueue::Wake::Rows:
            queue_->take(taken_);
            writeTaken();
            break;
        case StoreQueue::Wake::Idle:
            maintain();
            break;
        case StoreQueue::Wake::Stopped:
            return closeDatabase();
        }
    }
}

// Without rows there is nothing to do but to let old ones go, and that may wait: a
// machine that sleeps is not woken for it.
std::chrono::nanoseconds StoreWriter::idleDelay() const {
    if (trimMore_ || !database_.isOpen() || database_.hasLostLog() ||
        facts_.isDue(database_.generation())) {
        return trimMore_ ? std::chrono::nanoseconds(0) : options_.lastRetry;
    }
    const auto idle =
        std::clamp<std::chrono::nanoseconds>(limits().maxAge / 10, options_.agePeriod,
                                             std::max(options_.agePeriod, options_.idlePeriod));
    return std::min(idle, keeper_.untilRereading().value_or(idle));
}

// What has piled up is written in fewer and larger groups; all at once on a disk that takes
// long for each commit, so that what has been taken is through in about the time of two.
void StoreWriter::writeTaken() {
    for (std::size_t from = 0; from < taken_.size();) {
        std::size_t rows = std::max(storeWindow(options_, limits()).rows,
                                    options_.groupRows * options_.mostGroups);
        rows = commitTime_ > kSlowCommit ? taken_.size() : rows;
        rows = std::min(rows, taken_.size() - from);
        writeGroup(std::span(taken_).subspan(from, rows));
        from += rows;
    }
    taken_.clear();
}

void StoreWriter::watch() {
    const std::int64_t since = busySince_.load();
    const std::int64_t now = clock_.steadyTime().time_since_epoch().count();
    if (since != 0 && now - since >= options_.stuckAfter.count()) {
        beginEpisode(StoreLoss::Stuck, "no answer");
        if (busySince_.load() != since) {
            endEpisode(); // It came back meanwhile.
        }
    }
}

void StoreWriter::writeGroup(std::span<StoreItem> group) {
    auto delay = options_.firstRetry;
    for (;;) {
        if (surrendered_) {
            return giveUp(group, *surrendered_);
        }
        const StoreResult written = attempt(group);
        if (written.ok()) {
            return settle(group);
        }
        const StoreLoss reason = lossOf(written.failure());
        beginEpisode(reason, written.failure().text);
        if (queue_->isStopping()) {
            surrendered_ = reason;
            continue;
        }
        queue_->pause(delay);
        delay = std::min(delay * 2, options_.lastRetry);
    }
}

void StoreWriter::maintain() {
    if (!limitsChanged_.load() && !trimMore_ && !isAgeDue() && database_.isOpen() &&
        !database_.hasMoved() && !database_.hasLostLog() && !keeper_.isRereadingDue() &&
        !facts_.isDue(database_.generation())) {
        return;
    }
    trimMore_ = false;
    if (const StoreResult done = attempt({}); !done.ok()) {
        beginEpisode(lossOf(done.failure()), done.failure().text);
    } else if (keeper_.isRereadingDue()) {
        beginWork();
        keeper_.reread();
        busySince_.store(0);
    }
}

void StoreWriter::purge(PurgeReply reply) {
    {
        const MutexLock lock(mutex_);
        purges_.push_back(std::move(reply));
    }
    queue_->wake();
}

void StoreWriter::onThread(std::function<void()> task) {
    {
        const MutexLock lock(mutex_);
        tasks_.push_back(std::move(task));
    }
    queue_->wake();
}

void StoreWriter::runTasks() {
    std::vector<std::function<void()>> tasks;
    {
        const MutexLock lock(mutex_);
        tasks.swap(tasks_);
    }
    for (const auto& task : tasks) {
        task();
    }
}

void StoreWriter::purgeIfAsked() {
    std::vector<PurgeReply> asked;
    {
        const MutexLock lock(mutex_);
        asked.swap(purges_);
    }
    if (asked.empty()) {
        return;
    }
    beginWork();
    const auto purged = purgeRows();
    busySince_.store(0);
    noteSizes();
    for (const PurgeReply& reply : asked) {
        reply(purged);
    }
}

Result<std::uint64_t, StoreFailure> StoreWriter::purgeRows() {
    if (const StoreResult open = keeper_.reopenIfNeeded(); !open.ok()) {
        return open.failure();
    }
    auto purged = purgeOnce();
    if (!purged.ok() && purged.failure().isDamage()) {
        const StoreResult recovered = keeper_.recover(purged.failure());
        return recovered.ok() ? purgeOnce() : recovered.failure();
    }
    return purged;
}

void StoreWriter::beginWork() {
    busySince_.store(clock_.steadyTime().time_since_epoch().count());
    if (onWork_) {
        onWork_();
    }
}

// What waits to be noted is older than what the purge notes.
Result<std::uint64_t, StoreFailure> StoreWriter::purgeOnce() {
    const double now = platform::secondsSince1970(clock_.wallTime());
    if (facts_.isDue(database_.generation())) {
        if (const StoreResult written = writeRows({}); !written.ok()) {
            return written.failure();
        }
    }
    return database_.purge(now);
}

StoreResult StoreWriter::attempt(std::span<StoreItem> group) {
    beginWork();
    const StoreResult result = tryOnce(group);
    // The log may have gone while these rows were written into it.
    const StoreResult kept = result.ok() ? keeper_.keepLog() : StoreResult();
    busySince_.store(0);
    if (!kept.ok()) {
        beginEpisode(lossOf(kept.failure()), kept.failure().text);
    } else if (result.ok()) {
        keeper_.noteSuccess();
        noteSizes();
        endEpisode();
    }
    return result;
}

// Once, but for what the keeper thinks is worth another look.
StoreResult StoreWriter::tryOnce(std::span<StoreItem> group) {
    StoreResult result = keeper_.reopenIfNeeded();
    result = result.ok() ? writeRows(group) : result;
    for (int look = 0; StoreKeeper::isSuspect(result) && look <= options_.looks; ++look) {
        result = keeper_.recover(result.failure());
        if (!result.ok()) {
            return result;
        }
        result = writeRows(group);
    }
    return result;
}

StoreResult StoreWriter::writeFacts() {
    return facts_.isDue(database_.generation())
               ? database_.resultOf(facts_.write(database_.handle()))
               : StoreResult();
}

StoreResult StoreWriter::writeRows(std::span<StoreItem> group) {
    const bool ageDue = limitsChanged_.exchange(false) || isAgeDue();
    const StoreLimits bounds = limits();
    bool more = false;
    StoreResult result = database_.boundLog(
        bounds.maxBytes + kLogAllowance,
        std::clamp(bounds.maxBytes / 8, kLeastCheckpointBytes, kCheckpointBytes));
    result = result.ok() ? database_.begin() : result;
    if (!result.ok()) {
        return result;
    }
    database_.setMaxRowBytes(bounds.maxBytes / StoreShares::kRowShare);
    shares_.begin();
    result = writeFacts();
    result = result.ok() ? insertAll(group) : result;
    result = result.ok() ? shares_.trim(database_, bounds.maxBytes) : result;
    result = result.ok() ? trim(bounds, ageDue, more) : result;
    if (!result.ok()) {
        database_.rollback();
        return result;
    }
    const platform::SteadyTime began = clock_.steadyTime();
    result = database_.commit();
    commitTime_ = clock_.steadyTime() - began;
    if (result.ok()) {
        facts_.noteCommitted(database_.generation());
        const bool tooMuch = shares_.committed(bounds.maxBytes);
        trimMore_ = more || tooMuch;
        noteRemoved();
        age_.noteCommitted();
        if (ageDue) {
            agedAt_ = more ? platform::SteadyTime() : clock_.steadyTime();
        }
    }
    return result;
}

StoreResult StoreWriter::trim(const StoreLimits& bounds, bool ageDue, bool& more) {
    if (StoreResult known = age_.update(database_); !known.ok()) {
        return known;
    }
    const auto oldest = ageDue ? std::optional(age_.oldest(bounds.maxAge)) : std::nullopt;
    return retention_.trim(database_, bounds.maxBytes, oldest, more);
}

bool StoreWriter::isAgeDue() const {
    return clock_.steadyTime() - agedAt_ >= options_.agePeriod;
}

void StoreWriter::setLimits(StoreLimits limits) {
    {
        const MutexLock lock(mutex_);
        limits_ = limits;
    }
    queue_->setWindow(storeWindow(options_, limits));
    limitsChanged_ = true;
    queue_->wake();
}

void StoreWriter::setConsent(bool given) {
    facts_.setConsent(given);
    queue_->wake();
}

StoreLimits StoreWriter::limits() const {
    const MutexLock lock(mutex_);
    return limits_;
}

} // namespace halyard::linux_
