#include "linux/store/StoreDatabase.h"

#include <algorithm>
#include <fmt/format.h>
#include <fstream>
#include <string_view>
#include <sys/statvfs.h>
#include <unistd.h>
#include <utility>

#include "linux/store/StorePurge.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

std::string creationOfAll() {
    std::string sql;
    for (const StoreTableSchema& table : kStoreSchema) {
        sql += storeCreateTable(table);
    }
    return sql;
}

// What takes a file of schema N + 1 to N + 2; a new file gets the last at once.
// Each says itself what it makes: the schema that is written down is the last one's.
constexpr std::array<const char*, kStoreSchemaVersion - 1> kMigrations = {
    "ALTER TABLE upload_session ADD COLUMN ended TEXT;"
    "UPDATE upload_session SET ended = 'stopped' WHERE closed IS NOT NULL;"
    "CREATE TABLE repeat(id INTEGER PRIMARY KEY, upload_session INTEGER, category INTEGER, "
    "type INTEGER, count INTEGER, first REAL, last REAL);"};

// Sessions that no run closed. One pass over the messages, and only where there are any;
// of the columns beside max(id) SQLite takes that row's.
constexpr const char* kCloseInterrupted =
    "WITH last AS (SELECT upload_session, max(id), time FROM upload_message WHERE upload_session "
    "IN (SELECT id FROM upload_session WHERE closed IS NULL) GROUP BY upload_session) "
    "UPDATE upload_session SET ended = 'interrupted', closed = coalesce((SELECT time FROM last "
    "WHERE upload_session = upload_session.id), opened) WHERE closed IS NULL";

// Space that deleted rows leave is not overwritten (it costs writes), and the
// file can be given back to the system page by page. A whole group fits into the cache, so
// that no page is written before it is full.
constexpr const char* kConfiguration = "PRAGMA auto_vacuum = INCREMENTAL;"
                                       "PRAGMA synchronous = FULL;"
                                       "PRAGMA secure_delete = OFF;"
                                       "PRAGMA trusted_schema = OFF;"
                                       "PRAGMA cache_size = -8192;"
                                       "PRAGMA temp_store = MEMORY;";

constexpr std::size_t kVersionOffset = 60; // of user_version in a database file
constexpr std::size_t kHeaderBytes = 64;

// The schema version as it stands in the file, asked without SQLite, whose mere
// opening may write to the files beside it. 0 when this is no database.
std::int64_t versionInHeader(const std::filesystem::path& path) {
    std::array<char, kHeaderBytes> header{};
    std::ifstream file(path, std::ios::binary);
    if (!file.read(header.data(), header.size()) ||
        std::string_view(header.data(), 15) != "SQLite format 3") {
        return 0;
    }
    std::int64_t version = 0;
    for (std::size_t i = kVersionOffset; i < kHeaderBytes; ++i) {
        version = version * 256 + static_cast<unsigned char>(header[i]);
    }
    return version;
}

// Said without SQLite, which finds nothing wrong.
StoreFailure refusal(int sqlite, std::string why) {
    return {{{}, std::move(why)}, sqlite};
}

StoreFailure newerSchema() {
    return refusal(SQLITE_CANTOPEN, "its schema is newer than this program");
}

int rememberLogPages(void* pages, sqlite3*, const char*, int count) {
    *static_cast<std::uint64_t*>(pages) = static_cast<std::uint64_t>(count);
    return SQLITE_OK;
}

} // namespace

StoreDatabase::StoreDatabase(Settings settings)
    : settings_(std::move(settings)), disk_(settings_.vfs) {}

StoreDatabase::~StoreDatabase() {
    abandon();
}

StoreResult StoreDatabase::open() {
    // The directory is the daemon's own: who planted a link there meant another file.
    for (const char* companion : {"", "-wal", "-shm"}) {
        std::error_code ignored;
        if (fs::is_symlink(settings_.path.string() + companion, ignored)) {
            return refusal(SQLITE_CANTOPEN_SYMLINK, "it is a symbolic link");
        }
    }
    if (versionInHeader(settings_.path) > kStoreSchemaVersion) {
        return newerSchema();
    }
    StoreResult result = openFile();
    if (!result.ok()) {
        abandon();
    }
    return result;
}

