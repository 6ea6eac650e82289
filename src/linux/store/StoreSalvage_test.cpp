// Files that are damaged, foreign or from the future.

#include "linux/store/StoreSalvage.h"

#include <fstream>
#include <sstream>

#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

constexpr std::int64_t kPage = 8192;

class StoreSalvageTest : public StoreFixture {
protected:
    // A closed store of so many messages.
    void makeStore(int rows) {
        open();
        const auto upload = store_->openUpload(77, {}, {});
        for (int i = 0; i < rows; ++i) {
            EXPECT_TRUE(store_->addMessage(upload, 1, 1, examplePayload()));
        }
        store_->addMetric(3, "metric");
        store_->closeUpload(upload);
        store_.reset();
    }
    void overwrite(std::int64_t offset, const std::string& bytes) {
        std::fstream file(options_.path, std::ios::in | std::ios::out | std::ios::binary);
        file.seekp(offset);
        file << bytes;
    }
    std::int64_t fileBytes() {
        return static_cast<std::int64_t>(std::filesystem::file_size(options_.path));
    }
    std::string contents(const std::filesystem::path& path) {
        std::ostringstream text;
        text << std::ifstream(path, std::ios::binary).rdbuf();
        return text.str();
    }
    std::vector<std::string> setAside() {
        std::vector<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator(directory_.path())) {
            const std::string name = entry.path().filename().string();
            const bool companion = name.ends_with("-wal") || name.ends_with("-shm");
            if (name.find(".damaged-") != std::string::npos && !companion) {
                names.push_back(name);
            }
        }
        return names;
    }
};

TEST_F(StoreSalvageTest, AFileThatIsNoDatabaseIsSetAside) {
    std::ofstream(options_.path) << std::string(5000, 'x');
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_EQ(setAside(), std::vector<std::string>{"telemetry.db.damaged-20231114T221320Z"});
    EXPECT_EQ(contents(directory_.path() / setAside().front()), std::string(5000, 'x'));
    EXPECT_EQ(log_.countOf("is damaged, set aside", LogLevel::Error), 1U);
    addSingles(1, {});
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 1);
}

TEST_F(StoreSalvageTest, AnEmptyFileIsANewStore) {
    std::ofstream(options_.path).flush();
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_TRUE(setAside().empty());
}

TEST_F(StoreSalvageTest, RowsAroundADamagedPageAreCarriedOver) {
    makeStore(4000);
    const std::int64_t middle = fileBytes() / kPage / 2 * kPage;
    overwrite(middle, std::string(kPage, '\xA5'));
    open();
    EXPECT_EQ(setAside().size(), 1U);
    EXPECT_GT(reader().number("SELECT count(*) FROM upload_message"), 3800);
    EXPECT_LT(reader().number("SELECT count(*) FROM upload_message"), 4000);
    EXPECT_EQ(reader().one("SELECT session_id, closed IS NULL FROM upload_session"), "77|0");
    EXPECT_EQ(reader().one("SELECT message FROM metric"), "metric");
    addSingles(1, {});
    flush();
    EXPECT_EQ(reader().number("SELECT max(id) FROM upload_message"), 4001);
    EXPECT_EQ(reader().one("PRAGMA integrity_check"), "ok");
}

TEST_F(StoreSalvageTest, RowsThatTheDaemonCannotHaveWrittenAreLeftOut) {
    makeStore(3);
    reader().rows("UPDATE upload_message SET payload = '{\"a' WHERE id = 2;"
                  "INSERT INTO metric VALUES(2, 'no number', 'x', 1.7e9);"
                  "INSERT INTO incident VALUES(1, '{}', 'kept', 1.7e9), (2, NULL, 'none', 1.7e9);"
                  "INSERT INTO upload_message VALUES(4, NULL, '{}', 'broken', 1, 1, '{}', 1.7e9),"
                  " (5, NULL, '{}', '{}', 1, 1, '{}', 1.7e9);"
                  "ALTER TABLE energy_event DROP COLUMN time"); // for which it is set aside
    open();
    EXPECT_EQ(setAside().size(), 1U);
    EXPECT_EQ(reader().rows("SELECT id FROM upload_message"),
              (std::vector<std::string>{"1", "3", "5"}));
    EXPECT_EQ(reader().rows("SELECT id FROM metric"), std::vector<std::string>{"1"});
    EXPECT_EQ(reader().rows("SELECT id FROM incident"), std::vector<std::string>{"1"});
    EXPECT_EQ(log_.countOf("carried over 6 rows", LogLevel::Default), 1U);
}

