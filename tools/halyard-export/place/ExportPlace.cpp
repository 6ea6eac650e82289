#include "place/ExportPlace.h"

#include <algorithm>
#include <cmath>
#include <ctime>
#include <fmt/format.h>

namespace halyard::exporting {
namespace {

namespace fs = std::filesystem;
using linux_::StoreStatement;
using reading::Exit;
using reading::Outcome;
using reading::Trouble;

constexpr int kSchema = 1;
constexpr int kBusyMilliseconds = 2000;
// Of all tables of a signal.
constexpr std::int64_t kMostLate = 64;
constexpr const char* kTables =
    "CREATE TABLE IF NOT EXISTS place(signal TEXT, source TEXT, id INTEGER, time REAL,"
    " PRIMARY KEY(signal, source)) WITHOUT ROWID;"
    "CREATE TABLE IF NOT EXISTS late(signal TEXT, source TEXT, before INTEGER, id INTEGER,"
    " time REAL, PRIMARY KEY(signal, source, before)) WITHOUT ROWID;"
    "CREATE TABLE IF NOT EXISTS open_session(signal TEXT, id INTEGER, PRIMARY KEY(signal, id))"
    " WITHOUT ROWID;"
    "CREATE TABLE IF NOT EXISTS loss(signal TEXT, reason INTEGER, count INTEGER,"
    " PRIMARY KEY(signal, reason)) WITHOUT ROWID;"
    "CREATE TABLE IF NOT EXISTS sent(signal TEXT PRIMARY KEY, count INTEGER) WITHOUT ROWID;"
    "CREATE TABLE IF NOT EXISTS fact(name TEXT PRIMARY KEY, value TEXT) WITHOUT ROWID;";

bool isDamage(int code) {
    return (code & 0xFF) == SQLITE_CORRUPT || (code & 0xFF) == SQLITE_NOTADB;
}

} // namespace

// A statement of the place's while it is used: one that is not reset would keep the file from
// being written to.
class ExportPlace::Use {
public:
    // Requires a literal.
    Use(const ExportPlace& place, std::string_view sql) : statement_(place.statements_[sql]) {
        isReady_ =
            statement_.isPrepared() || statement_.prepare(place.database_.get(), sql) == SQLITE_OK;
    }
    ~Use() { statement_.reset(); }
    Use(const Use&) = delete;
    Use& operator=(const Use&) = delete;