StoreResult StoreDatabase::openFile() {
    const int code = sqlite3_open_v2(settings_.path.c_str(), &database_,
                                     SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE |
                                         SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_EXRESCODE,
                                     disk_.name());
    if (code != SQLITE_OK) {
        return failureOf(code);
    }
    sqlite3_db_config(database_, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
    sqlite3_busy_timeout(database_, static_cast<int>(settings_.busyTimeout.count()));
    // Takes the place of SQLite's own checkpoints.
    sqlite3_wal_hook(database_, rememberLogPages, &logPages_);
    logPages_ = triedLogPages_ = 0;
    const auto version = query("PRAGMA user_version");
    if (version.ok() && version.value() > kStoreSchemaVersion) {
        return newerSchema();
    }
    if (version.ok() && sqlite3_db_readonly(database_, "main") == 1) {
        return refusal(SQLITE_READONLY, "it is read-only");
    }
    StoreResult result = version.ok() ? StoreResult() : version.failure();
    for (const auto step :
         {&StoreDatabase::configure, &StoreDatabase::check, &StoreDatabase::migrate,
          &StoreDatabase::prepare, &StoreDatabase::refreshIds, &StoreDatabase::readPageCounts}) {
        result = result.ok() ? (this->*step)() : result;
    }
    ++generation_;
    result = result.ok() && firstUpload_ == 0 ? takeOver() : result;
    companions_ = companionsAtPath();
    return result;
}

StoreResult StoreDatabase::configure() {
    const std::string pages = fmt::format("PRAGMA page_size = {};", settings_.pageBytes);
    if (StoreResult done = execute(pages + kConfiguration); !done.ok()) {
        return done;
    }
    StoreStatement mode;
    int code = mode.prepare(database_, "PRAGMA journal_mode = WAL");
    if (code == SQLITE_OK) {
        code = mode.step();
    }
    if (code == SQLITE_ROW && mode.text(0) != "wal") {
        return refusal(SQLITE_CANTOPEN, "its file system does not support shared memory");
    }
    return resultOf(code == SQLITE_ROW ? SQLITE_OK : code);
}

StoreResult StoreDatabase::check() {
    std::error_code ignored;
    const auto bytes = std::filesystem::file_size(settings_.path, ignored);
    if (ignored || bytes > kCheckedBytes) {
        return {};
    }
    StoreStatement quick;
    int code = quick.prepare(database_, "PRAGMA quick_check(1)");
    if (code == SQLITE_OK) {
        code = quick.step();
    }
    if (code == SQLITE_ROW && quick.text(0) != "ok") {
        return refusal(SQLITE_CORRUPT, std::string(quick.text(0)));
    }
    return resultOf(code == SQLITE_ROW ? SQLITE_OK : code);
}

StoreResult StoreDatabase::migrate() {
    const auto found = query("PRAGMA user_version");
    if (!found.ok()) {
        return found.failure();
    }
    const std::int64_t version = found.value();
    if (version < 0) {
        return refusal(SQLITE_CORRUPT, "its schema version is negative");
    }
    if (version == kStoreSchemaVersion) {
        return {};
    }
    std::string sql = "BEGIN IMMEDIATE;";
    if (version == 0) {
        sql += creationOfAll();
    }
    for (auto step = version; step > 0 && step < kStoreSchemaVersion; ++step) {
        sql += kMigrations.at(static_cast<std::size_t>(step - 1));
    }
    StoreResult done =
        execute(fmt::format("{}PRAGMA user_version = {}; COMMIT", sql, kStoreSchemaVersion));
    // Tables of another shape than that version's are as good as damaged.
    if (!done.ok() && done.failure().primary() == SQLITE_ERROR) {
        return refusal(SQLITE_CORRUPT, done.failure().text);
    }
    return done;
}

StoreResult StoreDatabase::prepare() {
    int code = messages_.attach(database_);
    code = code == SQLITE_OK ? events_.attach(database_) : code;
    const auto add = [&](StoreStatement& statement, std::string_view sql) {
        if (code == SQLITE_OK) {
            code = statement.prepare(database_, sql);
        }
    };
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        add(inserts_[i], storeInsert(kStoreSchema[i], "INSERT"));
    }
    add(takeMessages_, messages_.insertAll());
    add(takeEvents_, events_.insertAll());
    add(savepoint_, "SAVEPOINT together");
    add(rollBackTo_, "ROLLBACK TO together");
    add(release_, "RELEASE together");
    add(closeUpload_, "UPDATE upload_session SET closed = ?, ended = ? WHERE id = ?");
    add(findUpload_, "SELECT 1 FROM upload_session WHERE id = ? AND session_id IS ?");
    add(begin_, "BEGIN IMMEDIATE");
    add(commit_, "COMMIT");
    add(countPages_, "PRAGMA page_count");
    // Tables of another shape than ours are as good as damaged.
    if (code == SQLITE_ERROR) {
        return refusal(SQLITE_CORRUPT, failureOf(code).text);
    }
    return resultOf(code);
}

StoreResult StoreDatabase::refreshIds() {
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        const auto newest = query(fmt::format("SELECT max(id) FROM {}", kStoreSchema[i].name));
        if (!newest.ok()) {
            return newest.failure();
        }
        nextID_[i] = std::max(nextID_[i], newest.value() + 1);
    }
    return {};
}

StoreResult StoreDatabase::takeOver() {
    StoreResult refreshed = refreshIds();
    if (!refreshed.ok() || wroteUpload_) {
        return refreshed;
    }
    firstUpload_ = nextID_[0];
    return closeInterrupted();
}

StoreResult StoreDatabase::closeInterrupted() {
    const auto open = query("SELECT count(*) FROM upload_session WHERE closed IS NULL");
    if (!open.ok()) {
        return open.failure();
    }
    return open.value() == 0 ? StoreResult() : execute(kCloseInterrupted);
}

