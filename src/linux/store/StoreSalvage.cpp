#include "linux/store/StoreSalvage.h"

#include <algorithm>
#include <array>
#include <fmt/chrono.h>
#include <fmt/format.h>
#include <fstream>
#include <limits>
#include <string>
#include <string_view>
#include <vector>

#include "linux/store/Schema.h"
#include "linux/store/StoreFacts.h"

// How rows are saved.
//
// First the old file and its companions get another name, and only then is anything
// read: whatever reading does to a damaged file, the writer has a new one, and the
// next start does not meet the damage again. The write-ahead log goes along, because
// rows that were committed last may be in it alone.
//
// A row is looked for by its id. Reading a table in the order of its ids goes well
// until SQLite meets a page that it cannot use, and says so without telling how many
// rows that page had. So the next attempt begins a few ids further on, then twice as
// far, and so on; the first row that is found resets the distance. A page that is
// lost costs its own rows and less than as many again behind it; a page of the tree
// above it costs no more, since ids behind it are found by their own way down.
//
// What SQLite reads may still be nonsense. A row whose columns do not hold what the
// daemon writes there is left out, rather than given to readers who trust the rest.
//
// Ids stay, so that messages find their sessions. Rows go into the new file in
// several transactions: when it is full half way, what was saved so far is kept, and
// the damaged file is there for whoever wants the rest.
namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kMark = ".damaged-";
constexpr std::string_view kUnreadMark = "-unread";
// The last is ours, see storeNoteUnread().
constexpr std::array<std::string_view, 3> kCompanions = {"-wal", "-shm", kUnreadMark};
constexpr std::uint64_t kRowsPerCommit = 4096;
// Behind a hole the next row is looked for this far on, then twice as far and
// so on: the first step is less than a page's worth of rows.
constexpr std::int64_t kFirstStep = 4;
constexpr std::int64_t kLargestStep = std::int64_t{1} << 40;
// Of a file in which sessions did not say it.
constexpr const char* kSayHowEnded = "UPDATE upload_session SET ended = 'stopped' "
                                     "WHERE closed IS NOT NULL AND ended IS NULL";

// The columns that the table has in this file, which an older schema, or somebody else,
// may have made.
std::vector<std::string> columnsOf(sqlite3* database, std::string_view table) {
    std::vector<std::string> names;
    StoreStatement info;
    if (info.prepare(database, fmt::format("SELECT name FROM pragma_table_info('{}')", table)) ==
        SQLITE_OK) {
        while (info.step() == SQLITE_ROW) {
            names.emplace_back(info.text(0));
        }
    }
    return names;
}

// `name`, or NULL where the file has no such column.
std::string_view readable(std::string_view name, const std::vector<std::string>& present) {
    return std::find(present.begin(), present.end(), name) != present.end() ? name : "NULL";
}

std::string readableColumns(const StoreTableSchema& table,
                            const std::vector<std::string>& present) {
    std::string names = "id";
    for (const StoreColumn& column : table.columns) {
        names.append(", ").append(readable(column.name, present));
    }
    return names;
}

// What is true of every row that the daemon wrote, and seldom of what damage left.
std::string validity(const StoreTableSchema& table, const std::vector<std::string>& present) {
    std::string sql = "1";
    for (const auto& column : table.columns) {
        const std::string_view name = readable(column.name, present);
        switch (column.holds) {
        case StoreColumn::Holds::Anything:
            break;
        case StoreColumn::Holds::Integer:
            sql += fmt::format(" AND typeof({}) = 'integer'", name);
            break;
        case StoreColumn::Holds::Json:
            sql += fmt::format(" AND json_valid({})", name);
            break;
        case StoreColumn::Holds::JsonOrNull:
            sql += fmt::format(" AND ({0} IS NULL OR json_valid({0}))", name);
            break;
        }
    }
    return sql;
}

std::string stampOf(platform::WallTime now) {
    const auto seconds = std::chrono::floor<std::chrono::seconds>(now);
    return fmt::format("{:%Y%m%dT%H%M%SZ}", fmt::gmtime(seconds.time_since_epoch().count()));
}

