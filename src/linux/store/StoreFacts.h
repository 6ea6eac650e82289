// What a store says of itself: whose it is (table identity), and since when its owner
// agrees that it may leave the machine (table consent).
//
// Neither is a row that was collected: retention leaves them alone, and a purge makes
// them anew. They are written as soon as it can be, in front of the rows of the same
// group, so that no row is in a file that does not say whether it may leave. What
// cannot be written yet waits here with its time; what was never written counts as
// refused, which is why nothing that is left out may ever say more than that.
//
// setConsent() any thread, the rest the store's writer.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "common/Mutex.h"
#include "linux/store/StoreSqlite.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

class StoreFacts {
public:
    // Borrows `clock`.
    explicit StoreFacts(const platform::Clock& clock) : clock_(clock) {}

    // From now on. The same again changes nothing.
    void setConsent(bool given) HY_EXCLUDES(mutex_);

    // Whether there is something to write to the file that was opened `generation` times.
    bool isDue(std::uint64_t generation) const HY_EXCLUDES(mutex_);
    // SQLite's code. Requires a transaction; whether it was committed is told next.
    [[nodiscard]] int write(sqlite3* database) HY_EXCLUDES(mutex_);
    void noteCommitted(std::uint64_t generation) HY_EXCLUDES(mutex_);

private:
    struct Note {
        bool given;
        double time;
    };

    const platform::Clock& clock_;
    std::size_t written_ = 0; // of waiting_, by the running transaction
    std::optional<std::uint64_t> keptIn_;

    mutable Mutex mutex_;
    std::optional<Note> inForce_ HY_GUARDED_BY(mutex_);
    std::vector<Note> waiting_ HY_GUARDED_BY(mutex_); // given and refused in turn
};

// Makes the tables where there are none, and an identity.
[[nodiscard]] int storeMakeFacts(sqlite3* database);
// A new identity, and of the notes only what was in force, as of `now`. Requires a
// transaction. What was there before may be of any shape.
[[nodiscard]] int storeRenewFacts(sqlite3* database, double now);
// Adds what `from`, which may be damaged, says to what `to` says: its notes in order of
// their times, its identity if there is none. Requires a transaction in `to`. What cannot
// be read is left out; SQLite's code for `to`.
[[nodiscard]] int storeCarryFacts(sqlite3* from, sqlite3* to);

} // namespace halyard::linux_
