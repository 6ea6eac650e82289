#include "linux/store/StorePurge.h"

#include <fmt/format.h>
#include <string>

#include "linux/store/Schema.h"
#include "linux/store/StoreFacts.h"

namespace halyard::linux_ {
namespace {

class Purge {
public:
    explicit Purge(sqlite3* database) : database_(database) {}

    template <class Step> void step(Step&& step) { code_ = code_ == SQLITE_OK ? step() : code_; }
    void execute(const std::string& sql) {
        step([&] { return sqlite3_exec(database_, sql.c_str(), nullptr, nullptr, nullptr); });
    }
    void remove(const StoreTableSchema& table, const std::string& which) {
        execute(fmt::format("DELETE FROM {}{}", table.name, which));
        rows_ += code_ == SQLITE_OK ? static_cast<std::uint64_t>(sqlite3_changes64(database_)) : 0;
    }
    void checkpoint() {
        step([&] {
            return sqlite3_wal_checkpoint_v2(database_, nullptr, SQLITE_CHECKPOINT_TRUNCATE,
                                             nullptr, nullptr);
        });
    }
    Result<std::uint64_t, StoreFailure> result() {
        if (code_ == SQLITE_OK) {
            return rows_;
        }
        StoreFailure failure{
            {static_cast<std::errc>(sqlite3_system_errno(database_)), sqlite3_errmsg(database_)},
            code_};
        if (sqlite3_get_autocommit(database_) == 0) {
            (void)sqlite3_exec(database_, "ROLLBACK", nullptr, nullptr, nullptr);
        }
        return failure;
    }

private:
    sqlite3* const database_;
    int code_ = SQLITE_OK;
    std::uint64_t rows_ = 0;
};

} // namespace

Result<std::uint64_t, StoreFailure> storePurge(sqlite3* database, std::int64_t firstOpen,
                                               double now) {
    const std::string open = fmt::format("id >= {} AND closed IS NULL", firstOpen);
    Purge purge(database);
    purge.execute("BEGIN IMMEDIATE");
    for (const StoreTableSchema& table : kStoreSchema) {
        const bool ofSessions = &table == &storeSchema(StoreTable::UploadSession);
        purge.remove(table, ofSessions ? fmt::format(" WHERE NOT ({})", open) : "");
    }
    purge.execute("UPDATE upload_session SET session_info = '{}', user_info = '{}'");
    purge.step([&] { return storeRenewFacts(database, now); });
    purge.execute("COMMIT");
    purge.execute("VACUUM");
    purge.checkpoint();
    return purge.result();
}

} // namespace halyard::linux_
