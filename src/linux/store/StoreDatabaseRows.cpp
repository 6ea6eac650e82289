// What of StoreDatabase turns rows into statements.
#include <fmt/format.h>

#include "common/Utf8.h"
#include "linux/store/StoreDatabase.h"

namespace halyard::linux_ {
namespace {

std::string_view nameOf(platform::UploadEnding ending) {
    return ending == platform::UploadEnding::Disconnected ? kEndedDisconnected : kEndedStopped;
}

// What a value adds to a row that can be much.
std::uint64_t bytesOf(std::string_view text) {
    return text.size();
}
std::uint64_t bytesOf(StoreBlob blob) {
    return blob.bytes.size();
}
template <class Number> std::uint64_t bytesOf(Number) {
    return 0;
}
struct MessageColumns {
    std::int64_t category;
    std::int64_t type;
    std::string_view payload;
    double time;
};
void fillMessage(StoreIntake::Cells& cells, const MessageColumns& message) {
    cells[4] = message.category;
    cells[5] = message.type;
    cells[6] = message.payload;
    cells[7] = message.time;
}

// Of what a table has in its columns: the rest is of other rows.
std::span<const StoreIntake::Cell> columnsOf(const StoreIntake::Cells& cells, StoreTable table) {
    return std::span(cells).subspan(1, storeSchema(table).columns.size());
}
std::uint64_t bytesOf(std::span<const StoreIntake::Cell> columns) {
    std::uint64_t sum = 0;
    for (const StoreIntake::Cell& cell : columns) {
        const auto* const text = std::get_if<std::string_view>(&cell);
        sum += text != nullptr ? text->size() : 0;
    }
    return sum;
}

} // namespace

// Ids are given here and not by SQLite, so that they are known without asking and
// are not used twice when retention has emptied a table. When somebody else has
// inserted rows meanwhile, ours go behind them.
StoreResult StoreDatabase::runInsert(StoreTable table, std::uint64_t bytes) {
    if (bytes > maxRowBytes_) {
        return StoreFailure{
            {{}, fmt::format("a row of {} bytes, more than {}", bytes, maxRowBytes_)},
            SQLITE_TOOBIG};
    }
    const auto index = static_cast<std::size_t>(table);
    StoreStatement& insert = inserts_[index];
    insert.bind(1, nextID_[index]);
    int code = insert.run();
    if (code == SQLITE_CONSTRAINT_PRIMARYKEY || code == SQLITE_CONSTRAINT_ROWID) {
        if (StoreResult refreshed = refreshIds(); !refreshed.ok()) {
            return refreshed;
        }
        insert.bind(1, nextID_[index]);
        code = insert.run();
    }
    if (code != SQLITE_OK) {
        return failureOf(code);
    }
    inserted_ = {table, nextID_[index], bytes};
    ++nextID_[index];
    ++groupRows_[index];
    return {};
}

template <class... Values>
StoreResult StoreDatabase::insertInto(StoreTable table, const Values&... values) {
    inserts_[static_cast<std::size_t>(table)].bindFrom(2, values...);
    return runInsert(table, (std::uint64_t{0} + ... + bytesOf(values)));
}

StoreResult StoreDatabase::insertCells(StoreTable table) {
    const auto columns = columnsOf(cells_, table);
    StoreStatement& insert = inserts_[static_cast<std::size_t>(table)];
    for (std::size_t i = 0; i < columns.size(); ++i) {
        std::visit([&](const auto& value) { insert.bind(static_cast<int>(i) + 2, value); },
                   columns[i]);
    }
    return runInsert(table, bytesOf(columns));
}

StoreResult StoreDatabase::ensureUpload(const StoreUploadPtr& upload) {
    if (upload->row != 0 && upload->generation != generation_) {
        findUpload_.bindFrom(1, upload->row, upload->sessionID);
        const int code = findUpload_.step();
        findUpload_.reset();
        if (code != SQLITE_ROW && code != SQLITE_DONE) {
            return failureOf(code);
        }
        upload->row = code == SQLITE_ROW ? upload->row : 0;
        upload->generation = generation_;
    }
    if (upload->row != 0) {
        return {};
    }
    StoreResult inserted = insertInto(
        StoreTable::UploadSession, upload->sessionID, sessionInfo_.write(upload->sessionInfo),
        userInfo_.write(upload->userInfo), upload->opened, nullptr, nullptr);
    if (!inserted.ok()) {
        return inserted;
    }
    wroteUpload_ = true;
    upload->row = nextID_[static_cast<std::size_t>(StoreTable::UploadSession)] - 1;
    upload->generation = generation_;
    groupUploads_.push_back(upload);
    return inserted;
}

StoreResult StoreDatabase::insert(const StoreOpenRow& row) {
    return ensureUpload(row.upload);
}

StoreResult StoreDatabase::insert(const StoreCloseRow& row) {
    if (StoreResult done = ensureUpload(row.upload); !done.ok()) {
        return done;
    }
    closeUpload_.bindFrom(1, row.time, nameOf(row.ending), row.upload->row);
    return resultOf(closeUpload_.run());
}

void StoreDatabase::fill(StoreIntake::Cells& cells, const StoreMessageRow& row) {
    fillMessage(cells, {row.category, row.type, payload_.writeShared(row.payload), row.time});
    cells[1] = row.upload->row;
    cells[2] = cells[3] = nullptr;
}

void StoreDatabase::fill(StoreIntake::Cells& cells, const StoreSingleRow& row) {
    fillMessage(cells, {row.category, row.type, payload_.write(row.payload), row.time});
    cells[1] = nullptr;
    cells[2] = sessionInfo_.write(row.sessionInfo);
    cells[3] = userInfo_.write(row.userInfo);
}

void StoreDatabase::fill(StoreIntake::Cells& cells, const StoreAnalyticsRow& row) {
    const auto& [message, top] = row.built();
    cells[1] = row.name.text();
    cells[2] = top.key.isNone() ? payload_.write(message) : payload_.writeShared(message, top);
    cells[3] = row.time;
}

StoreResult StoreDatabase::insert(const StoreMessageRow& row) {
    if (StoreResult done = ensureUpload(row.upload); !done.ok()) {
        return done;
    }
    fill(cells_, row);
    return insertCells(StoreTable::UploadMessage);
}

StoreResult StoreDatabase::insert(const StoreSingleRow& row) {
    fill(cells_, row);
    return insertCells(StoreTable::UploadMessage);
}

StoreResult StoreDatabase::insert(const StoreAnalyticsRow& row) {
    fill(cells_, row);
    return insertCells(StoreTable::AnalyticsEvent);
}

StoreResult StoreDatabase::insert(const StoreEnergyRow& row) {
    return insertInto(StoreTable::EnergyEvent, std::int64_t{row.client}, row.name.text(),
                      payload_.write(row.payload), row.time);
}

StoreResult StoreDatabase::insert(const StoreMetricRow& row) {
    return insertInto(StoreTable::Metric, std::int64_t{row.metricID}, StoreBlob{row.message},
                      row.time);
}

StoreResult StoreDatabase::insert(const StoreIncidentRow& row) {
    const std::string report = replaceInvalidUtf8(row.report.text());
    return insertInto(StoreTable::Incident, payload_.write(row.signature), std::string_view(report),
                      row.time);
}

StoreResult StoreDatabase::insert(const StoreRepeatRow& row) {
    if (StoreResult done = ensureUpload(row.upload); !done.ok()) {
        return done;
    }
    const platform::Repeats& repeats = row.repeats;
    return insertInto(StoreTable::Repeat, row.upload->row, std::int64_t{repeats.category},
                      std::int64_t{repeats.type}, static_cast<std::int64_t>(repeats.count),
                      repeats.first, repeats.last);
}

bool StoreDatabase::comesInNumbers(const StoreRow& row) {
    return std::holds_alternative<StoreMessageRow>(row) ||
           std::holds_alternative<StoreSingleRow>(row) ||
           std::holds_alternative<StoreAnalyticsRow>(row);
}

StoreResult StoreDatabase::makeReady(const StoreRow& row) {
    const auto* const message = std::get_if<StoreMessageRow>(&row);
    return message != nullptr ? ensureUpload(message->upload) : StoreResult();
}

// The rows that SQLite takes while it runs the statement.
class StoreDatabase::Joined final : public StoreIntake::Rows {
public:
    Joined(StoreDatabase& database, StoreTable table, Items items, InsertedEach& inserted)
        : database_(database), table_(table), items_(items), inserted_(inserted),
          nextID_(database.nextID_[static_cast<std::size_t>(table)]) {
        inserted_.clear();
    }

