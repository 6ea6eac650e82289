// What of StoreWriter counts rows and tells of them.
#include <algorithm>
#include <utility>

#include "linux/store/StoreWriter.h"
#include "platform/Log.h"

namespace halyard::linux_ {

// While rows wait as long as the operator asks, they must not hold anybody back: a group
// is ready below the low mark.
StoreQueue::Window storeWindow(const StoreOptions& options, const StoreLimits& limits) {
    if (limits.syncInterval <= kPromptInterval) {
        return {limits.syncInterval, options.groupRows, options.marks.lowBytes};
    }
    return {limits.syncInterval, std::max(options.groupRows, options.patientRows),
            options.marks.lowBytes};
}

void StoreWriter::settle(std::span<StoreItem> group) {
    {
        const MutexLock lock(mutex_);
        ++status_.commits;
        for (std::size_t i = 0; i < kStoreTables; ++i) {
            status_.rows[i] += database_.committedRows()[i];
        }
    }
    for (const StoreTable table : rejected_) {
        queue_->countLost(StoreLoss::Rejected, table);
    }
    if (!rejected_.empty()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "the store rejected {} rows: {}",
                     rejected_.size(), rejection_);
    }
    queue_->settle(group);
}

void StoreWriter::giveUp(std::span<StoreItem> group, StoreLoss reason) {
    for (const StoreItem& item : group) {
        if (!std::holds_alternative<StoreCloseRow>(item.row)) {
            queue_->countLost(reason, tableOf(item.row));
        }
    }
    queue_->settle(group);
}

void StoreWriter::tellUnwritten() const {
    HY_LOG_ERROR(HYReportingPlatformCategory, "closing {}, {} rows lost: {}",
                 options_.path.string(), queue_->levels().unwritten, nameOf(StoreLoss::Stuck));
}

void StoreWriter::noteSizes() {
    const MutexLock lock(mutex_);
    status_.fileBytes = database_.fileBytes();
    status_.logBytes = database_.logBytes();
}

void StoreWriter::noteRemoved() {
    const MutexLock lock(mutex_);
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        status_.removed[i] += retention_.removed()[i] + shares_.removed()[i];
    }
}

void StoreWriter::beginEpisode(StoreLoss reason, const std::string& text) {
    bool first = false;
    {
        const MutexLock lock(mutex_);
        first = !episode_;
        if (first) {
            episode_ = Episode{reason, clock_.steadyTime(), sum(queue_->levels().lost)};
        }
        episode_->reason = reason;
        status_.failing = true;
    }
    queue_->setFailing(reason);
    if (first) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "cannot write to {}, trying on: {}: {}",
                     options_.path.string(), nameOf(reason), text);
    }
}

void StoreWriter::endEpisode() {
    std::optional<Episode> ended;
    {
        const MutexLock lock(mutex_);
        ended = std::exchange(episode_, std::nullopt);
        status_.failing = false;
    }
    if (!ended) {
        return;
    }
    queue_->setFailing(std::nullopt);
    const auto seconds =
        std::chrono::duration_cast<std::chrono::seconds>(clock_.steadyTime() - ended->began);
    HY_LOG_DEFAULT(HYReportingPlatformCategory, "writing to {} again after {} s, {} rows lost",
                   options_.path.string(), seconds.count(),
                   sum(queue_->levels().lost) - ended->lostBefore);
}

StoreStatus StoreWriter::status() const {
    const StoreQueue::Levels levels = queue_->levels();
    const MutexLock lock(mutex_);
    StoreStatus status = status_;
    status.queuedRows = levels.rows;
    status.queuedBytes = levels.bytes;
    status.lost = levels.lost;
    status.oldestWaiting = std::chrono::duration<double>(levels.oldest).count();
    return status;
}

} // namespace halyard::linux_
