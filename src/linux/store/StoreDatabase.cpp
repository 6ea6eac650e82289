#include "linux/store/StoreDatabase.h"

#include <algorithm>
#include <cerrno>
#include <fmt/format.h>
#include <fstream>
#include <string_view>
#include <utility>

#include "common/Utf8.h"

namespace halyard::linux_ {
namespace {

std::string creationOfAll() {
    std::string sql;
    for (const StoreTableSchema& table : kStoreSchema) {
        sql += storeCreateTable(table);
    }
    return sql;
}

// What takes a file of schema N + 1 to N + 2; a new file gets the last at once.
constexpr std::array<const char*, kStoreSchemaVersion - 1> kMigrations = {};

// The size of pages counts for new files only. Twice SQLite's saves a good part of
// the writes to log and file, and the least commit is still small.
// Space that deleted rows leave is not overwritten (it costs writes), and the
// file can be given back to the system page by page.
constexpr const char* kConfiguration = "PRAGMA page_size = 8192;"
                                       "PRAGMA auto_vacuum = INCREMENTAL;"
                                       "PRAGMA synchronous = FULL;"
                                       "PRAGMA secure_delete = OFF;"
                                       "PRAGMA trusted_schema = OFF;"
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

int rememberLogPages(void* pages, sqlite3*, const char*, int count) {
    *static_cast<std::uint64_t*>(pages) = static_cast<std::uint64_t>(count);
    return SQLITE_OK;
}

} // namespace

StoreDatabase::StoreDatabase(Settings settings) : settings_(std::move(settings)) {}

StoreDatabase::~StoreDatabase() {
    abandon();
}

StoreDatabase::Opened StoreDatabase::open() {
    if (versionInHeader(settings_.path) > kStoreSchemaVersion) {
        errorText_ = "its schema is newer than this program";
        return Opened::NewerSchema;
    }
    const Opened result = openFile();
    if (result != Opened::Yes) {
        abandon();
    }
    return result;
}

StoreDatabase::Opened StoreDatabase::openFile() {
    int code = sqlite3_open_v2(settings_.path.c_str(), &database_,
                               SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX |
                                   SQLITE_OPEN_EXRESCODE,
                               settings_.vfs);
    if (code != SQLITE_OK) {
        return classify(note(code));
    }
    sqlite3_db_config(database_, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
    sqlite3_busy_timeout(database_, static_cast<int>(settings_.busyTimeout.count()));
    // Takes the place of SQLite's own checkpoints.
    sqlite3_wal_hook(database_, rememberLogPages, &logPages_);
    logPages_ = triedLogPages_ = 0;
    std::int64_t version = 0;
    code = query("PRAGMA user_version", version);
    if (code == SQLITE_OK && version > kStoreSchemaVersion) {
        errorText_ = "its schema is newer than this program";
        return Opened::NewerSchema;
    }
    if (code == SQLITE_OK && sqlite3_db_readonly(database_, "main") == 1) {
        errorText_ = "it is read-only";
        return Opened::Refused;
    }
    for (const auto step :
         {&StoreDatabase::configure, &StoreDatabase::check, &StoreDatabase::migrate,
          &StoreDatabase::prepare, &StoreDatabase::refreshIds, &StoreDatabase::readPageCounts}) {
        code = code == SQLITE_OK ? (this->*step)() : code;
    }
    ++generation_;
    firstUpload_ = firstUpload_ == 0 ? nextID_[0] : firstUpload_;
    return classify(code);
}

int StoreDatabase::configure() {
    int code = execute(kConfiguration);
    StoreStatement mode;
    if (code == SQLITE_OK) {
        code = note(mode.prepare(database_, "PRAGMA journal_mode = WAL"));
    }
    if (code != SQLITE_OK) {
        return code;
    }
    code = mode.step();
    if (code == SQLITE_ROW && mode.text(0) != "wal") {
        errorText_ = "its file system does not support shared memory";
        return SQLITE_CANTOPEN;
    }
    return code == SQLITE_ROW ? SQLITE_OK : note(code);
}

int StoreDatabase::check() {
    std::error_code ignored;
    const auto bytes = std::filesystem::file_size(settings_.path, ignored);
    if (ignored || bytes > kCheckedBytes) {
        return SQLITE_OK;
    }
    StoreStatement quick;
    int code = note(quick.prepare(database_, "PRAGMA quick_check(1)"));
    if (code == SQLITE_OK) {
        code = quick.step();
    }
    if (code == SQLITE_ROW && quick.text(0) == "ok") {
        return SQLITE_OK;
    }
    if (code == SQLITE_ROW) {
        errorText_ = std::string(quick.text(0));
        return SQLITE_CORRUPT;
    }
    return note(code);
}

int StoreDatabase::migrate() {
    std::int64_t version = 0;
    int code = query("PRAGMA user_version", version);
    if (code == SQLITE_OK && version < 0) {
        errorText_ = "its schema version is negative";
        return SQLITE_CORRUPT;
    }
    if (code != SQLITE_OK || version == kStoreSchemaVersion) {
        return code;
    }
    std::string sql = "BEGIN IMMEDIATE;";
    if (version == 0) {
        sql += creationOfAll();
    }
    for (auto step = std::max<std::int64_t>(version, 1); step < kStoreSchemaVersion; ++step) {
        sql += kMigrations.at(static_cast<std::size_t>(step - 1));
    }
    return execute(fmt::format("{}PRAGMA user_version = {}; COMMIT", sql, kStoreSchemaVersion));
}

int StoreDatabase::prepare() {
    int code = SQLITE_OK;
    const auto add = [&](StoreStatement& statement, std::string_view sql) {
        if (code == SQLITE_OK) {
            code = note(statement.prepare(database_, sql));
        }
    };
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        add(inserts_[i], storeInsert(kStoreSchema[i], "INSERT"));
    }
    add(closeUpload_, "UPDATE upload_session SET closed = ? WHERE id = ?");
    add(findUpload_, "SELECT 1 FROM upload_session WHERE id = ? AND session_id IS ?");
    add(begin_, "BEGIN IMMEDIATE");
    add(commit_, "COMMIT");
    add(countPages_, "PRAGMA page_count");
    // Tables of another shape than ours are as good as damaged.
    if (code == SQLITE_ERROR) {
        return SQLITE_CORRUPT;
    }
    return code;
}

int StoreDatabase::refreshIds() {
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        std::int64_t newest = 0;
        const int code = query(fmt::format("SELECT max(id) FROM {}", kStoreSchema[i].name), newest);
        if (code != SQLITE_OK) {
            return code;
        }
        nextID_[i] = std::max(nextID_[i], newest + 1);
    }
    return SQLITE_OK;
}

