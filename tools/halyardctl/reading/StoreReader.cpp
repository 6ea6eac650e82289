#include "reading/StoreReader.h"

#include <cerrno>
#include <cmath>
#include <fcntl.h>
#include <fmt/format.h>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#include "linux/store/Schema.h"

namespace halyard::reading {
namespace {

namespace fs = std::filesystem;
using linux_::StoreStatement;

// A batch ends with the first of these.
constexpr std::size_t kBatchRows = 512;
constexpr std::size_t kBatchBytes = 512 * 1024;
// Threads hand rows over within moments of taking their time.
constexpr double kDisorder = 2;
// What a clock shows that has not been set since the start of the machine is before
// this: September 2001.
constexpr double kPlausible = 1e9;
constexpr int kBusyMilliseconds = 2000;
// Where SQLite's connections put their locks in a database file.
constexpr off_t kSharedFirst = 0x40000000 + 2;
constexpr off_t kSharedSize = 510;

// A path as SQLite takes it in a URI.
std::string uriOf(const fs::path& path, bool immutable) {
    std::string uri = "file:";
    const std::string whole = fs::absolute(path).native();
    for (const char c : whole) {
        const bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                           (c >= '0' && c <= '9') || c == '/' || c == '.' || c == '-' || c == '_';
        uri += plain ? std::string(1, c) : fmt::format("%{:02X}", static_cast<unsigned char>(c));
    }
    return uri + (immutable ? "?mode=ro&immutable=1" : "?mode=ro");
}

bool hasLog(const fs::path& path) {
    struct stat facts {};
    return ::stat((path.native() + "-wal").c_str(), &facts) == 0 && facts.st_size > 0;
}

Trouble noStore(const fs::path& path) {
    return {Exit::NothingThere,
            fmt::format("no store at {}: halyardd makes it when it first starts; --state names "
                        "another directory",
                        path.native())};
}

Trouble notAllowed(const fs::path& path) {
    return {
        Exit::NotAllowed,
        fmt::format("not allowed to read {}: be its owner, root, or in a group that may read it",
                    path.native())};
}

std::int64_t nanoseconds(const timespec& time) {
    return time.tv_sec * 1'000'000'000 + time.tv_nsec;
}

// Why the file cannot even be looked at.
std::optional<Trouble> troubleOfFile(const fs::path& path, struct stat& facts) {
    const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (file < 0) {
        if (errno == ENOENT || errno == ENOTDIR) {
            return noStore(path);
        }
        return errno == EACCES || errno == EPERM
                   ? notAllowed(path)
                   : Trouble(Exit::Failed, Failure::ofErrno(path.native()).message());
    }
    const bool known = ::fstat(file, &facts) == 0;
    ::close(file);
    if (!known || !S_ISREG(facts.st_mode)) {
        return Trouble(Exit::Failed, fmt::format("{} is no file", path.native()));
    }
    return std::nullopt;
}

} // namespace

std::optional<std::int32_t> storeHolder(const fs::path& path) {
    const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (file < 0) {
        return std::nullopt;
    }
    struct flock lock {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    lock.l_start = kSharedFirst;
    lock.l_len = kSharedSize;
    const bool asked = ::fcntl(file, F_GETLK, &lock) == 0;
    ::close(file);
    return asked && lock.l_type != F_UNLCK ? std::optional<std::int32_t>(lock.l_pid) : std::nullopt;
}

Outcome<StoreReader> StoreReader::open(const fs::path& path) {
    StoreReader reader(path);
    if (auto trouble = reader.openDatabase()) {
        return *std::move(trouble);
    }
    return reader;
}

StoreReader::StoreReader(StoreReader&& other) noexcept
    : path_(std::move(other.path_)), database_(std::exchange(other.database_, nullptr)),
      schema_(other.schema_), live_(other.live_), immutable_(other.immutable_),
      logMissing_(other.logMissing_), inode_(other.inode_), changed_(other.changed_) {}

StoreReader::~StoreReader() {
    sqlite3_close_v2(database_);
}

std::optional<Trouble> StoreReader::openDatabase() {
    struct stat facts {};
    if (auto trouble = troubleOfFile(path_, facts)) {
        return trouble;
    }
    inode_ = facts.st_ino;
    changed_ = nanoseconds(facts.st_mtim);
    // Asked before SQLite has locks of our own on it.
    live_ = storeHolder(path_).has_value();
    const bool logged = hasLog(path_);
    if (facts.st_size == 0 && !logged) {
        return noStore(path_);
    }
    int code = connect(!live_ && !logged);
    if (code == SQLITE_CANTOPEN || code == SQLITE_READONLY_RECOVERY ||
        (code & 0xFF) == SQLITE_CANTOPEN || (code & 0xFF) == SQLITE_READONLY) {
        // The log needs a file beside it that may not be made here.
        logMissing_ = logged;
        code = connect(true);
    }
    if (code != SQLITE_OK) {
        return troubleOf(code);
    }
    return readSchema();
}

int StoreReader::connect(bool immutable) {
    sqlite3_close_v2(std::exchange(database_, nullptr));
    immutable_ = immutable;
    int code = sqlite3_open_v2(uriOf(path_, immutable).c_str(), &database_,
                               SQLITE_OPEN_READONLY | SQLITE_OPEN_URI | SQLITE_OPEN_NOMUTEX |
                                   SQLITE_OPEN_EXRESCODE,
                               nullptr);
    if (code == SQLITE_OK) {
        sqlite3_busy_timeout(database_, kBusyMilliseconds);
        sqlite3_db_config(database_, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
        // The file may come from anywhere, its contents with it.
        code = sqlite3_exec(database_,
                            "PRAGMA trusted_schema = OFF; PRAGMA cell_size_check = ON;"
                            "SELECT count(*) FROM sqlite_schema",
                            nullptr, nullptr, nullptr);
    }
    return code;
}

std::optional<Trouble> StoreReader::readSchema() {
    const auto version = integer("PRAGMA user_version");
    if (!version.ok()) {
        return version.failure();
    }
    schema_ = version.value().value_or(0);
    if (schema_ > linux_::kStoreSchemaVersion) {
        return Trouble(
            Exit::Failed,
            fmt::format("{} has schema {}, which is newer than this halyardctl (it knows "
                        "up to {}): use the one that came with the daemon",
                        path_.native(), schema_, linux_::kStoreSchemaVersion));
    }
    if (schema_ < 1) {
        return Trouble(Exit::Failed, fmt::format("{} is no store of halyardd (its schema is {})",
                                                 path_.native(), schema_));
    }
    return std::nullopt;
}

bool StoreReader::isOutdated() const {
    struct stat facts {};
    if (::stat(path_.c_str(), &facts) != 0 || facts.st_ino != inode_) {
        return true;
    }
    return immutable_ && !logMissing_ && (nanoseconds(facts.st_mtim) != changed_ || hasLog(path_));
}

Trouble StoreReader::troubleOf(int code) const {
    const char* const said = database_ == nullptr ? nullptr : sqlite3_errmsg(database_);
    const std::string text = said == nullptr ? sqlite3_errstr(code) : said;
    const int primary = code & 0xFF;
    if (primary == SQLITE_CORRUPT || primary == SQLITE_NOTADB) {
        if (isOutdated()) {
            return {Exit::Failed,
                    fmt::format("{} changed while it was read: try again", path_.native())};
        }
        Trouble damage(Exit::Failed,
                       fmt::format("{} is damaged ({}): \"halyardctl check\" says how badly, "
                                   "\"check --repair\" saves what can be read",
                                   path_.native(), text));
        damage.isDamage = true;
        return damage;
    }
    if (primary == SQLITE_PERM || primary == SQLITE_AUTH) {
        return notAllowed(path_);
    }
    return {Exit::Failed, fmt::format("cannot read {}: {} ({})", path_.native(), text, code)};
}

bool StoreReader::hasColumn(std::string_view table, std::string_view column) {
    const std::string name(table);
    const std::string of(column);
    return sqlite3_table_column_metadata(database_, nullptr, name.c_str(), of.c_str(), nullptr,
                                         nullptr, nullptr, nullptr, nullptr) == SQLITE_OK;
}

Outcome<void> StoreReader::forEach(const Scan& scan, const Take& take) {
    sqlite3_stmt* raw = nullptr;
    const std::string sql =
        fmt::format("SELECT id, {} FROM {} WHERE id > ?1 AND id <= ?2{} ORDER BY id", scan.columns,
                    scan.table, scan.condition.empty() ? "" : " AND (" + scan.condition + ")");
    int code =
        sqlite3_prepare_v3(database_, sql.c_str(), -1, SQLITE_PREPARE_PERSISTENT, &raw, nullptr);
    const std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> owner(raw, sqlite3_finalize);
    std::int64_t after = scan.after;
    bool more = code == SQLITE_OK;
    RowBatch batch;
    std::swap(batch, batch_); // Its memory; a scan inside `take` has one of its own.
    while (more) {
        batch.clear();
        sqlite3_bind_int64(raw, 1, after);
        sqlite3_bind_int64(raw, 2, scan.upTo);
        while (batch.rows() < kBatchRows && batch.bytes() < kBatchBytes &&
               (code = sqlite3_step(raw)) == SQLITE_ROW) {
            batch.add(raw);
        }
        sqlite3_reset(raw); // The transaction ends here.
        more = code == SQLITE_ROW;
        code = more || code == SQLITE_DONE ? SQLITE_OK : code;
        for (std::size_t i = 0; i < batch.rows(); ++i) {
            after = batch.row(i).integer(0);
            if (!take(batch.row(i))) {
                more = false;
                code = SQLITE_OK;
                break;
            }
        }
    }
    std::swap(batch, batch_);
    return code == SQLITE_OK ? Outcome<void>() : troubleOf(code);
}

Outcome<std::optional<std::int64_t>> StoreReader::integer(const std::string& sql) {
    StoreStatement statement;
    int code = statement.prepare(database_, sql);
    if (code == SQLITE_OK) {
        code = statement.step();
    }
    if (code == SQLITE_ROW) {
        return std::optional<std::int64_t>(statement.integer(0));
    }
    if (code == SQLITE_DONE || code == SQLITE_OK) {
        return std::optional<std::int64_t>();
    }
    return troubleOf(code);
}

// The last id whose row is older than `time`, by halving; 0 when there is none.
Outcome<std::int64_t> StoreReader::lastBefore(double time, std::string_view table,
                                              std::string_view column) {
    const auto least = integer(fmt::format("SELECT min(id) FROM {}", table));
    const auto most = integer(fmt::format("SELECT max(id) FROM {}", table));
    StoreStatement probe;
    const int prepared = probe.prepare(
        database_, fmt::format("SELECT id, {0} FROM {1} WHERE id >= ?1 AND id < ?2 AND {0} >= {2} "
                               "ORDER BY id LIMIT 1",
                               column, table, kPlausible));
    if (!least.ok() || !most.ok() || prepared != SQLITE_OK) {
        return !least.ok() ? least.failure() : !most.ok() ? most.failure() : troubleOf(prepared);
    }
    std::int64_t low = least.value().value_or(1) - 1;
    std::int64_t high = most.value().value_or(0) + 1;
    while (high - low > 1) {
        const std::int64_t middle = low + (high - low) / 2;
        probe.bindFrom(1, middle, high);
        const int code = probe.step();
        if (code != SQLITE_ROW && code != SQLITE_OK && code != SQLITE_DONE) {
            return troubleOf(code);
        }
        if (code == SQLITE_ROW && probe.real(1) < time) {
            low = probe.integer(0);
        } else {
            high = middle;
        }
        probe.reset();
    }
    return low;
}

Outcome<StoreReader::Ids> StoreReader::idsIn(const TimeRange& range, std::string_view table,
                                             std::string_view column) {
    Ids ids;
    if (std::isfinite(range.since)) {
        const auto after = lastBefore(range.since - kDisorder, table, column);
        if (!after.ok()) {
            return after.failure();
        }
        ids.after = after.value();
    }
    if (std::isfinite(range.until)) {
        const auto upTo = lastBefore(range.until + kDisorder, table, column);
        if (!upTo.ok()) {
            return upTo.failure();
        }
        ids.upTo = upTo.value();
    }
    return ids;
}

} // namespace halyard::reading
