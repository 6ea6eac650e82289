// Brings the store's file up, and up again: opens it, notices that it has gone, sets
// a damaged one aside and carries over what can be read of it.
//
// Not thread-safe: the store's writer, or whoever opens the store before that starts.
#pragma once

#include <filesystem>

#include "linux/store/StoreDatabase.h"
#include "linux/store/StoreOptions.h"
#include "linux/store/StoreRetention.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

class StoreKeeper {
public:
    // Borrows everything.
    StoreKeeper(const StoreOptions& options, const platform::Clock& clock, StoreDatabase& database,
                StoreRetention& retention);

    // A damaged file is replaced.
    StoreResult open();
    StoreResult reopenIfNeeded();
    StoreResult replaceDamaged(const StoreFailure& damage);

private:
    StoreResult openFile();
    void carryOver(const std::filesystem::path& aside);

    const StoreOptions& options_;
    const platform::Clock& clock_;
    StoreDatabase& database_;
    StoreRetention& retention_;
};

} // namespace halyard::linux_