int StoreDatabase::readPageCounts() {
    std::int64_t size = 0;
    const int code = query("PRAGMA page_size", size);
    pageSize_ = static_cast<std::uint64_t>(size);
    if (code == SQLITE_OK && countPages_.step() == SQLITE_ROW) {
        pageCount_ = static_cast<std::uint64_t>(countPages_.integer(0));
        countPages_.reset();
    }
    return code;
}

int StoreDatabase::execute(const std::string& sql) {
    return note(sqlite3_exec(database_, sql.c_str(), nullptr, nullptr, nullptr));
}

int StoreDatabase::query(std::string_view sql, std::int64_t& result) {
    StoreStatement statement;
    int code = statement.prepare(database_, sql);
    if (code == SQLITE_OK) {
        code = statement.step();
    }
    if (code != SQLITE_ROW) {
        return note(code == SQLITE_DONE ? SQLITE_ERROR : code);
    }
    result = statement.integer(0);
    return SQLITE_OK;
}

int StoreDatabase::note(int code) {
    if (code != SQLITE_OK) {
        errorCode_ = code;
        systemError_ = database_ == nullptr ? 0 : sqlite3_system_errno(database_);
        const char* text = database_ == nullptr ? nullptr : sqlite3_errmsg(database_);
        errorText_ = fmt::format("{} ({})", text == nullptr ? sqlite3_errstr(code) : text, code);
    }
    return code;
}

StoreDatabase::Opened StoreDatabase::classify(int code) const {
    const bool noSpace = systemError_ == ENOSPC || systemError_ == EDQUOT;
    switch (code & 0xFF) {
    case SQLITE_OK:
        return Opened::Yes;
    case SQLITE_NOTADB:
    case SQLITE_CORRUPT:
        return Opened::Damaged;
    case SQLITE_FULL:
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
    case SQLITE_PROTOCOL:
    case SQLITE_NOMEM:
        return Opened::NotNow;
    default:
        return noSpace ? Opened::NotNow : Opened::Refused;
    }
}

bool StoreDatabase::hasMoved() {
    int moved = 0;
    return database_ != nullptr &&
           sqlite3_file_control(database_, "main", SQLITE_FCNTL_HAS_MOVED, &moved) == SQLITE_OK &&
           moved != 0;
}

