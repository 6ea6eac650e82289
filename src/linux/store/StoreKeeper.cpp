#include "linux/store/StoreKeeper.h"

#include "linux/store/StoreSalvage.h"
#include "platform/Log.h"

namespace halyard::linux_ {

StoreKeeper::StoreKeeper(const StoreOptions& options, const platform::Clock& clock,
                         StoreDatabase& database, StoreRetention& retention)
    : options_(options), clock_(clock), database_(database), retention_(retention) {}

StoreResult StoreKeeper::open() {
    StoreResult opened = openFile();
    if (!opened.ok() && opened.failure().isDamage()) {
        return replaceDamaged(opened.failure());
    }
    return opened;
}

StoreResult StoreKeeper::openFile() {
    StoreResult opened = database_.open();
    if (opened.ok() && options_.onOpened) {
        options_.onOpened();
    }
    return opened;
}

StoreResult StoreKeeper::replaceDamaged(const StoreFailure& damage) {
    retention_.reset();
    database_.abandon();
    const auto aside = storeSetAside(options_.path, clock_.wallTime());
    if (!aside.ok()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "{} is damaged and cannot be set aside: {}",
                     options_.path.string(), aside.failure().message());
        return damage;
    }
    HY_LOG_ERROR(HYReportingPlatformCategory, "{} is damaged, set aside as {}: {}",
                 options_.path.string(), aside.value().filename().string(), damage.text);
    StoreResult opened = openFile();
    if (opened.ok()) {
        carryOver(aside.value());
    }
    return opened;
}

void StoreKeeper::carryOver(const std::filesystem::path& aside) {
    const StoreSalvage salvage = storeCarryOver(aside, database_.handle());
    HY_LOG_DEFAULT(HYReportingPlatformCategory,
                   "carried over {} rows of {}, failed to read in {} places", salvage.carried,
                   aside.filename().string(), salvage.holes);
    if (!salvage.whole.ok()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "not all rows could be carried over: {}",
                     salvage.whole.failure().text);
    }
    (void)database_.takeOver(); // Falls back on the ids' own conflicts.
}

StoreResult StoreKeeper::reopenIfNeeded() {
    if (database_.hasMoved()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "{} was removed or replaced, opening it anew",
                     options_.path.string());
        retention_.reset();
        database_.abandon();
    }
    return database_.isOpen() ? StoreResult() : open();
}

} // namespace halyard::linux_