StoreResult StoreDatabase::readPageCounts() {
    const auto size = query("PRAGMA page_size");
    if (!size.ok()) {
        return size.failure();
    }
    pageSize_ = static_cast<std::uint64_t>(size.value());
    if (countPages_.step() == SQLITE_ROW) {
        pageCount_ = static_cast<std::uint64_t>(countPages_.integer(0));
        countPages_.reset();
    }
    return {};
}

StoreResult StoreDatabase::execute(const std::string& sql) {
    return resultOf(sqlite3_exec(database_, sql.c_str(), nullptr, nullptr, nullptr));
}

Result<std::int64_t, StoreFailure> StoreDatabase::query(std::string_view sql) {
    StoreStatement statement;
    int code = statement.prepare(database_, sql);
    if (code == SQLITE_OK) {
        code = statement.step();
    }
    if (code != SQLITE_ROW) {
        return failureOf(code == SQLITE_DONE ? SQLITE_ERROR : code);
    }
    return statement.integer(0);
}

StoreResult StoreDatabase::resultOf(int code) const {
    return code == SQLITE_OK ? StoreResult() : failureOf(code);
}

// SQLite says no more than that it cannot open something. 0 when that is for good.
int StoreDatabase::whyNotWritable() const {
    const fs::path folder = settings_.path.parent_path();
    for (const fs::path& path : {folder, settings_.path}) {
        if (::access(path.c_str(), W_OK) != 0 && errno != ENOENT) {
            return errno;
        }
    }
    struct statvfs disk {};
    if (::statvfs(folder.c_str(), &disk) == 0 &&
        (disk.f_bavail == 0 || (disk.f_files != 0 && disk.f_favail == 0))) {
        return ENOSPC;
    }
    std::error_code ignored;
    const fs::file_type there = fs::status(settings_.path, ignored).type();
    const bool couldBe = there == fs::file_type::regular || there == fs::file_type::not_found;
    return couldBe && fs::is_directory(folder, ignored) ? EIO : 0;
}

StoreFailure StoreDatabase::failureOf(int code) const {
    int system = database_ == nullptr ? 0 : sqlite3_system_errno(database_);
    if ((code & 0xFF) == SQLITE_CANTOPEN) {
        system = whyNotWritable();
    }
    const char* const said = database_ == nullptr ? nullptr : sqlite3_errmsg(database_);
    std::string text = fmt::format("{} ({})", said == nullptr ? sqlite3_errstr(code) : said, code);
    return {{static_cast<std::errc>(system), std::move(text)}, code};
}

void StoreDatabase::leaveRoom() {
    for (std::int64_t& id : nextID_) {
        id += kRoomForUnread;
    }
}

void StoreDatabase::abandon() {
    for (StoreStatement& insert : inserts_) {
        insert.finalize();
    }
    for (StoreStatement* statement :
         {&takeMessages_, &takeEvents_, &savepoint_, &rollBackTo_, &release_, &closeUpload_,
          &findUpload_, &begin_, &commit_, &countPages_}) {
        statement->finalize();
    }
    sqlite3_close_v2(database_);
    database_ = nullptr;
}

void StoreDatabase::close() {
    if (database_ != nullptr) {
        sqlite3_wal_checkpoint_v2(database_, nullptr, SQLITE_CHECKPOINT_TRUNCATE, nullptr, nullptr);
        sqlite3_db_config(database_, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 0, nullptr);
    }
    abandon();
}

StoreResult StoreDatabase::begin() {
    nextIDBefore_ = nextID_;
    groupRows_ = {};
    payload_.forget(); // The rows of the group before may be gone.
    groupUploads_.clear();
    return resultOf(begin_.run());
}

StoreResult StoreDatabase::commit() {
    if (StoreResult done = resultOf(commit_.run()); !done.ok()) {
        rollback();
        return done;
    }
    committedRows_ = groupRows_;
    groupUploads_.clear();
    for (JsonWriter* const writer : {&payload_, &sessionInfo_, &userInfo_}) {
        writer->shrink(); // The statements have been reset.
    }
    if (countPages_.step() == SQLITE_ROW) {
        pageCount_ = static_cast<std::uint64_t>(countPages_.integer(0));
        countPages_.reset();
    }
    return {};
}

void StoreDatabase::rollback() {
    if (database_ != nullptr && sqlite3_get_autocommit(database_) == 0) {
        (void)sqlite3_exec(database_, "ROLLBACK", nullptr, nullptr, nullptr);
    }
    nextID_ = nextIDBefore_;
    for (const StoreUploadPtr& upload : groupUploads_) {
        upload->row = 0;
    }
    groupUploads_.clear();
}

Result<std::uint64_t, StoreFailure> StoreDatabase::purge(double now) {
    auto purged = storePurge(database_, firstUpload_, now);
    logPages_ = triedLogPages_ = purged.ok() ? 0 : logPages_;
    const StoreResult counted = readPageCounts();
    return counted.ok() ? purged : counted.failure();
}

} // namespace halyard::linux_