void StoreDatabase::abandon() {
    for (StoreStatement& insert : inserts_) {
        insert.finalize();
    }
    for (StoreStatement* statement :
         {&closeUpload_, &findUpload_, &begin_, &commit_, &countPages_}) {
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

int StoreDatabase::begin() {
    nextIDBefore_ = nextID_;
    groupRows_ = {};
    groupUploads_.clear();
    return note(begin_.run());
}

int StoreDatabase::commit() {
    const int code = note(commit_.run());
    if (code != SQLITE_OK) {
        rollback();
        return code;
    }
    committedRows_ = groupRows_;
    groupUploads_.clear();
    if (countPages_.step() == SQLITE_ROW) {
        pageCount_ = static_cast<std::uint64_t>(countPages_.integer(0));
        countPages_.reset();
    }
    return SQLITE_OK;
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

int StoreDatabase::boundLog(std::uint64_t maxBytes, std::uint64_t checkpointBytes) {
    const std::uint64_t step = checkpointBytes / pageSize_;
    if (logPages_ < step || logPages_ < triedLogPages_ + step / 4) {
        return SQLITE_OK;
    }
    const bool tooLong = logBytes() > maxBytes;
    const int mode = tooLong ? SQLITE_CHECKPOINT_TRUNCATE : SQLITE_CHECKPOINT_PASSIVE;
    int logged = 0;
    int moved = 0;
    const int code = sqlite3_wal_checkpoint_v2(database_, nullptr, mode, &logged, &moved);
    if (tooLong) {
        if (code == SQLITE_OK) {
            logPages_ = triedLogPages_ = 0;
        }
        return note(code);
    }
    // Once all of it has moved, the next commit begins the log anew.
    triedLogPages_ = code == SQLITE_OK && logged == moved ? 0 : logPages_;
    if (triedLogPages_ == 0) {
        logPages_ = 0;
    }
    return code == SQLITE_BUSY ? SQLITE_OK : note(code);
}

// Ids are given here and not by SQLite, so that they are known without asking and
// are not used twice when retention has emptied a table. When somebody else has
// inserted rows meanwhile, ours go behind them.
template <class... Values>
int StoreDatabase::insertInto(StoreTable table, const Values&... values) {
    const auto index = static_cast<std::size_t>(table);
    StoreStatement& insert = inserts_[index];
    insert.bindFrom(1, nextID_[index], values...);
    int code = insert.run();
    if (code == SQLITE_CONSTRAINT_PRIMARYKEY || code == SQLITE_CONSTRAINT_ROWID) {
        code = refreshIds();
        if (code == SQLITE_OK) {
            insert.bind(1, nextID_[index]);
            code = insert.run();
        }
    }
    if (code != SQLITE_OK) {
        return note(code);
    }
    ++nextID_[index];
    ++groupRows_[index];
    return SQLITE_OK;
}

int StoreDatabase::ensureUpload(const StoreUploadPtr& upload) {
    if (upload->row != 0 && upload->generation != generation_) {
        findUpload_.bindFrom(1, upload->row, upload->sessionID);
        const int code = findUpload_.step();
        findUpload_.reset();
        if (code != SQLITE_ROW && code != SQLITE_DONE) {
            return note(code);
        }
        upload->row = code == SQLITE_ROW ? upload->row : 0;
        upload->generation = generation_;
    }
    if (upload->row != 0) {
        return SQLITE_OK;
    }
    const int code = insertInto(StoreTable::UploadSession, upload->sessionID,
                                sessionInfo_.write(upload->sessionInfo),
                                userInfo_.write(upload->userInfo), upload->opened, nullptr);
    if (code != SQLITE_OK) {
        return code;
    }
    upload->row = nextID_[static_cast<std::size_t>(StoreTable::UploadSession)] - 1;
    upload->generation = generation_;
    groupUploads_.push_back(upload);
    return SQLITE_OK;
}

int StoreDatabase::insert(const StoreOpenRow& row) {
    return ensureUpload(row.upload);
}

int StoreDatabase::insert(const StoreCloseRow& row) {
    if (const int code = ensureUpload(row.upload); code != SQLITE_OK) {
        return code;
    }
    closeUpload_.bindFrom(1, row.time, row.upload->row);
    return note(closeUpload_.run());
}

int StoreDatabase::insert(const StoreMessageRow& row) {
    if (const int code = ensureUpload(row.upload); code != SQLITE_OK) {
        return code;
    }
    return insertInto(StoreTable::UploadMessage, row.upload->row, nullptr, nullptr,
                      std::int64_t{row.category}, std::int64_t{row.type},
                      payload_.write(row.payload), row.time);
}

int StoreDatabase::insert(const StoreSingleRow& row) {
    return insertInto(StoreTable::UploadMessage, nullptr, sessionInfo_.write(row.sessionInfo),
                      userInfo_.write(row.userInfo), std::int64_t{row.category},
                      std::int64_t{row.type}, payload_.write(row.payload), row.time);
}

int StoreDatabase::insert(const StoreAnalyticsRow& row) {
    return insertInto(StoreTable::AnalyticsEvent, row.name.text(), payload_.write(row.payload),
                      row.time);
}

int StoreDatabase::insert(const StoreEnergyRow& row) {
    return insertInto(StoreTable::EnergyEvent, std::int64_t{row.client}, row.name.text(),
                      payload_.write(row.payload), row.time);
}

int StoreDatabase::insert(const StoreMetricRow& row) {
    return insertInto(StoreTable::Metric, std::int64_t{row.metricID}, StoreBlob{row.message},
                      row.time);
}

int StoreDatabase::insert(const StoreIncidentRow& row) {
    const std::string report = replaceInvalidUtf8(row.report.text());
    return insertInto(StoreTable::Incident, payload_.write(row.signature), std::string_view(report),
                      row.time);
}

} // namespace halyard::linux_