bool isCompanion(std::string_view name) {
    return std::any_of(kCompanions.begin(), kCompanions.end(),
                       [name](std::string_view end) { return name.ends_with(end); });
}

void removeOldest(const fs::path& path) {
    std::vector<fs::path> kept;
    std::error_code ignored;
    const std::string prefix = path.filename().string() + std::string(kMark);
    for (const auto& entry : fs::directory_iterator(path.parent_path(), ignored)) {
        const std::string name = entry.path().filename().string();
        if (name.starts_with(prefix) && !isCompanion(name)) {
            kept.push_back(entry.path());
        }
    }
    std::sort(kept.begin(), kept.end());
    for (std::size_t i = 0; i + kDamagedStoresKept < kept.size(); ++i) {
        fs::remove(kept[i], ignored);
        for (const std::string_view companion : kCompanions) {
            fs::remove(kept[i].string() + std::string(companion), ignored);
        }
    }
}

// What reading left beside a file that had no write-ahead log.
void removeEmptyCompanions(const fs::path& path) {
    std::error_code error;
    if (fs::file_size(path.string() + "-wal", error) == 0 && !error) {
        fs::remove(path.string() + "-wal", error);
        fs::remove(path.string() + "-shm", error);
    }
}

class TableCarrier {
public:
    TableCarrier(const StoreTableSchema& table, std::string_view verb, sqlite3* from, sqlite3* to,
                 StoreSalvage& result)
        : columns_(static_cast<int>(table.columns.size()) + 1), to_(to), result_(result) {
        const auto present = columnsOf(from, table.name);
        // A table of a later schema than the file's is no loss.
        absent_ = present.empty() && table.since > 1;
        readable_ =
            read_.prepare(from, fmt::format("SELECT {}, {} FROM {} WHERE id > ? ORDER BY id",
                                            readableColumns(table, present),
                                            validity(table, present), table.name));
        code_ = insert_.prepare(to, storeInsert(table, verb));
    }

    // SQLite's code for the new database.
    [[nodiscard]] int run() {
        if (readable_ == SQLITE_OK) {
            carryAll();
        } else if (!absent_) {
            noteFailure(readable_);
            ++result_.holes;
        }
        return code_;
    }

private:
    void noteFailure(int code) {
        const int primary = code & 0xFF;
        result_.unreadable =
            result_.unreadable || primary == SQLITE_IOERR || primary == SQLITE_CANTOPEN;
    }
    void carryAll() {
        std::int64_t step = 0;
        while (code_ == SQLITE_OK && step <= kLargestStep) {
            const std::int64_t from = last_;
            if (readFrom(last_ > std::numeric_limits<std::int64_t>::max() - step ? last_
                                                                                 : last_ + step)) {
                return;
            }
            result_.holes += last_ != from || step == 0 ? 1 : 0;
            step = last_ != from || step == 0 ? kFirstStep : step * 2;
        }
    }

    // True when it came to the end of the table.
    bool readFrom(std::int64_t id) {
        read_.bind(1, id);
        int code = read_.step();
        for (; code == SQLITE_ROW && code_ == SQLITE_OK; code = read_.step()) {
            last_ = read_.integer(0);
            if (read_.integer(columns_) == 1) {
                carry();
            } else {
                ++result_.holes;
            }
        }
        read_.reset();
        if (code != SQLITE_DONE && code != SQLITE_ROW) {
            noteFailure(code);
        }
        return code == SQLITE_DONE;
    }

    void carry() {
        for (int i = 0; i < columns_; ++i) {
            insert_.bindColumn(i + 1, read_, i);
        }
        code_ = insert_.run();
        if (sqlite3_changes(to_) == 0) {
            return; // It was there.
        }
        if (code_ == SQLITE_OK && ++result_.carried % kRowsPerCommit == 0) {
            code_ = sqlite3_exec(to_, "COMMIT; BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
        }
    }

    const int columns_; // with the id
    sqlite3* to_;
    StoreSalvage& result_;
    StoreStatement read_;
    StoreStatement insert_;
    int readable_ = SQLITE_OK;
    bool absent_ = false;
    int code_ = SQLITE_OK;
    std::int64_t last_ = 0;
};

} // namespace

