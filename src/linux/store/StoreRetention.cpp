#include "linux/store/StoreRetention.h"

#include <algorithm>
#include <fmt/format.h>
#include <limits>
#include <string>
#include <string_view>

#include "linux/store/StoreLimits.h"

// How rows go.
//
// When: in the transaction of the rows that come, behind their INSERTs. The bounds
// hold after each commit without anybody looking at them in between, and a group
// that is rolled back has pushed nothing out.
//
// Which: the oldest of all tables together, without an index on time, which would
// cost more than everything else here. Within a table ids rise with time. So each
// table proposes a cut, the row a slab's length behind its oldest; the earliest time
// of the cuts is how far this slab reaches, and each table loses what is before its
// own cut and not younger than that. The table whose cut is earliest, which is the
// busiest one, loses a whole slab; the others what is as old as that and no more.
// A session is as old as its end, which comes after its messages, so these go with
// it or before.
//
// How much: by size, slabs until enough pages are free or kSlabsAtOnce are gone; by
// age, the same for what is too old. A transaction thus stays short whatever the
// limits were set to, and `more` makes the writer come back without rows. Free pages
// are used again; only a file that is well beyond its size gives pages back, a
// MiB's worth or so at a time, because moving them costs more than writing rows.
//
// What stays: open sessions, however old. When nothing but these is left, the store
// is larger than its size and `more` is not set, or the writer would never rest.
namespace halyard::linux_ {
namespace {

// For want of room, no slab takes more than this part of a table: a small store
// keeps most of what it has.
constexpr std::int64_t kSlabShare = 8;
// How much longer than allowed the file may be before pages are given back,
// since moving them costs more than using them again.
constexpr std::int64_t kSlackBytes = 1024 * 1024;
constexpr std::int64_t kSlackShare = 16;

// How old a row is, in seconds since 1970; NULL is too young to go. A session is as
// old as its end, and has none while it is open; one that an earlier run left open
// (its id is below ?2) ended when this run began (?3).
std::string_view ageOf(std::size_t table) {
    if (table == static_cast<std::size_t>(StoreTable::Repeat)) {
        return "last";
    }
    return table == static_cast<std::size_t>(StoreTable::UploadSession)
               ? "coalesce(closed, CASE WHEN id < ?2 THEN ?3 END)"
               : "time";
}

} // namespace

void StoreRetention::reset() {
    for (Table& table : tables_) {
        for (StoreStatement* statement :
             {&table.lowest, &table.highest, &table.timeAt, &table.deleteUpTo}) {
            statement->finalize();
        }
    }
    for (StoreStatement* statement : {&pageCount_, &freePages_, &vacuum_}) {
        statement->finalize();
    }
    database_ = nullptr;
}

int StoreRetention::prepare(sqlite3* database) {
    int code = SQLITE_OK;
    const auto add = [&](StoreStatement& statement, const std::string& sql) {
        if (code == SQLITE_OK) {
            code = statement.prepare(database, sql);
        }
    };
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        const std::string_view name = kStoreSchema[i].name;
        const std::string_view time = ageOf(i);
        Table& table = tables_[i];
        add(table.lowest,
            fmt::format("SELECT id FROM {} WHERE {} IS NOT NULL ORDER BY id LIMIT 1", name, time));
        add(table.highest, fmt::format("SELECT max(id) FROM {}", name));
        add(table.timeAt, fmt::format("SELECT id, {} FROM {} WHERE id <= ?1 AND {} IS NOT NULL "
                                      "ORDER BY id DESC LIMIT 1",
                                      time, name, time));
        add(table.deleteUpTo,
            fmt::format("DELETE FROM {} WHERE id <= ?1 AND {} <= ?4", name, time));
    }
    add(pageCount_, "PRAGMA page_count");
    add(freePages_, "PRAGMA freelist_count");
    StoreStatement size;
    add(size, "PRAGMA page_size");
    if (code == SQLITE_OK && size.step() == SQLITE_ROW) {
        pageSize_ = std::max<std::int64_t>(512, size.integer(0));
    }
    database_ = database;
    return code;
}

StoreResult StoreRetention::trim(StoreDatabase& database, std::uint64_t maxBytes,
                                 std::optional<double> oldest, bool& more) {
    more = false;
    removed_ = {};
    int code = SQLITE_OK;
    if (database_ != database.handle()) {
        reset();
        firstUpload_ = database.firstUploadOfRun();
        code = prepare(database.handle());
    }
    const auto maxPages = static_cast<std::int64_t>(std::max(maxBytes, StoreLimits::kLeastBytes) /
                                                    static_cast<std::uint64_t>(pageSize_));
    code = code == SQLITE_OK ? trimSize(maxPages, more) : code;
    if (code == SQLITE_OK && oldest) {
        code = trimAge(*oldest, more);
    }
    return database.resultOf(code == SQLITE_OK ? shrink(maxPages, more) : code);
}

