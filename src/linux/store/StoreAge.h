// How old rows are, when the clock that they carry has jumped.
//
// Rows have wall time, which somebody may set forward by days: all of them would look
// old at once, and go. So the age goes by the time that has passed since the daemon
// looked last, sleep of the machine included: a jump forward by more than an hour is
// kept and subtracted while the moment that rows are to be younger than lies before
// it. Setting the clock back again takes it away. Jumps are written into the store,
// for the next run; what the clock did while no daemon ran cannot be told from a
// machine that was switched off, and rows are as old as they look then.
//
// Not thread-safe: the store's writer.
#pragma once

#include <chrono>
#include <cstdint>
#include <vector>

#include "linux/store/StoreDatabase.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

class StoreAge {
public:
    static constexpr double kLeastJump = 3600; // seconds

    // Borrows `clock`.
    explicit StoreAge(const platform::Clock& clock);

    // Looks at the clock, and sees to it that the database knows of its jumps. Requires
    // an open transaction.
    StoreResult update(StoreDatabase& database);
    // There is something that the database does not know of yet.
    bool hasNews();
    // The transaction was committed.
    void noteCommitted() { unwritten_ = false; }
    // Rows of before that are older. Seconds since 1970, by the clock that they carry.
    double oldest(std::chrono::seconds maxAge);

private:
    struct Jump {
        double to; // Where the clock arrived, in seconds since 1970.
        double seconds;
    };

    void look();
    void forward(double to, double seconds);
    void back(double seconds);
    [[nodiscard]] int read(sqlite3* database);
    [[nodiscard]] int write(sqlite3* database);

    const platform::Clock& clock_;
    double wall_;   // when it was looked at last
    double uptime_; // at the same moment
    std::vector<Jump> jumps_;
    std::uint64_t generation_ = 0; // of the database that knows of them
    bool unwritten_ = false;
};

} // namespace halyard::linux_