TEST_F(StoreSalvageTest, ATruncatedFileGivesWhatIsLeftOfIt) {
    makeStore(4000);
    std::filesystem::resize_file(options_.path, static_cast<std::uintmax_t>(fileBytes() / 2));
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_EQ(setAside().size(), 1U);
    EXPECT_GT(reader().number("SELECT count(*) FROM upload_message"), 1000);
    EXPECT_EQ(reader().one("PRAGMA integrity_check"), "ok");
}

TEST_F(StoreSalvageTest, DamageThatShowsWhileRunningIsRepairedToo) {
    makeStore(4000);
    open();
    const auto upload = store_->openUpload(78, {}, {});
    addSingles(1, {});
    flush();
    // Another's commit makes the store read pages again.
    reader().rows("INSERT INTO incident(id) VALUES(1)");
    overwrite(10 * kPage, std::string(10 * kPage, '\xA5'));
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    store_->setLimits({StoreLimits::kLeastBytes, options_.limits.maxAge});
    flush();
    log_.waitFor("is damaged, set aside");
    log_.waitFor("carried over");
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    flush();
    EXPECT_EQ(reader().rows("SELECT s.session_id FROM upload_message m JOIN upload_session s "
                            "ON s.id = m.upload_session WHERE s.session_id = 78"),
              (std::vector<std::string>{"78", "78"}));
    EXPECT_EQ(total(store_->status().lost), 0U);
}

TEST_F(StoreSalvageTest, OnlyTheNewestDamagedFilesAreKept) {
    for (int i = 0; i < 5; ++i) {
        std::ofstream(options_.path) << "no database " << i;
        clock_.advance(std::chrono::hours(1));
        open();
        store_.reset();
    }
    EXPECT_EQ(setAside().size(), kDamagedStoresKept);
}

TEST_F(StoreSalvageTest, ANewerSchemaIsLeftUntouched) {
    makeStore(10);
    { reader().rows("PRAGMA user_version = 3"); }
    const std::string before = contents(options_.path);
    open();
    EXPECT_FALSE(store_->isOpen());
    EXPECT_FALSE(store_->addSingleMessage({}, {}, 1, 1, {}));
    EXPECT_EQ(log_.countOf("its schema is newer", LogLevel::Error), 1U);
    store_.reset();
    EXPECT_EQ(contents(options_.path), before);
    EXPECT_TRUE(setAside().empty());
}

TEST_F(StoreSalvageTest, AnOlderSchemaMigrates) {
    {
        Reader(options_.path)
            .rows("CREATE TABLE metric(id INTEGER PRIMARY KEY, metric_id INTEGER, "
                  "message BLOB, time REAL); INSERT INTO metric VALUES(5, 1, 'x', 1700000000)");
    }
    open();
    store_->addMetric(1, "y");
    flush();
    EXPECT_EQ(reader().rows("SELECT id FROM metric"), (std::vector<std::string>{"5", "6"}));
    EXPECT_EQ(reader().number("PRAGMA user_version"), 2);
}

TEST_F(StoreSalvageTest, TablesOfAnotherShapeCountAsDamaged) {
    { Reader(options_.path).rows("CREATE TABLE metric(a, b); PRAGMA user_version = 1"); }
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_EQ(setAside().size(), 1U);
}

} // namespace
} // namespace halyard::linux_
