#include "reading/StoreReader.h"

#include <algorithm>
#include <filesystem>
#include <gmock/gmock.h>
#include <set>
#include <sys/stat.h>

#include "reading/TestStoreTesting.h"

namespace halyard::reading {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

std::vector<std::int64_t> idsOf(StoreReader& reader, const StoreReader::Scan& scan) {
    std::vector<std::int64_t> ids;
    EXPECT_TRUE(reader
                    .forEach(scan,
                             [&](const Row& row) {
                                 ids.push_back(row.integer(0));
                                 return true;
                             })
                    .ok());
    return ids;
}

std::set<std::string> filesIn(const std::filesystem::path& directory) {
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(directory)) {
        names.insert(entry.path().filename());
    }
    return names;
}

Trouble troubleOf(const std::filesystem::path& path) {
    const auto opened = StoreReader::open(path);
    EXPECT_FALSE(opened.ok());
    return opened.ok() ? Trouble(Exit::Done, "") : opened.failure();
}

TEST(StoreReaderTest, AStoreThatNobodyHasOpenIsReadWithoutATraceBesideIt) {
    TestStore store;
    store.addMessage({}, 4, 1, "{}", 10);
    store.close();
    StoreReader reader = store.open();
    EXPECT_FALSE(reader.isLive());
    EXPECT_THAT(idsOf(reader, {"upload_message", "time"}), ElementsAre(1));
    EXPECT_EQ(filesIn(store.directory()), std::set<std::string>{"telemetry.db"});
}

TEST(StoreReaderTest, RowsOfAnOpenWriteAheadLogAreRead) {
    TestStore store;
    store.addMessage({}, 4, 1, "{}", 10);
    StoreReader reader = store.open();
    store.addMessage({}, 4, 1, "{}", 11);
    EXPECT_THAT(idsOf(reader, {"upload_message", "time"}), ElementsAre(1, 2));
}

TEST(StoreReaderTest, NoTransactionIsOpenWhileRowsAreUsed) {
    TestStore store;
    store.addMessage({}, 4, 1, "{}", 10);
    StoreReader reader = store.open();
    EXPECT_TRUE(
        reader
            .forEach({"upload_message", "time"},
                     [&](const Row&) {
                         // Moves the log into the file, which a reader would hinder.
                         store.execute("PRAGMA busy_timeout = 0");
                         store.execute("PRAGMA wal_checkpoint(TRUNCATE)");
                         EXPECT_EQ(std::filesystem::file_size(store.path().string() + "-wal"), 0U);
                         return true;
                     })
            .ok());
}

TEST(StoreReaderTest, EveryRowOfManyBatchesComesOnceAndInOrder) {
    TestStore store;
    store.execute("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 5000) "
                  "INSERT INTO upload_message(category, type, payload, time) "
                  "SELECT 4, 1, '{}', i FROM n");
    StoreReader reader = store.open();
    const auto ids = idsOf(reader, {"upload_message", "time", "", 10, 4990});
    ASSERT_EQ(ids.size(), 4980U);
    EXPECT_TRUE(std::is_sorted(ids.begin(), ids.end()));
    EXPECT_EQ(ids.front(), 11);
}

TEST(StoreReaderTest, ARowLargerThanABatchIsReadWhole) {
    TestStore store;
    store.addMessage({}, 4, 1, "{\"a\":\"" + std::string(3'000'000, 'x') + "\"}", 10);
    StoreReader reader = store.open();
    std::size_t size = 0;
    EXPECT_TRUE(reader
                    .forEach({"upload_message", "payload"},
                             [&](const Row& row) {
                                 size = row.text(1).size();
                                 return true;
                             })
                    .ok());
    EXPECT_EQ(size, 3'000'008U);
}

TEST(StoreReaderTest, RowsOfAStretchOfTimeAreFoundByTheirIds) {
    TestStore store;
    for (int i = 1; i <= 1000; ++i) {
        store.addMessage({}, 4, 1, "{}", 1e9 + 100.0 * i);
    }
    StoreReader reader = store.open();
    const auto ids = reader.idsIn({1e9 + 50000, 1e9 + 60000}, "upload_message", "time");
    ASSERT_TRUE(ids.ok());
    EXPECT_EQ(ids.value().after, 499);
    EXPECT_EQ(ids.value().upTo, 600);
}

TEST(StoreReaderTest, RowsOfAClockThatWasNotSetHideNothing) {
    TestStore store;
    for (int i = 1; i <= 100; ++i) {
        // The machine starts anew in the middle, in 1970.
        store.addMessage({}, 4, 1, "{}", i > 40 && i <= 60 ? i : 1e9 + 100.0 * i);
    }
    StoreReader reader = store.open();
    const auto ids = reader.idsIn({1e9 + 3000, TimeRange().until}, "upload_message", "time");
    ASSERT_TRUE(ids.ok());
    EXPECT_EQ(ids.value().after, 29);
}

TEST(StoreReaderTest, NoFileIsNoStore) {
    EXPECT_EQ(troubleOf("/nonexistent/telemetry.db").exit, Exit::NothingThere);
}

TEST(StoreReaderTest, ANewerSchemaIsToldAsSuch) {
    TestStore store;
    store.execute("PRAGMA user_version = 99");
    EXPECT_THAT(troubleOf(store.path()).text, HasSubstr("schema 99, which is newer"));
}

TEST(StoreReaderTest, WhatIsNoDatabaseIsToldAsDamage) {
    const testing::TempTree tree;
    const auto path = tree.write("telemetry.db", std::string(8192, 'x'));
    const Trouble trouble = troubleOf(path);
    EXPECT_EQ(trouble.exit, Exit::Failed);
    EXPECT_THAT(trouble.text, HasSubstr("is damaged"));
    EXPECT_EQ(filesIn(tree.path()), std::set<std::string>{"telemetry.db"});
}

TEST(StoreReaderTest, ADatabaseOfSomebodyElseIsNoStore) {
    const testing::TempTree tree;
    sqlite3* database = nullptr;
    sqlite3_open((tree / "telemetry.db").c_str(), &database);
    sqlite3_exec(database, "CREATE TABLE theirs(x)", nullptr, nullptr, nullptr);
    sqlite3_close(database);
    EXPECT_THAT(troubleOf(tree / "telemetry.db").text, HasSubstr("is no store"));
}

TEST(StoreReaderTest, APathThatLooksLikeAQueryIsAPath) {
    const TestStore store;
    const testing::TempTree tree;
    const auto odd = tree / "a?b#c%20 d";
    std::filesystem::create_directory(odd);
    std::filesystem::copy_file(store.path(), odd / "telemetry.db");
    std::filesystem::copy_file(store.path().string() + "-wal", odd / "telemetry.db-wal");
    EXPECT_TRUE(StoreReader::open(odd / "telemetry.db").ok());
}

TEST(StoreReaderTest, WhoeverHasTheStoreOpenIsKnown) {
    TestStore store;
    store.addMessage({}, 4, 1, "{}", 10);
    // Locks of one's own process do not count.
    EXPECT_FALSE(storeHolder(store.path()));
    store.close();
    EXPECT_FALSE(storeHolder(store.path()));
}

} // namespace
} // namespace halyard::reading