int StoreRetention::pages(StoreStatement& statement, std::int64_t& result) {
    const int code = statement.step();
    if (code == SQLITE_ROW) {
        result = statement.integer(0);
        statement.reset();
        return SQLITE_OK;
    }
    return code == SQLITE_DONE ? SQLITE_ERROR : code;
}

int StoreRetention::trimSize(std::int64_t maxPages, bool& more) {
    for (int slab = 0;; ++slab) {
        std::int64_t total = 0;
        std::int64_t free = 0;
        int code = pages(pageCount_, total);
        code = code == SQLITE_OK && total > maxPages ? pages(freePages_, free) : code;
        if (code != SQLITE_OK || total - free <= maxPages) {
            return code;
        }
        if (slab == kSlabsAtOnce) {
            more = true;
            return SQLITE_OK;
        }
        std::int64_t deleted = 0;
        code = deleteSlab(std::numeric_limits<double>::max(), kSlabShare, deleted);
        if (code != SQLITE_OK || deleted == 0) {
            return code;
        }
    }
}

int StoreRetention::trimAge(double oldest, bool& more) {
    for (int slab = 0; slab < kSlabsAtOnce; ++slab) {
        std::int64_t deleted = 0;
        const int code = deleteSlab(oldest, 1, deleted);
        if (code != SQLITE_OK || deleted == 0) {
            return code;
        }
    }
    more = true;
    return SQLITE_OK;
}

int StoreRetention::shrink(std::int64_t maxPages, bool& more) {
    const std::int64_t most = kSlackBytes / pageSize_;
    const std::int64_t slack = std::min(most, maxPages / kSlackShare);
    std::int64_t total = 0;
    int code = pages(pageCount_, total);
    if (code != SQLITE_OK || total <= maxPages + slack) {
        return code;
    }
    const std::int64_t excess = std::min(total - maxPages, 4 * most);
    more = more || excess < total - maxPages;
    const std::string sql = fmt::format("PRAGMA incremental_vacuum({})", excess);
    return sqlite3_exec(database_, sql.c_str(), nullptr, nullptr, nullptr);
}

int StoreRetention::findCut(std::size_t index, std::int64_t share, Cut& cut) {
    Table& table = tables_[index];
    if (index == 0) {
        for (StoreStatement* statement : {&table.lowest, &table.timeAt, &table.deleteUpTo}) {
            statement->bind(2, firstUpload_);
            statement->bind(3, startOfRun_);
        }
    }
    int code = table.lowest.step();
    if (code != SQLITE_ROW) {
        return code == SQLITE_DONE ? SQLITE_OK : code;
    }
    const std::int64_t low = table.lowest.integer(0);
    table.lowest.reset();
    std::int64_t high = low;
    code = pages(table.highest, high);
    if (code != SQLITE_OK) {
        return code;
    }
    table.timeAt.bind(1, low + std::clamp<std::int64_t>((high - low) / share, 0, kSlabRows - 1));
    code = table.timeAt.step();
    if (code != SQLITE_ROW) {
        return code == SQLITE_DONE ? SQLITE_OK : code;
    }
    cut = {true, table.timeAt.integer(0), table.timeAt.real(1)};
    table.timeAt.reset();
    return SQLITE_OK;
}

int StoreRetention::deleteSlab(double latest, std::int64_t share, std::int64_t& deleted) {
    std::array<Cut, kStoreTables> cuts;
    double time = latest;
    bool any = false;
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        if (const int code = findCut(i, share, cuts[i]); code != SQLITE_OK) {
            return code;
        }
        any = any || cuts[i].any;
        time = cuts[i].any ? std::min(time, cuts[i].time) : time;
    }
    deleted = 0;
    for (std::size_t i = 0; any && i < kStoreTables; ++i) {
        if (!cuts[i].any) {
            continue;
        }
        tables_[i].deleteUpTo.bind(1, cuts[i].id);
        tables_[i].deleteUpTo.bind(4, time);
        if (const int code = tables_[i].deleteUpTo.run(); code != SQLITE_OK) {
            return code;
        }
        const std::int64_t changes = sqlite3_changes64(database_);
        removed_[i] += static_cast<std::uint64_t>(changes);
        deleted += changes;
    }
    return SQLITE_OK;
}

} // namespace halyard::linux_
