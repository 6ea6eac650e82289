#include "linux/store/StoreDisk.h"

#include <fstream>
#include <gtest/gtest.h>

#include "linux/store/FaultyDiskTesting.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

class StoreDiskTest : public ::testing::Test {
protected:
    void open(const char* layer) {
        ASSERT_EQ(sqlite3_open_v2(path_.c_str(), &database_,
                                  SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, layer),
                  SQLITE_OK);
        run("PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL; PRAGMA wal_autocheckpoint = 0");
    }
    void close() {
        sqlite3_close(database_);
        database_ = nullptr;
    }
    ~StoreDiskTest() override { close(); }

    int tryTo(const char* sql) { return sqlite3_exec(database_, sql, nullptr, nullptr, nullptr); }
    void run(const char* sql) { ASSERT_EQ(tryTo(sql), SQLITE_OK) << sqlite3_errmsg(database_); }
    // Rows of about four kilobytes, each its number over and over.
    void insertRows(int count) {
        run("CREATE TABLE IF NOT EXISTS t(id INTEGER PRIMARY KEY, text TEXT)");
        const std::string sql =
            "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < " +
            std::to_string(count) +
            ") INSERT INTO t(text) SELECT replace(hex(zeroblob(1000)), '00', printf('%04d', i)) "
            "FROM n";
        run(sql.c_str());
    }
    // How many rows, and whether each is whole, as another program sees them.
    std::string seenByOthers() const {
        sqlite3* other = nullptr;
        sqlite3_open_v2(path_.c_str(), &other, SQLITE_OPEN_READONLY, nullptr);
        const std::string seen =
            ask(other, "SELECT count(*) || ' ' || total(length(text)) FROM t") + ' ' +
            ask(other, "PRAGMA integrity_check");
        sqlite3_close(other);
        return seen;
    }
    static std::string ask(sqlite3* database, const char* sql) {
        std::string answer;
        sqlite3_exec(
            database, sql,
            [](void* to, int, char** texts, char**) {
                *static_cast<std::string*>(to) = texts[0];
                return 0;
            },
            &answer, nullptr);
        return answer;
    }
    static std::uint64_t writesOfThisThread() {
        std::ifstream counters("/proc/thread-self/io");
        std::string name;
        std::uint64_t count = 0;
        while (counters >> name >> count && name != "syscw:") {
        }
        return count;
    }

    const testing::TempTree tree_;
    const std::string path_ = (tree_.path() / "t.db").string();
    sqlite3* database_ = nullptr;
};

TEST_F(StoreDiskTest, WritesNeighbouringPagesAtOnce) {
    const StoreDisk disk(nullptr);
    open(disk.name());
    const std::uint64_t before = writesOfThisThread();
    insertRows(160); // 160 pages and more, that is 10 pieces
    EXPECT_LT(writesOfThisThread() - before, 30U);
    EXPECT_EQ(seenByOthers(), "160 640000.0 ok");
    close();
}

TEST_F(StoreDiskTest, OthersSeeWhatIsCommittedAndNothingElse) {
    const StoreDisk disk(nullptr);
    open(disk.name());
    insertRows(10);
    run("BEGIN");
    insertRows(10);
    EXPECT_EQ(seenByOthers(), "10 40000.0 ok");
    run("COMMIT");
    EXPECT_EQ(seenByOthers(), "20 80000.0 ok");
    run("PRAGMA wal_checkpoint(TRUNCATE)");
    EXPECT_EQ(seenByOthers(), "20 80000.0 ok");
    close();
}

TEST_F(StoreDiskTest, WhatWasMovedIntoTheFileIsThereThoughAReaderKeepsTheRest) {
    const StoreDisk disk(nullptr);
    open(disk.name());
    insertRows(40);
    sqlite3* reader = nullptr;
    sqlite3_open_v2(path_.c_str(), &reader, SQLITE_OPEN_READONLY, nullptr);
    sqlite3_exec(reader, "BEGIN", nullptr, nullptr, nullptr);
    EXPECT_EQ(ask(reader, "SELECT count(*) FROM t"), "40");
    run("UPDATE t SET text = 'x' WHERE id = 1");
    run("PRAGMA wal_checkpoint");
    EXPECT_EQ(seenByOthers(), "40 156001.0 ok");
    sqlite3_close(reader);
    close();
}

TEST_F(StoreDiskTest, WhatHasLeftTheCacheIsReadBack) {
    const StoreDisk disk(nullptr);
    open(disk.name());
    run("PRAGMA cache_size = 10");
    run("BEGIN");
    insertRows(200);
    run("UPDATE t SET text = text || 'x' WHERE id % 7 = 0");
    EXPECT_EQ(ask(database_, "SELECT total(length(text)) FROM t"), "800028.0");
    run("COMMIT");
    EXPECT_EQ(seenByOthers(), "200 800028.0 ok");
    close();
}

TEST_F(StoreDiskTest, WhatIsClosedWithoutACommitLeavesNothing) {
    const StoreDisk disk(nullptr);
    open(disk.name());
    insertRows(5);
    run("PRAGMA cache_size = 10");
    run("BEGIN");
    insertRows(100);
    sqlite3_db_config(database_, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
    close();
    EXPECT_EQ(seenByOthers(), "5 20000.0 ok");
}

TEST_F(StoreDiskTest, ADiskThatRefusesWhatWasGatheredFailsTheCommit) {
    FaultyDisk faulty;
    const StoreDisk disk(FaultyDisk::kName);
    open(disk.name());
    insertRows(5);
    faulty.fail(SQLITE_FULL);
    EXPECT_EQ(tryTo("INSERT INTO t(text) VALUES('lost')"), SQLITE_FULL);
    faulty.fail(SQLITE_OK);
    EXPECT_EQ(seenByOthers(), "5 20000.0 ok");
    run("INSERT INTO t(text) VALUES('kept')");
    EXPECT_EQ(seenByOthers(), "6 20004.0 ok");
    close();
}

} // namespace
} // namespace halyard::linux_
