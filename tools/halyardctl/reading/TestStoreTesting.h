// A store that a test fills by hand, with rows that no daemon would write if need be.
#pragma once

#include <cstdint>
#include <filesystem>
#include <gtest/gtest.h>
#include <optional>
#include <sqlite3.h>
#include <string>
#include <string_view>

#include "linux/store/Schema.h"
#include "reading/StoreReader.h"
#include "testing/TempTree.h"

namespace halyard::reading {

class TestStore {
public:
    TestStore() {
        EXPECT_EQ(sqlite3_open(path().c_str(), &database_), SQLITE_OK);
        execute("PRAGMA journal_mode = WAL; PRAGMA synchronous = OFF");
        for (const auto& table : linux_::kStoreSchema) {
            execute(linux_::storeCreateTable(table));
        }
        execute("PRAGMA user_version = " + std::to_string(linux_::kStoreSchemaVersion));
    }
    ~TestStore() { close(); }
    TestStore(const TestStore&) = delete;
    TestStore& operator=(const TestStore&) = delete;

    std::filesystem::path directory() const { return tree_.path(); }
    std::filesystem::path path() const { return tree_ / "telemetry.db"; }

    void execute(const std::string& sql) {
        EXPECT_EQ(sqlite3_exec(database_, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK)
            << sqlite3_errmsg(database_);
    }
    // As the daemon leaves it when it ends in order.
    void close() {
        sqlite3_close(database_);
        database_ = nullptr;
    }
    void reopen() { EXPECT_EQ(sqlite3_open(path().c_str(), &database_), SQLITE_OK); }
    StoreReader open() const {
        auto reader = StoreReader::open(path());
        EXPECT_TRUE(reader.ok()) << reader.failure().message();
        return std::move(reader).value();
    }

    // Its row.
    std::int64_t addSession(const std::string& application, double opened,
                            std::optional<double> closed, const std::string& more = "") {
        return insert("upload_session(session_id, session_info, user_info, opened, closed)",
                      "4711, '{}', '{\"HostApplicationDisplayID\":" + quoted(application) +
                          ",\"kRelayReportingUserInfoServiceName\":\"alarms_session\"" + more +
                          "}', " + std::to_string(opened) + ", " +
                          (closed ? std::to_string(*closed) : "NULL"));
    }
    std::int64_t addMessage(std::optional<std::int64_t> session, int category, int type,
                            const std::string& payload, double time) {
        return insert("upload_message(upload_session, category, type, payload, time)",
                      (session ? std::to_string(*session) : "NULL") + ", " +
                          std::to_string(category) + ", " + std::to_string(type) + ", " +
                          literal(payload) + ", " + std::to_string(time));
    }
    std::int64_t insert(const std::string& into, const std::string& values) {
        execute("INSERT INTO " + into + " VALUES(" + values + ")");
        return sqlite3_last_insert_rowid(database_);
    }

    // A text as SQL has it.
    static std::string literal(std::string_view text) {
        std::string result = "'";
        for (const char c : text) {
            result.append(c == '\'' ? 2 : 1, c);
        }
        return result + "'";
    }

private:
    // Of a JSON text inside a text of SQL.
    static std::string quoted(std::string_view text) {
        std::string result = "\"";
        for (const char c : text) {
            result.append(c == '\'' ? 2 : 1, c);
        }
        return result + "\"";
    }

    testing::TempTree tree_;
    sqlite3* database_ = nullptr;
};

} // namespace halyard::reading
