// The tables of telemetry.db: what every list of tables or columns, here and in
// tools that read the store, is made from. docs/store.md describes them.
//
// Needs nothing but the standard library. A column that is added goes to the
// end of its table, with a step from the version before it.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace halyard::linux_ {

// `PRAGMA user_version`.
inline constexpr std::int64_t kStoreSchemaVersion = 2;

struct StoreColumn {
    // What every row that the daemon wrote has there.
    enum class Holds : std::uint8_t { Anything, Integer, Json, JsonOrNull };

    std::string_view name;
    std::string_view type;
    Holds holds = Holds::Anything;
};

// In the order of kStoreSchema.
enum class StoreTable : std::uint8_t {
    UploadSession,
    UploadMessage,
    AnalyticsEvent,
    EnergyEvent,
    Metric,
    Incident,
    Repeat,
};

struct StoreTableSchema {
    std::string_view name;
    // Without the first, which is `id INTEGER PRIMARY KEY` in every table.
    std::span<const StoreColumn> columns;
    // The schema version that brought it.
    std::int64_t since = 1;
};

namespace store_columns {

using Holds = StoreColumn::Holds;

inline constexpr StoreColumn kUploadSession[] = {{"session_id", "INTEGER"},
                                                 {"session_info", "TEXT", Holds::Json},
                                                 {"user_info", "TEXT", Holds::Json},
                                                 {"opened", "REAL"},
                                                 {"closed", "REAL"},
                                                 {"ended", "TEXT"}};
inline constexpr StoreColumn kUploadMessage[] = {{"upload_session", "INTEGER"},
                                                 {"session_info", "TEXT", Holds::JsonOrNull},
                                                 {"user_info", "TEXT", Holds::JsonOrNull},
                                                 {"category", "INTEGER"},
                                                 {"type", "INTEGER"},
                                                 {"payload", "TEXT", Holds::Json},
                                                 {"time", "REAL"}};
inline constexpr StoreColumn kAnalyticsEvent[] = {
    {"name", "TEXT"}, {"payload", "TEXT", Holds::Json}, {"time", "REAL"}};
inline constexpr StoreColumn kEnergyEvent[] = {
    {"client", "INTEGER"}, {"name", "TEXT"}, {"payload", "TEXT", Holds::Json}, {"time", "REAL"}};
inline constexpr StoreColumn kMetric[] = {
    {"metric_id", "INTEGER", Holds::Integer}, {"message", "BLOB"}, {"time", "REAL"}};
inline constexpr StoreColumn kIncident[] = {
    {"signature", "TEXT", Holds::Json}, {"report", "TEXT"}, {"time", "REAL"}};
inline constexpr StoreColumn kRepeat[] = {{"upload_session", "INTEGER", Holds::Integer},
                                          {"category", "INTEGER", Holds::Integer},
                                          {"type", "INTEGER", Holds::Integer},
                                          {"count", "INTEGER", Holds::Integer},
                                          {"first", "REAL"},
                                          {"last", "REAL"}};

} // namespace store_columns

inline constexpr std::size_t kStoreTables = 7;
inline constexpr std::array<StoreTableSchema, kStoreTables> kStoreSchema = {
    {{"upload_session", store_columns::kUploadSession},
     {"upload_message", store_columns::kUploadMessage},
     {"analytics_event", store_columns::kAnalyticsEvent},
     {"energy_event", store_columns::kEnergyEvent},
     {"metric", store_columns::kMetric},
     {"incident", store_columns::kIncident},
     {"repeat", store_columns::kRepeat, 2}}};

// What the store says of itself: see StoreFacts. Made when they are missing, in whatever
// version, since programs that do not know them need not; `given` is 0 or 1, and there is
// one identity.
inline constexpr std::string_view kStoreFactTables =
    "CREATE TABLE IF NOT EXISTS consent(id INTEGER PRIMARY KEY, given INTEGER, time REAL);"
    "CREATE TABLE IF NOT EXISTS identity(device TEXT);";
// Older ones are removed; what has no note counts as refused.
inline constexpr std::int64_t kMaxConsentNotes = 1000;

// The values of upload_session.ended; NULL while it is open.
inline constexpr std::string_view kEndedStopped = "stopped";
inline constexpr std::string_view kEndedDisconnected = "disconnected";
inline constexpr std::string_view kEndedInterrupted = "interrupted";

constexpr const StoreTableSchema& storeSchema(StoreTable table) {
    return kStoreSchema[static_cast<std::size_t>(table)];
}

// "id, session_id, ...".
inline std::string storeColumnNames(const StoreTableSchema& table) {
    std::string names = "id";
    for (const StoreColumn& column : table.columns) {
        names.append(", ").append(column.name);
    }
    return names;
}

inline std::string storeCreateTable(const StoreTableSchema& table) {
    std::string sql = "CREATE TABLE IF NOT EXISTS ";
    sql.append(table.name).append("(id INTEGER PRIMARY KEY");
    for (const StoreColumn& column : table.columns) {
        sql.append(", ").append(column.name).append(" ").append(column.type);
    }
    return sql + ");";
}

// `verb` is "INSERT" or "INSERT OR REPLACE"; a parameter for the id and each column.
inline std::string storeInsert(const StoreTableSchema& table, std::string_view verb) {
    std::string sql(verb);
    sql.append(" INTO ").append(table.name).append("(").append(storeColumnNames(table));
    sql += ") VALUES(?";
    for (std::size_t i = 0; i < table.columns.size(); ++i) {
        sql += ", ?";
    }
    return sql + ")";
}

} // namespace halyard::linux_
