// Reads telemetry.db without the daemon's noticing: read-only, a batch of rows in
// a transaction, and none while the rows are being used.
//
// A reader that stayed in one transaction would keep the write-ahead log from being
// used again, and a listing that waits in a pager would stay for hours. So what is
// read is "each row once, in the order of ids", not one moment of the whole store.
//
// While somebody has the store open, or a write-ahead log lies beside it, SQLite's
// own locks are used. Otherwise it is opened as immutable: nothing is made beside
// it, which the reader's rights might not allow, and whose owner would be wrong.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "linux/store/StoreSqlite.h"
#include "reading/Rows.h"
#include "reading/TimeRange.h"
#include "reading/Trouble.h"

namespace halyard::reading {

class StoreReader {
public:
    static constexpr const char* kFileName = "telemetry.db";

    static Outcome<StoreReader> open(const std::filesystem::path& path);
    ~StoreReader();
    StoreReader(StoreReader&& other) noexcept;
    StoreReader(const StoreReader&) = delete;
    StoreReader& operator=(const StoreReader&) = delete;

    const std::filesystem::path& path() const { return path_; }
    std::int64_t schema() const { return schema_; }
    // Somebody, the daemon most likely, had the store open when this opened it.
    bool isLive() const { return live_; }
    // Whether the file at the path is another one now, or was written to in a way
    // that this reader does not see.
    bool isOutdated() const;
    bool hasColumn(std::string_view table, std::string_view column);
    // Rows of a write-ahead log that cannot be read from here.
    bool isLogMissing() const { return logMissing_; }

    // One pass over a table by rising ids.
    struct Scan {
        std::string table;
        std::string columns;        // after the id, which is always column 0
        std::string condition = ""; // SQL; empty: all rows
        std::int64_t after = 0;     // ids above this
        std::int64_t upTo = INT64_MAX;
    };
    // False: enough.
    using Take = std::function<bool(const Row&)>;
    Outcome<void> forEach(const Scan& scan, const Take& take);

    // The ids of rows whose `column` may be in `range`: (after, upTo]. Ids rise with
    // time, so they are found by halving; rows that were taken up a moment out of order
    // are allowed for, and times of a clock that was not set yet are passed over.
    struct Ids {
        std::int64_t after = 0;
        std::int64_t upTo = INT64_MAX;
    };
    Outcome<Ids> idsIn(const TimeRange& range, std::string_view table, std::string_view column);

    // The first row's number; none when there is no row.
    Outcome<std::optional<std::int64_t>> integer(const std::string& sql);

    sqlite3* handle() { return database_; }
    Trouble troubleOf(int code) const;

private:
    explicit StoreReader(std::filesystem::path path) : path_(std::move(path)) {}
    std::optional<Trouble> openDatabase();
    std::optional<Trouble> readSchema();
    int connect(bool immutable);
    Outcome<std::int64_t> lastBefore(double time, std::string_view table, std::string_view column);

    std::filesystem::path path_;
    sqlite3* database_ = nullptr;
    std::int64_t schema_ = 0;
    bool live_ = false;
    bool immutable_ = false;
    bool logMissing_ = false;
    std::uint64_t inode_ = 0;
    std::int64_t changed_ = 0; // nanoseconds, of an immutable file
    RowBatch batch_;
};

// The process that has the database open, by SQLite's locks; 0 when its id means
// nothing here. None when nobody has.
std::optional<std::int32_t> storeHolder(const std::filesystem::path& path);

} // namespace halyard::reading
