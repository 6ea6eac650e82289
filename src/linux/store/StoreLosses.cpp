#include "linux/store/StoreLosses.h"

#include <numeric>

namespace halyard::linux_ {

std::string_view nameOf(StoreLoss reason) {
    return kStoreLossNames[static_cast<std::size_t>(reason)].inLog;
}

StoreLoss lossOf(const StoreFailure& failure) {
    if (failure.isLock()) {
        return StoreLoss::Locked;
    }
    if (failure.isWantOfSpace()) {
        return StoreLoss::DiskFull;
    }
    return failure.isReadOnly() ? StoreLoss::ReadOnly : StoreLoss::IoError;
}

bool concernsOneRow(const StoreFailure& failure) {
    const int primary = failure.primary();
    return primary == SQLITE_TOOBIG || primary == SQLITE_CONSTRAINT || primary == SQLITE_MISMATCH;
}

std::uint64_t sum(const StoreLosses& losses) {
    return std::accumulate(losses.begin(), losses.end(), std::uint64_t{0});
}

std::uint64_t sum(const StoreLossesByTable& losses) {
    std::uint64_t all = 0;
    for (const StoreLosses& each : losses) {
        all += sum(each);
    }
    return all;
}

} // namespace halyard::linux_
