// The little of SQLite's interface that the store uses, with owners.
#pragma once

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <sqlite3.h>
#include <string_view>
#include <utility>

#include "common/Result.h"

namespace halyard::linux_ {

// What SQLite refuses, in its words. The code is the system's, where SQLite met one.
struct StoreFailure : Failure {
    int sqlite = SQLITE_ERROR; // SQLite's extended code

    int primary() const { return sqlite & 0xFF; }
    // The file is damaged, or no database at all.
    bool isDamage() const { return primary() == SQLITE_CORRUPT || primary() == SQLITE_NOTADB; }
    bool isWantOfSpace() const {
        const int system = static_cast<int>(code);
        return primary() == SQLITE_FULL || system == ENOSPC || system == EDQUOT;
    }
    bool isLock() const {
        return primary() == SQLITE_BUSY || primary() == SQLITE_LOCKED ||
               primary() == SQLITE_PROTOCOL;
    }
    // What is there cannot be read, now or for good.
    bool isUnreadable() const {
        return sqlite == SQLITE_IOERR_READ || sqlite == SQLITE_IOERR_SHORT_READ ||
               sqlite == SQLITE_IOERR_CORRUPTFS || sqlite == SQLITE_IOERR_DATA;
    }
    bool isReadOnly() const {
        const int system = static_cast<int>(code);
        return primary() == SQLITE_READONLY || system == EROFS || system == EACCES ||
               system == EPERM;
    }
    // Worth another try.
    bool mayPass() const {
        return !isDamage() &&
               (isWantOfSpace() || isLock() || isReadOnly() || primary() == SQLITE_IOERR ||
                primary() == SQLITE_NOMEM || static_cast<int>(code) == EIO);
    }
};
using StoreResult = Result<void, StoreFailure>;

struct StoreBlob {
    std::string_view bytes;
};

// A prepared statement, used over and over. Not thread-safe.
//
// Text and blobs are bound without a copy: they must live until the statement
// has been stepped to its end or reset.
class StoreStatement {
public:
    StoreStatement() = default;
    ~StoreStatement() { sqlite3_finalize(statement_); }
    StoreStatement(StoreStatement&& other) noexcept
        : statement_(std::exchange(other.statement_, nullptr)) {}
    StoreStatement& operator=(StoreStatement&& other) noexcept {
        std::swap(statement_, other.statement_);
        return *this;
    }

    [[nodiscard]] int prepare(sqlite3* database, std::string_view sql) {
        finalize();
        return sqlite3_prepare_v3(database, sql.data(), static_cast<int>(sql.size()),
                                  SQLITE_PREPARE_PERSISTENT, &statement_, nullptr);
    }
    bool isPrepared() const { return statement_ != nullptr; }
    void finalize() {
        sqlite3_finalize(statement_);
        statement_ = nullptr;
    }

    void bind(int index, std::int64_t value) { sqlite3_bind_int64(statement_, index, value); }
    void bind(int index, double value) { sqlite3_bind_double(statement_, index, value); }
    void bind(int index, std::string_view text) {
        sqlite3_bind_text64(statement_, index, text.data(), text.size(), nullptr, SQLITE_UTF8);
    }
    void bind(int index, StoreBlob blob) {
        sqlite3_bind_blob64(statement_, index, blob.bytes.data(), blob.bytes.size(), nullptr);
    }
    void bind(int index, std::nullptr_t) { sqlite3_bind_null(statement_, index); }
    // All parameters from `first` on.
    template <class... Values> void bindFrom(int first, const Values&... values) {
        (bind(first++, values), ...);
    }
    void bindColumn(int index, const StoreStatement& from, int column) {
        sqlite3_bind_value(statement_, index, sqlite3_column_value(from.statement_, column));
    }

    // SQLITE_ROW while there is a row, then SQLITE_DONE; resets at the end and on an error.
    [[nodiscard]] int step() {
        const int code = sqlite3_step(statement_);
        if (code == SQLITE_ROW) {
            return code;
        }
        const int finished = finish(code);
        return finished == SQLITE_OK ? SQLITE_DONE : finished;
    }
    // For statements that give no rows that matter: SQLITE_OK or the error.
    [[nodiscard]] int run() {
        const int code = sqlite3_step(statement_);
        return code == SQLITE_ROW ? finish(SQLITE_OK) : finish(code);
    }
    void reset() { sqlite3_reset(statement_); }

    std::int64_t integer(int column) const { return sqlite3_column_int64(statement_, column); }
    double real(int column) const { return sqlite3_column_double(statement_, column); }
    std::string_view text(int column) const {
        const void* bytes = sqlite3_column_blob(statement_, column);
        return {static_cast<const char*>(bytes),
                static_cast<std::size_t>(sqlite3_column_bytes(statement_, column))};
    }

private:
    int finish(int code) {
        const int later = sqlite3_reset(statement_);
        return code == SQLITE_DONE ? later : code;
    }

    sqlite3_stmt* statement_ = nullptr;
};

} // namespace halyard::linux_
