#include "linux/store/StoreKeeper.h"

#include <algorithm>
#include <thread>
#include <utility>

#include "platform/Log.h"

namespace halyard::linux_ {

StoreKeeper::StoreKeeper(const StoreOptions& options, const platform::Clock& clock,
                         StoreDatabase& database, StoreRetention& retention)
    : options_(options), clock_(clock), database_(database), retention_(retention) {}

bool StoreKeeper::isSuspect(const StoreResult& result) {
    return !result.ok() && (result.failure().isDamage() || result.failure().isUnreadable());
}

StoreResult StoreKeeper::open() {
    StoreResult opened = openFile();
    return isSuspect(opened) ? recover(opened.failure()) : opened;
}

StoreResult StoreKeeper::recover(const StoreFailure& failure) {
    StoreResult result = failure;
    // One look more than it takes to get a new file, which is none to be suspected.
    for (int look = 0; isSuspect(result) && look <= options_.looks; ++look) {
        result = lookAgain(result.failure());
        if (!result.ok()) {
            return result;
        }
        result = openFile();
    }
    return result;
}

StoreResult StoreKeeper::openFile() {
    StoreResult opened = database_.open();
    if (!opened.ok()) {
        return opened;
    }
    if (options_.onOpened) {
        options_.onOpened();
    }
    findUnread();
    for (const std::filesystem::path& aside : std::exchange(toCarry_, {})) {
        carryOver(aside);
    }
    return opened;
}

void StoreKeeper::close() {
    retention_.reset();
    database_.abandon();
}

// Success: it is worth trying to open what is at the path now.
StoreResult StoreKeeper::lookAgain(const StoreFailure& failure) {
    close();
    if (const int code = storeReadPlainly(options_.path, options_.vfs); code != SQLITE_OK) {
        const platform::SteadyTime now = clock_.steadyTime();
        unreadableSince_ = unreadableSince_.value_or(now);
        if (now - *unreadableSince_ >= options_.unreadableFor) {
            return setAside(failure, false);
        }
        return StoreFailure{{std::errc::io_error, "it cannot be read: " + failure.text},
                            SQLITE_IOERR_READ};
    }
    unreadableSince_.reset();
    suspicion_ = failure.text;
    if (++looks_ < options_.looks) {
        std::this_thread::sleep_for(options_.lookPause * looks_);
        return {};
    }
    return failure.isDamage() ? setAside(failure, true) : StoreResult(failure);
}

StoreResult StoreKeeper::setAside(const StoreFailure& failure, bool readable) {
    const char* const what = readable ? "is damaged" : "cannot be read";
    const auto aside = storeSetAside(options_.path, clock_.wallTime());
    if (!aside.ok()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "{} {} and cannot be set aside: {}",
                     options_.path.string(), what, aside.failure().message());
        return failure;
    }
    HY_LOG_ERROR(HYReportingPlatformCategory, "{} {}, set aside as {}: {}", options_.path.string(),
                 what, aside.value().filename().string(), failure.text);
    looks_ = 0;
    unreadableSince_.reset();
    toCarry_.push_back(aside.value());
    return {};
}

void StoreKeeper::noteSuccess() {
    if (looks_ > 0) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "{} looked damaged and is not: {}",
                       options_.path.string(), suspicion_);
    }
    looks_ = 0;
    unreadableSince_.reset();
}

StoreSalvage StoreKeeper::carry(const std::filesystem::path& aside, SalvageTime time) {
    StoreSalvage salvage = storeCarryOver(aside, database_.handle(), time, options_.vfs);
    HY_LOG_DEFAULT(HYReportingPlatformCategory,
                   "carried over {} rows of {}, failed to read in {} places", salvage.carried,
                   aside.filename().string(), salvage.holes);
    if (!salvage.whole.ok()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "not all rows could be carried over: {}",
                     salvage.whole.failure().text);
    }
    return salvage;
}

void StoreKeeper::carryOver(const std::filesystem::path& aside) {
    const StoreSalvage salvage = carry(aside, SalvageTime::AtOnce);
    (void)database_.takeOver(); // Falls back on the ids' own conflicts.
    if (salvage.unreadable) {
        storeNoteUnread(aside, true);
        database_.leaveRoom();
        unread_.push_back(
            {aside, clock_.steadyTime() + options_.firstRereading, options_.firstRereading});
    }
}

// What an earlier run could not read.
void StoreKeeper::findUnread() {
    if (std::exchange(lookedForUnread_, true)) {
        return;
    }
    for (const std::filesystem::path& aside : storeUnread(options_.path)) {
        unread_.push_back({aside, clock_.steadyTime(), options_.firstRereading});
    }
    if (!unread_.empty()) {
        database_.leaveRoom();
    }
}

std::optional<std::chrono::nanoseconds> StoreKeeper::untilRereading() const {
    if (unread_.empty()) {
        return std::nullopt;
    }
    const auto next =
        std::min_element(unread_.begin(), unread_.end(),
                         [](const Unread& a, const Unread& b) { return a.due < b.due; });
    return std::max<std::chrono::nanoseconds>(next->due - clock_.steadyTime(), {});
}

bool StoreKeeper::isRereadingDue() const {
    const auto left = untilRereading();
    return left && left->count() == 0;
}

void StoreKeeper::reread() {
    const platform::SteadyTime now = clock_.steadyTime();
    std::erase_if(unread_, [this, now](Unread& unread) {
        if (unread.due > now) {
            return false;
        }
        std::error_code gone;
        if (!std::filesystem::exists(unread.path, gone)) {
            storeNoteUnread(unread.path, false);
            return true;
        }
        const bool left = carry(unread.path, SalvageTime::Later).unreadable;
        storeNoteUnread(unread.path, left);
        unread.delay = std::min(unread.delay * 2, options_.lastRereading);
        unread.due = now + unread.delay;
        return !left;
    });
}

StoreResult StoreKeeper::keepLog() {
    if (!database_.hasLostLog()) {
        return {};
    }
    retention_.reset();
    if (StoreResult saved = database_.saveLostLog(); !saved.ok()) {
        return saved;
    }
    HY_LOG_ERROR(HYReportingPlatformCategory,
                 "the write-ahead log of {} was removed or replaced, what was in it is kept",
                 options_.path.string());
    return open();
}

StoreResult StoreKeeper::reopenIfNeeded() {
    if (database_.hasMoved()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "{} was removed or replaced, opening it anew",
                     options_.path.string());
        close();
    }
    if (const StoreResult kept = keepLog(); !kept.ok()) {
        return kept;
    }
    return database_.isOpen() ? StoreResult() : open();
}

} // namespace halyard::linux_