    explicit operator bool() const { return isReady_; }
    linux_::StoreStatement* operator->() { return &statement_; }

private:
    linux_::StoreStatement& statement_;
    bool isReady_ = false;
};

std::string dayOf(double now) {
    const auto whole = static_cast<std::time_t>(std::floor(now));
    std::tm utc{};
    (void)::gmtime_r(&whole, &utc);
    return fmt::format("{:04}-{:02}-{:02}", utc.tm_year + 1900, utc.tm_mon + 1, utc.tm_mday);
}

void ExportPlace::Closer::operator()(sqlite3* database) const {
    sqlite3_close_v2(database);
}

Trouble ExportPlace::trouble() const {
    const int code = database_ == nullptr ? SQLITE_NOMEM : sqlite3_errcode(database_.get());
    Trouble trouble(
        (code & 0xFF) == SQLITE_PERM ? Exit::NotAllowed : Exit::Failed,
        fmt::format("cannot keep the exporter's place: {}",
                    database_ == nullptr ? sqlite3_errstr(code) : sqlite3_errmsg(database_.get())));
    trouble.isDamage = isDamage(code);
    return trouble;
}

Outcome<ExportPlace> ExportPlace::opened(const std::string& name, int flags, double now) {
    sqlite3* raw = nullptr;
    const int code = sqlite3_open_v2(name.c_str(), &raw,
                                     flags | SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_EXRESCODE, nullptr);
    ExportPlace place{Database(raw)};
    if (code != SQLITE_OK) {
        return place.trouble();
    }
    sqlite3_busy_timeout(raw, kBusyMilliseconds);
    if (auto prepared = place.prepare(now); !prepared.ok()) {
        return prepared.failure();
    }
    return place;
}

Outcome<ExportPlace> ExportPlace::open(const fs::path& path, double now) {
    constexpr int kFlags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE;
    auto place = opened(path.native(), kFlags, now);
    if (place.ok() || !place.failure().isDamage) {
        return place;
    }
    // It holds nothing that cannot be done again: what is sent twice is known by its identity.
    std::error_code failed;
    fs::rename(path, path.native() + ".damaged", failed);
    for (const char* const beside : {"-wal", "-shm"}) {
        std::error_code ignored;
        fs::remove(path.native() + beside, ignored);
    }
    return failed ? std::move(place) : opened(path.native(), kFlags, now);
}

Outcome<ExportPlace> ExportPlace::inMemory(const fs::path& path, double now) {
    std::error_code ignored;
    if (!fs::exists(path, ignored)) {
        return opened(":memory:", SQLITE_OPEN_READWRITE, now);
    }
    sqlite3* raw = nullptr;
    (void)sqlite3_open_v2(":memory:", &raw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, nullptr);
    ExportPlace copy{Database(raw)};
    sqlite3* from = nullptr;
    (void)sqlite3_open_v2(path.c_str(), &from, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOMUTEX, nullptr);
    const Database source(from);
    sqlite3_backup* const backup = sqlite3_backup_init(raw, "main", from, "main");
    const int code = backup == nullptr ? SQLITE_CANTOPEN : sqlite3_backup_step(backup, -1);
    sqlite3_backup_finish(backup);
    if (code != SQLITE_DONE) {
        return Trouble(code == SQLITE_CANTOPEN ? Exit::NotAllowed : Exit::Failed,
                       fmt::format("cannot read {}: {}", path.native(), sqlite3_errstr(code)));
    }
    if (auto prepared = copy.prepare(now); !prepared.ok()) {
        return prepared.failure();
    }
    return copy;
}

Outcome<void> ExportPlace::prepare(double now) {
    StoreStatement version;
    if (version.prepare(database_.get(), "PRAGMA user_version") != SQLITE_OK ||
        version.step() != SQLITE_ROW) {
        return trouble();
    }
    if (version.integer(0) > kSchema) {
        return Trouble(Exit::Failed, fmt::format("the exporter's place has schema {}, which is "
                                                 "newer than this program knows",
                                                 version.integer(0)));
    }
    version.reset();
    // What a power cut takes back is sent again, and known by its identity: no need to wait
    // for the disk at each request.
    const auto begun = execute(fmt::format("PRAGMA journal_mode = WAL; PRAGMA synchronous = NORMAL;"
                                           "{} PRAGMA user_version = {}",
                                           kTables, kSchema));
    if (!begun.ok()) {
        return begun;
    }
    if (!fact("since") && !setFact("since", fmt::format("{}", now))) {
        return trouble();
    }
    return {};
}

Outcome<void> ExportPlace::execute(const std::string& sql) {
    return sqlite3_exec(database_.get(), sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK
               ? Outcome<void>()
               : trouble();
}

Outcome<void> ExportPlace::run(std::string_view sql) {
    Use statement(*this, sql);
    return statement && statement->run() == SQLITE_OK ? Outcome<void>() : trouble();
}

std::optional<std::string> ExportPlace::fact(std::string_view name) const {
    Use statement(*this, "SELECT value FROM fact WHERE name = ?");
    if (!statement) {
        return std::nullopt;
    }
    statement->bind(1, name);
    return statement->step() == SQLITE_ROW ? std::optional(std::string(statement->text(0)))
                                           : std::nullopt;
}

std::optional<double> ExportPlace::realFact(std::string_view name) const {
    const auto text = fact(name);
    return text ? std::optional(std::strtod(text->c_str(), nullptr)) : std::nullopt;
}

bool ExportPlace::setFact(std::string_view name, std::string_view value) {
    Use statement(*this, "INSERT OR REPLACE INTO fact VALUES(?, ?)");
    if (!statement) {
        return false;
    }
    statement->bindFrom(1, name, value);
    return statement->run() == SQLITE_OK;
}

Outcome<void> ExportPlace::follow(const std::string& device) {
    if (fact("device") == device) {
        return {};
    }
    const auto begun = execute("BEGIN IMMEDIATE; DELETE FROM place; DELETE FROM late; "
                               "DELETE FROM open_session");
    const bool isNoted = begun.ok() && setFact("device", device);
    const auto ended = execute(isNoted ? "COMMIT" : "ROLLBACK");
    return isNoted ? ended : trouble();
}

Position ExportPlace::positionOf(Signal signal, const std::string& table) const {
    Use statement(*this, "SELECT id, time FROM place WHERE signal = ? AND source = ?");
    if (!statement) {
        return {};
    }
    statement->bindFrom(1, nameOf(signal), std::string_view(table));
    return statement->step() == SQLITE_ROW ? Position{statement->integer(0), statement->real(1)}
                                           : Position{};
}

std::vector<LateRows> ExportPlace::lateRows(Signal signal, const std::string& table) const {
    std::vector<LateRows> all;
    Use statement(*this, "SELECT id, time, before FROM late WHERE signal = ? AND source = ? "
                         "ORDER BY before");
    if (statement) {
        statement->bindFrom(1, nameOf(signal), std::string_view(table));
        while (statement->step() == SQLITE_ROW) {
            all.push_back({{statement->integer(0), statement->real(1)}, statement->integer(2)});
        }
    }
    return all;
}

std::vector<std::int64_t> ExportPlace::openSessions(Signal signal, std::int64_t after,
                                                    std::size_t most) const {
    std::vector<std::int64_t> rows;
    Use statement(*this, "SELECT id FROM open_session WHERE signal = ? AND id > ? ORDER BY id "
                         "LIMIT ?");
    if (statement) {
        statement->bindFrom(1, nameOf(signal), after, static_cast<std::int64_t>(most));
        while (statement->step() == SQLITE_ROW) {
            rows.push_back(statement->integer(0));
        }
    }
    return rows;
}

Outcome<void> ExportPlace::commit(Signal signal, const PlaceChange& change, double now) {
    if (change.isNothing()) {
        return {};
    }
    if (auto begun = run("BEGIN IMMEDIATE"); !begun.ok()) {
        return begun;
    }
    auto written = write(signal, change, now);
    const auto ended = run(written.ok() ? "COMMIT" : "ROLLBACK");
    return written.ok() ? ended : written;
}

Outcome<void> ExportPlace::write(Signal signal, const PlaceChange& change, double now) {
    const auto run = [&](const char* sql, const auto&... values) {
        Use statement(*this, sql);
        if (!statement) {
            return false;
        }
        statement->bindFrom(1, nameOf(signal), values...);
        return statement->run() == SQLITE_OK;
    };
    bool isGood = true;
    for (const auto& [table, position] : change.positions) {
        isGood = isGood && run("INSERT OR REPLACE INTO place VALUES(?, ?, ?, ?)",
                               std::string_view(table), position.id, position.time);
    }
    for (const auto& [where, position] : change.late) {
        isGood =
            isGood && run("INSERT OR REPLACE INTO late VALUES(?, ?, ?, ?, ?)",
                          std::string_view(where.first), where.second, position.id, position.time);
    }
    if (isGood && !change.late.empty()) {
        // Ids leap at each start that still has something to save: not without end.
        isGood = run("DELETE FROM late WHERE signal = ?1 AND (source, before) NOT IN (SELECT "
                     "source, before FROM late WHERE signal = ?1 ORDER BY before DESC LIMIT ?2)",
                     kMostLate);
    }
    for (const std::int64_t id : change.opened) {
        isGood = isGood && run("INSERT OR REPLACE INTO open_session VALUES(?, ?)", id);
    }
    for (const std::int64_t id : change.done) {
        isGood = isGood && run("DELETE FROM open_session WHERE signal = ? AND id = ?", id);
    }
    for (const auto& [loss, count] : change.losses) {
        isGood = isGood && run("INSERT INTO loss VALUES(?1, ?2, ?3) ON CONFLICT DO UPDATE SET "
                               "count = count + excluded.count",
                               static_cast<std::int64_t>(loss), static_cast<std::int64_t>(count));
    }
    if (isGood && change.bytesSent > 0) {
        const std::uint64_t before = bytesToday(now);
        isGood = run("INSERT INTO sent VALUES(?1, ?2) ON CONFLICT DO UPDATE SET "
                     "count = count + excluded.count",
                     static_cast<std::int64_t>(change.records)) &&
                 setFact("day", dayOf(now)) &&
                 setFact("bytes_today", std::to_string(before + change.bytesSent)) &&
                 setFact("last_success", fmt::format("{}", now));
    }
    return isGood ? Outcome<void>() : trouble();
}

Outcome<void> ExportPlace::noteFailure(const std::string& error, double now) {
    const bool isNoted =
        setFact("last_failure", fmt::format("{}", now)) && setFact("last_error", error);
    return isNoted ? Outcome<void>() : trouble();
}

std::uint64_t ExportPlace::bytesToday(double now) const {
    return fact("day") == dayOf(now)
               ? static_cast<std::uint64_t>(realFact("bytes_today").value_or(0))
               : 0;
}

ExportCounts ExportPlace::counts(double now) const {
    ExportCounts counts;
    Use losses(*this, "SELECT signal, reason, count FROM loss");
    while (losses && losses->step() == SQLITE_ROW) {
        const auto reason = static_cast<std::size_t>(losses->integer(1));
        if (reason < kLossNames.size()) {
            counts.losses[{std::string(losses->text(0)), static_cast<Loss>(reason)}] =
                static_cast<std::uint64_t>(losses->integer(2));
        }
    }
    Use sent(*this, "SELECT signal, count FROM sent");
    while (sent && sent->step() == SQLITE_ROW) {
        counts.sent[std::string(sent->text(0))] = static_cast<std::uint64_t>(sent->integer(1));
    }
    counts.since = realFact("since").value_or(now);
    counts.day = dayOf(now);
    counts.bytesToday = bytesToday(now);
    counts.lastSuccess = realFact("last_success");
    counts.lastFailure = realFact("last_failure");
    counts.lastError = fact("last_error").value_or("");
    return counts;
}

} // namespace halyard::exporting
