// Brings the store's file up, and up again: opens it, notices that it or its log has
// gone, tells damage from a disk that cannot be read, sets a damaged file aside and
// carries over what can be read of it, now or later.
//
// A file is worth more than a second: what SQLite takes for damage may be a disk that
// answers with errors for a while, or with nonsense. So the file is read from end to
// end and opened again before damage is believed, and what cannot be read at all is
// an ordinary failure, after which the writer tries again, for a minute.
//
// Not thread-safe: the store's writer, or whoever opens the store before that starts.
#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "linux/store/StoreDatabase.h"
#include "linux/store/StoreOptions.h"
#include "linux/store/StoreRetention.h"
#include "linux/store/StoreSalvage.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

class StoreKeeper {
public:
    // Borrows everything.
    StoreKeeper(const StoreOptions& options, const platform::Clock& clock, StoreDatabase& database,
                StoreRetention& retention);

    // Opens the file, or a new one in its place when it is damaged.
    StoreResult open();
    // The same where it is not open, or the file has gone.
    StoreResult reopenIfNeeded();
    // Requires a failure that isSuspect(). When this succeeds, the file or a new one is
    // open, and what failed may be tried again.
    StoreResult recover(const StoreFailure& failure);
    static bool isSuspect(const StoreResult& result);
    // Something was written: what looked like damage was none.
    void noteSuccess();
    // Moves what would be lost with the log into the file. Requires no transaction.
    StoreResult keepLog();

    // What was set aside and could not be read is due for another try.
    bool isRereadingDue() const;
    // How long until then.
    std::optional<std::chrono::nanoseconds> untilRereading() const;
    // Requires an open database without a transaction.
    void reread();

private:
    struct Unread {
        std::filesystem::path path;
        platform::SteadyTime due;
        std::chrono::nanoseconds delay;
    };

    StoreResult openFile();
    StoreResult lookAgain(const StoreFailure& failure);
    StoreResult setAside(const StoreFailure& failure, bool readable);
    void findUnread();
    void carryOver(const std::filesystem::path& aside);
    StoreSalvage carry(const std::filesystem::path& aside, SalvageTime time);
    void close();

    const StoreOptions& options_;
    const platform::Clock& clock_;
    StoreDatabase& database_;
    StoreRetention& retention_;
    int looks_ = 0;
    std::string suspicion_;
    std::optional<platform::SteadyTime> unreadableSince_;
    std::vector<std::filesystem::path> toCarry_; // into the file that is opened next
    std::vector<Unread> unread_;
    bool lookedForUnread_ = false;
};

} // namespace halyard::linux_
