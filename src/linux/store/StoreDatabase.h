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
#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <limits>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "common/Json.h"
#include "linux/store/Schema.h"
#include "linux/store/StoreDisk.h"
#include "linux/store/StoreIntake.h"
#include "linux/store/StoreRow.h"
#include "linux/store/StoreSqlite.h"

namespace halyard::linux_ {

class StoreDatabase {
public:
    // Files up to this size are checked when they are opened. Damage in a larger
    // one shows when its pages are used.
    static constexpr std::uint64_t kCheckedBytes = 64 * 1024 * 1024;

    // Twice SQLite's saves a good part of the work for log and file when rows are many.
    static constexpr int kPageBytes = 8192;

    struct Settings {
        std::filesystem::path path;
        std::chrono::milliseconds busyTimeout{1000};
        const char* vfs = nullptr;  // SQLite's default
        int pageBytes = kPageBytes; // of a new file
    };
    // More ids than any store has used.
    static constexpr std::int64_t kRoomForUnread = std::int64_t{1} << 40;
    struct Inserted {
        StoreTable table{};
        std::int64_t id = 0;
        std::uint64_t bytes = 0; // of its texts and blobs
    };
    using RowCounts = std::array<std::uint64_t, kStoreTables>;

    explicit StoreDatabase(Settings settings);
    ~StoreDatabase();

    // A file of a newer schema is left as it is.
    StoreResult open();
    bool isOpen() const { return database_ != nullptr; }
    // The file was removed or replaced behind our back.
    bool hasMoved();
    // The write-ahead log or its index was: nobody else will ever see what is in ours.
    bool hasLostLog() const;
    // Moves that into the file, and closes it.
    StoreResult saveLostLog();
    // Without a checkpoint: for a file that is not to be touched any more.
    void abandon();
    // Moves everything from the log into the file first.
    void close();

    // Larger rows are refused, each for itself.
    void setMaxRowBytes(std::uint64_t bytes) { maxRowBytes_ = bytes; }

    StoreResult begin();
    // Requires begin(), and of an analytics event that its payload is built.
    // SQLITE_TOOBIG, SQLITE_CONSTRAINT and SQLITE_MISMATCH concern this row alone,
    // every other error the whole group.
    StoreResult insert(const StoreOpenRow& row);
    StoreResult insert(const StoreCloseRow& row);
    StoreResult insert(const StoreMessageRow& row);
    StoreResult insert(const StoreSingleRow& row);
    StoreResult insert(const StoreAnalyticsRow& row);
    StoreResult insert(const StoreEnergyRow& row);
    StoreResult insert(const StoreMetricRow& row);
    StoreResult insert(const StoreIncidentRow& row);
    StoreResult insert(const StoreRepeatRow& row);
    // The row that the last insert wrote, which of a session's is the message.
    const Inserted& lastInserted() const { return inserted_; }

    // Rows that come in numbers, and may be inserted together with others of their table:
    // once they are ready, which may fail for each as its insert.
    static bool comesInNumbers(const StoreRow& row);
    StoreResult makeReady(const StoreRow& row);
    // By one statement, in this order; none for those that are to be inserted by
    // themselves, because they will be refused. False, and none of them is there, when all
    // are to be. A failure concerns the whole group.
    using Items = std::span<StoreItem* const>;
    using InsertedEach = std::vector<std::optional<Inserted>>;
    Result<bool, StoreFailure> insertTogether(StoreTable table, Items items,
                                              InsertedEach& inserted);
    // Rolls back when it fails.
    StoreResult commit();
    void rollback();
    // What the last commit wrote.
    const RowCounts& committedRows() const { return committedRows_; }

    // How many rows went; open sessions of this run keep theirs, empty. No bytes of
    // rows are left in file or log when it succeeded. Requires no begin().
    Result<std::uint64_t, StoreFailure> purge(double now);

    // Bounds the write-ahead log, which cannot be reused while a reader stays in
    // one transaction. SQLITE_BUSY when a reader keeps more of it than `maxBytes`.
    StoreResult boundLog(std::uint64_t maxBytes, std::uint64_t checkpointBytes);

    std::uint64_t fileBytes() const { return pageCount_ * pageSize_; }
    std::uint64_t logBytes() const { return logPages_ * pageSize_; }

    // For retention and salvage, which work inside our transactions.
    sqlite3* handle() { return database_; }
    // What SQLite says about the code that its last call returned.
    StoreResult resultOf(int code) const;
    // The first upload session of this run, to tell those that nobody will close.
    std::int64_t firstUploadOfRun() const { return firstUpload_; }
    // After rows were brought in from elsewhere, of an earlier run unless this one has
    // written a session already.
    StoreResult takeOver();
    // Ids go on far behind, so that those before are there for rows that could not be
    // read yet.
    void leaveRoom();
    // How often a file was opened.
    std::uint64_t generation() const { return generation_; }

private:
    // Device and number of the log's file and its index's.
    using Companions = std::array<std::pair<std::uint64_t, std::uint64_t>, 2>;

    StoreResult openFile();
    Companions companionsAtPath() const;
    StoreResult configure();
    StoreResult migrate();
    StoreResult check();
    StoreResult prepare();
    StoreResult refreshIds();
    StoreResult closeInterrupted();
    StoreResult execute(const std::string& sql);
    Result<std::int64_t, StoreFailure> query(std::string_view sql);
    StoreResult readPageCounts();
    // Requires a code that is an error.
    StoreFailure failureOf(int code) const;
    int whyNotWritable() const;

    StoreResult ensureUpload(const StoreUploadPtr& upload);
    template <class... Values> StoreResult insertInto(StoreTable table, const Values&... values);
    // The columns of rows that come in numbers; the id stays as it is.
    class Joined;
    void fill(StoreIntake::Cells& cells, const StoreMessageRow& row);
    void fill(StoreIntake::Cells& cells, const StoreSingleRow& row);
    void fill(StoreIntake::Cells& cells, const StoreAnalyticsRow& row);
    StoreResult insertCells(StoreTable table);
    StoreResult runInsert(StoreTable table, std::uint64_t bytes);

    const Settings settings_;
    StoreDisk disk_;
    sqlite3* database_ = nullptr;
    std::array<StoreStatement, kStoreTables> inserts_;
    StoreIntake messages_{storeSchema(StoreTable::UploadMessage)};
    StoreIntake events_{storeSchema(StoreTable::AnalyticsEvent)};
    StoreStatement takeMessages_;
    StoreStatement takeEvents_;
    StoreStatement savepoint_;
    StoreStatement rollBackTo_;
    StoreStatement release_;
    // Of a row that is inserted by itself.
    StoreIntake::Cells cells_ =
        StoreIntake::Cells(1 + storeSchema(StoreTable::UploadMessage).columns.size());
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
    Inserted inserted_;
    std::uint64_t maxRowBytes_ = std::numeric_limits<std::uint64_t>::max();
    std::int64_t firstUpload_ = 0;
    bool wroteUpload_ = false;
    Companions companions_{};
    std::uint64_t generation_ = 0;
    std::uint64_t pageSize_ = 0;
    std::uint64_t pageCount_ = 0;
    std::uint64_t logPages_ = 0;
    std::uint64_t triedLogPages_ = 0;
    JsonWriter payload_;
    JsonWriter sessionInfo_;
    JsonWriter userInfo_;
};

} // namespace halyard::linux_
