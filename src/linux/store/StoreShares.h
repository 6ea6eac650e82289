// Nobody's rows push out everybody's: what one upload session keeps in the store has a
// share of it, and so has what one client process keeps elsewhere, such as its events.
// Whoever has more loses the oldest of its own.
//
// What each has is known by the ids of its rows, in stretches, so that it costs neither
// an index nor a column. Of events and the like, whose rows do not say whose they are,
// only large ones are followed, which alone can take much with few rows. What an earlier
// run or a client that has gone has left is only as old as it is.
//
// Nothing is deleted in the transaction that made it too much, but in the next, so that
// a transaction that is rolled back changes nothing here.
//
// Not thread-safe: the store's writer.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <vector>

#include "linux/store/StoreDatabase.h"

namespace halyard::linux_ {

class StoreShares {
public:
    // What of `max_bytes` a session, or the rest of a client, may have; and one row.
    static constexpr std::uint64_t kHolderShare = 4;
    static constexpr std::uint64_t kRowShare = 8;
    // Smaller rows than this are followed as those of sessions only.
    static constexpr std::uint64_t kLargeRow = 4096;

    // A transaction begins.
    void begin() { added_.clear(), cut_.clear(), removed_ = {}; }
    // The row was inserted. `client` may be null.
    void note(const StoreItem& item, const StoreDatabase::Inserted& inserted);
    // Requires an open transaction. Deletes what is beyond shares of `maxBytes`.
    StoreResult trim(StoreDatabase& database, std::uint64_t maxBytes);
    // The transaction was committed. True when somebody has too much by now.
    bool committed(std::uint64_t maxBytes);
    // What the last trim deleted, by table.
    const StoreDatabase::RowCounts& removed() const { return removed_; }

private:
    struct Stretch {
        StoreTable table;
        std::int64_t first;
        std::int64_t last;
        std::uint64_t bytes;
    };
    struct Holding {
        std::weak_ptr<void> holder;
        std::int64_t session = 0;       // the row of an upload session; 0: a client's
        std::vector<Stretch> stretches; // the oldest first
        std::uint64_t bytes = 0;
    };
    struct Added {
        std::shared_ptr<void> holder;
        std::int64_t session;
        StoreDatabase::Inserted row;
    };
    struct Cut {
        const void* holder;
        std::size_t stretches;
    };

    void add(const Added& added, std::uint64_t share);
    StoreResult cut(StoreDatabase& database, const void* holder, Holding& holding,
                    std::uint64_t share);
    void forgetThoseWhoHaveGone();

    std::map<const void*, Holding> holdings_;
    std::vector<Added> added_; // by this transaction
    std::vector<Cut> cut_;
    std::vector<const void*> over_;
    StoreDatabase::RowCounts removed_{};
    std::size_t sweepAt_ = 64;
};

} // namespace halyard::linux_