    bool next(StoreIntake::Cells& cells) override {
        while (inserted_.size() < items_.size()) {
            const StoreRow& row = items_[inserted_.size()]->row;
            if (const auto* const message = std::get_if<StoreMessageRow>(&row)) {
                database_.fill(cells, *message);
            } else if (const auto* const event = std::get_if<StoreAnalyticsRow>(&row)) {
                database_.fill(cells, *event);
            } else {
                database_.fill(cells, std::get<StoreSingleRow>(row));
            }
            const std::uint64_t bytes = bytesOf(columnsOf(cells, table_));
            if (bytes <= database_.maxRowBytes_) {
                cells[0] = nextID_;
                inserted_.push_back(Inserted{table_, nextID_++, bytes});
                return true;
            }
            inserted_.push_back(std::nullopt);
        }
        return false;
    }
    std::int64_t nextID() const { return nextID_; }

private:
    StoreDatabase& database_;
    const StoreTable table_;
    const Items items_;
    InsertedEach& inserted_;
    std::int64_t nextID_;
};

// What others have added to the file (a trigger, an index) may end the statement anywhere,
// with or without the rows before: hence the savepoint.
Result<bool, StoreFailure> StoreDatabase::insertTogether(StoreTable table, Items items,
                                                         InsertedEach& inserted) {
    if (const int code = savepoint_.run(); code != SQLITE_OK) {
        return failureOf(code);
    }
    const bool areMessages = table == StoreTable::UploadMessage;
    StoreIntake& intake = areMessages ? messages_ : events_;
    Joined rows(*this, table, items, inserted);
    intake.offer(&rows);
    int code = (areMessages ? takeMessages_ : takeEvents_).run();
    intake.offer(nullptr);
    const bool areIn = code == SQLITE_OK;
    if (!areIn && sqlite3_get_autocommit(database_) != 0) {
        return failureOf(code); // Of the transaction nothing is left.
    }
    code = areIn ? SQLITE_OK : rollBackTo_.run();
    code = code == SQLITE_OK ? release_.run() : code;
    if (code != SQLITE_OK) {
        return failureOf(code);
    }
    if (areIn) {
        const auto index = static_cast<std::size_t>(table);
        groupRows_[index] += static_cast<std::uint64_t>(rows.nextID() - nextID_[index]);
        nextID_[index] = rows.nextID();
    }
    return areIn;
}

} // namespace halyard::linux_
