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

} // namespace

// Ids are given here and not by SQLite, so that they are known without asking and
// are not used twice when retention has emptied a table. When somebody else has
// inserted rows meanwhile, ours go behind them.
template <class... Values>
StoreResult StoreDatabase::insertInto(StoreTable table, const Values&... values) {
    const auto index = static_cast<std::size_t>(table);
    const std::uint64_t bytes = (std::uint64_t{0} + ... + bytesOf(values));
    if (bytes > maxRowBytes_) {
        return StoreFailure{
            {{}, fmt::format("a row of {} bytes, more than {}", bytes, maxRowBytes_)},
            SQLITE_TOOBIG};
    }
    StoreStatement& insert = inserts_[index];
    insert.bindFrom(1, nextID_[index], values...);
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

StoreResult StoreDatabase::insert(const StoreMessageRow& row) {
    if (StoreResult done = ensureUpload(row.upload); !done.ok()) {
        return done;
    }
    return insertInto(StoreTable::UploadMessage, row.upload->row, nullptr, nullptr,
                      std::int64_t{row.category}, std::int64_t{row.type},
                      payload_.writeShared(row.payload), row.time);
}

StoreResult StoreDatabase::insert(const StoreSingleRow& row) {
    return insertInto(StoreTable::UploadMessage, nullptr, sessionInfo_.write(row.sessionInfo),
                      userInfo_.write(row.userInfo), std::int64_t{row.category},
                      std::int64_t{row.type}, payload_.write(row.payload), row.time);
}

StoreResult StoreDatabase::insert(const StoreAnalyticsRow& row) {
    const auto& [message, top] = row.built();
    const std::string_view payload =
        top.key.isNone() ? payload_.write(message) : payload_.writeShared(message, top);
    return insertInto(StoreTable::AnalyticsEvent, row.name.text(), payload, row.time);
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

} // namespace halyard::linux_
