// The SQLite file behind the store: its schema, its prepared statements, one
// transaction for each group of rows.
//
// Write-ahead log with synchronous FULL: what a commit returned for survives a
// power cut, and since rows are committed in groups it costs next to nothing.
// There are no further indexes, because each costs more than making the JSON.
// Checkpoints are made here and not by SQLite's own hook, to see how far the log
// has grown.
//
// Not thread-safe: the store's writer, or whoever opens it before that starts.
// Results are SQLite's extended codes unless they say otherwise.
#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "common/Json.h"
#include "linux/store/Schema.h"
#include "linux/store/StoreRow.h"
#include "linux/store/StoreSqlite.h"

namespace halyard::linux_ {

class StoreDatabase {
public:
    // Files up to this size are checked when they are opened. Damage in a larger
    // one shows when its pages are used.
    static constexpr std::uint64_t kCheckedBytes = 64 * 1024 * 1024;

    struct Settings {
        std::filesystem::path path;
        std::chrono::milliseconds busyTimeout{1000};
        const char* vfs = nullptr; // SQLite's default
    };
    enum class Opened {
        Yes,
        Damaged,     // Or no database at all.
        NewerSchema, // Left as it is.
        Refused,     // Read-only, no access, no such folder.
        NotNow,      // Locked, or no space: worth another try.
    };
    using RowCounts = std::array<std::uint64_t, kStoreTables>;

    explicit StoreDatabase(Settings settings);
    ~StoreDatabase();

    [[nodiscard]] Opened open();
    bool isOpen() const { return database_ != nullptr; }
    // The file was removed or replaced behind our back.
    bool hasMoved();
    // Without a checkpoint: for a file that is not to be touched any more.
    void abandon();
    // Moves everything from the log into the file first.
    void close();

    [[nodiscard]] int begin();
    // Requires begin(), and of an analytics event that its payload is built.
    // SQLITE_TOOBIG, SQLITE_CONSTRAINT and SQLITE_MISMATCH concern this row alone,
    // every other error the whole group.
    [[nodiscard]] int insert(const StoreOpenRow& row);
    [[nodiscard]] int insert(const StoreCloseRow& row);
    [[nodiscard]] int insert(const StoreMessageRow& row);
    [[nodiscard]] int insert(const StoreSingleRow& row);
    [[nodiscard]] int insert(const StoreAnalyticsRow& row);
    [[nodiscard]] int insert(const StoreEnergyRow& row);
    [[nodiscard]] int insert(const StoreMetricRow& row);
    [[nodiscard]] int insert(const StoreIncidentRow& row);
    // Rolls back when it fails.
    [[nodiscard]] int commit();
    void rollback();
    // What the last commit wrote.
    const RowCounts& committedRows() const { return committedRows_; }

    // Bounds the write-ahead log, which cannot be reused while a reader stays in
    // one transaction. SQLITE_BUSY when a reader keeps more of it than `maxBytes`.
    [[nodiscard]] int boundLog(std::uint64_t maxBytes, std::uint64_t checkpointBytes);

    // Why the last operation failed, and the system's errno for it.
    const std::string& errorText() const { return errorText_; }
    int errorCode() const { return errorCode_; }
    int systemError() const { return systemError_; }
    std::uint64_t fileBytes() const { return pageCount_ * pageSize_; }
    std::uint64_t logBytes() const { return logPages_ * pageSize_; }

    // For retention and salvage, which work inside our transactions.
    sqlite3* handle() { return database_; }
    // The first upload session of this run, to tell those that nobody will close.
    std::int64_t firstUploadOfRun() const { return firstUpload_; }
    // After rows were brought in from elsewhere.
    [[nodiscard]] int refreshIds();

private:
    Opened openFile();
    [[nodiscard]] int configure();
    [[nodiscard]] int migrate();
    [[nodiscard]] int check();
    [[nodiscard]] int prepare();
    [[nodiscard]] int execute(const std::string& sql);
    [[nodiscard]] int query(std::string_view sql, std::int64_t& result);
    [[nodiscard]] int readPageCounts();
    Opened classify(int code) const;
    // Keeps what SQLite says about `code`, which it returns.
    int note(int code);

    [[nodiscard]] int ensureUpload(const StoreUploadPtr& upload);
    template <class... Values>
    [[nodiscard]] int insertInto(StoreTable table, const Values&... values);

    const Settings settings_;
    sqlite3* database_ = nullptr;
    std::array<StoreStatement, kStoreTables> inserts_;
    StoreStatement closeUpload_;
    StoreStatement findUpload_;
    StoreStatement begin_;
    StoreStatement commit_;
    StoreStatement countPages_;
    std::array<std::int64_t, kStoreTables> nextID_{};
    std::array<std::int64_t, kStoreTables> nextIDBefore_{};
    RowCounts groupRows_{};
    RowCounts committedRows_{};
    std::vector<StoreUploadPtr> groupUploads_;
    std::int64_t firstUpload_ = 0;
    std::uint64_t generation_ = 0;
    std::uint64_t pageSize_ = 0;
    std::uint64_t pageCount_ = 0;
    std::uint64_t logPages_ = 0;
    std::uint64_t triedLogPages_ = 0;
    JsonWriter payload_;
    JsonWriter sessionInfo_;
    JsonWriter userInfo_;
    std::string errorText_;
    int errorCode_ = 0;
    int systemError_ = 0;
};

} // namespace halyard::linux_
