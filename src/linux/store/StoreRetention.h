// Keeps the store within its size and age: the oldest rows of all tables go, in
// slabs of about 1,024, as part of the transaction that made them too many.
//
// A slab takes what is older than one moment from every table, so that what
// remains is the last stretch of everything and not whole tables. Sessions that
// are open stay, and no session goes before its messages.
//
// Not thread-safe: the store's writer.
#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <optional>

#include "linux/store/StoreDatabase.h"

namespace halyard::linux_ {

class StoreRetention {
public:
    static constexpr std::int64_t kSlabRows = 1024;
    // What one transaction deletes at most; the rest is for the next ones.
    static constexpr int kSlabsAtOnce = 8;

    // `startOfRun`, in seconds since 1970, stands for the end of the sessions that
    // an earlier run left open.
    explicit StoreRetention(double startOfRun) : startOfRun_(startOfRun) {}

    // Requires an open transaction. Deletes what is too much and, with `oldest` (in
    // seconds since 1970), what is older than that. Sets `more` when there is more
    // to delete than was deleted.
    StoreResult trim(StoreDatabase& database, std::uint64_t maxBytes, std::optional<double> oldest,
                     bool& more);
    // What the last trim deleted, by table.
    const StoreDatabase::RowCounts& removed() const { return removed_; }
    // To be called before the database is closed.
    void reset();

private:
    struct Table {
        StoreStatement lowest;
        StoreStatement highest;
        StoreStatement timeAt;
        StoreStatement deleteUpTo;
    };
    struct Cut {
        bool any = false;
        std::int64_t id = 0; // the last row of the slab
        double time = 0;
    };

    // These return SQLite's codes.
    [[nodiscard]] int prepare(sqlite3* database);
    [[nodiscard]] int pages(StoreStatement& statement, std::int64_t& result);
    [[nodiscard]] int findCut(std::size_t table, std::int64_t share, Cut& cut);
    // Deletes one slab, of rows not younger than `latest` and of no more than one
    // part in `share` of a table.
    [[nodiscard]] int deleteSlab(double latest, std::int64_t share, std::int64_t& deleted);
    [[nodiscard]] int trimSize(std::int64_t maxPages, bool& more);
    [[nodiscard]] int trimAge(double oldest, bool& more);
    [[nodiscard]] int shrink(std::int64_t maxPages, bool& more);

    const double startOfRun_;
    sqlite3* database_ = nullptr;
    std::int64_t firstUpload_ = 0;
    std::array<Table, kStoreTables> tables_;
    StoreDatabase::RowCounts removed_{};
    StoreStatement pageCount_;
    StoreStatement freePages_;
    StoreStatement vacuum_;
    std::int64_t pageSize_ = 4096;
};

} // namespace halyard::linux_