Result<fs::path> storeSetAside(const fs::path& path, platform::WallTime now) {
    std::error_code error;
    const std::string base = path.string() + std::string(kMark) + stampOf(now);
    fs::path aside = base;
    for (int i = 2; fs::exists(aside, error); ++i) {
        aside = fmt::format("{}-{}", base, i);
    }
    fs::rename(path, aside, error);
    if (error) {
        return Failure{static_cast<std::errc>(error.value())};
    }
    for (const std::string_view companion : kCompanions) {
        std::error_code absent;
        fs::rename(path.string() + std::string(companion), aside.string() + std::string(companion),
                   absent);
    }
    removeOldest(path);
    return aside;
}

namespace {

// Of sessions that were brought in later: those that are open live here.
constexpr const char* kRememberOpen =
    "CREATE TEMP TABLE live AS SELECT id FROM upload_session WHERE closed IS NULL";
constexpr const char* kCloseOthers =
    "UPDATE upload_session SET ended = 'interrupted', closed = coalesce((SELECT max(time) FROM "
    "upload_message WHERE upload_session = upload_session.id), opened) "
    "WHERE closed IS NULL AND id NOT IN temp.live; DROP TABLE temp.live";

int run(sqlite3* database, const char* sql) {
    return sqlite3_exec(database, sql, nullptr, nullptr, nullptr);
}

int carryTables(sqlite3* from, sqlite3* fresh, SalvageTime time, StoreSalvage& result) {
    const bool later = time == SalvageTime::Later;
    const char* const verb = later ? "INSERT OR IGNORE" : "INSERT OR REPLACE";
    int code = later ? run(fresh, kRememberOpen) : SQLITE_OK;
    code = code == SQLITE_OK ? run(fresh, "BEGIN IMMEDIATE") : code;
    for (const StoreTableSchema& table : kStoreSchema) {
        code = code == SQLITE_OK ? TableCarrier(table, verb, from, fresh, result).run() : code;
    }
    code = code == SQLITE_OK ? storeCarryFacts(from, fresh) : code;
    code = code == SQLITE_OK ? run(fresh, kSayHowEnded) : code;
    if (sqlite3_get_autocommit(fresh) == 0) {
        const int committed = run(fresh, "COMMIT");
        code = code == SQLITE_OK ? committed : code;
    }
    return code == SQLITE_OK && later ? run(fresh, kCloseOthers) : code;
}

} // namespace

StoreSalvage storeCarryOver(const fs::path& damaged, sqlite3* fresh, SalvageTime time,
                            const char* vfs) {
    StoreSalvage result;
    sqlite3* from = nullptr;
    if (sqlite3_open_v2(damaged.c_str(), &from, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, vfs) ==
        SQLITE_OK) {
        sqlite3_db_config(from, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
        // A table of contents that contradicts the file is what we came for.
        run(from, "PRAGMA writable_schema = ON");
        if (const int code = carryTables(from, fresh, time, result); code != SQLITE_OK) {
            result.whole = StoreFailure{{{}, sqlite3_errstr(code)}, code};
        }
    } else {
        ++result.holes;
        result.unreadable = true;
    }
    sqlite3_close(from);
    removeEmptyCompanions(damaged);
    return result;
}

void storeNoteUnread(const fs::path& aside, bool unread) {
    const fs::path mark = aside.string() + std::string(kUnreadMark);
    std::error_code absent;
    if (unread) {
        std::ofstream(mark).flush();
    } else {
        fs::remove(mark, absent);
    }
}

std::vector<fs::path> storeUnread(const fs::path& path) {
    std::vector<fs::path> found;
    std::error_code ignored;
    const std::string prefix = path.filename().string() + std::string(kMark);
    for (const auto& entry : fs::directory_iterator(path.parent_path(), ignored)) {
        std::string name = entry.path().filename().string();
        if (name.starts_with(prefix) && name.ends_with(kUnreadMark)) {
            name.resize(name.size() - kUnreadMark.size());
            found.push_back(path.parent_path() / name);
        }
    }
    std::sort(found.begin(), found.end());
    return found;
}

} // namespace halyard::linux_
