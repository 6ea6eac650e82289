// Stores of earlier schemas, and of runs that did not end in order.

#include <fstream>
#include <gmock/gmock.h>

#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

// As the first version made it.
constexpr const char* kVersion1 =
    "CREATE TABLE upload_session(id INTEGER PRIMARY KEY, session_id INTEGER, session_info TEXT, "
    "user_info TEXT, opened REAL, closed REAL);"
    "CREATE TABLE upload_message(id INTEGER PRIMARY KEY, upload_session INTEGER, session_info "
    "TEXT, user_info TEXT, category INTEGER, type INTEGER, payload TEXT, time REAL);"
    "CREATE TABLE analytics_event(id INTEGER PRIMARY KEY, name TEXT, payload TEXT, time REAL);"
    "CREATE TABLE energy_event(id INTEGER PRIMARY KEY, client INTEGER, name TEXT, payload TEXT, "
    "time REAL);"
    "CREATE TABLE metric(id INTEGER PRIMARY KEY, metric_id INTEGER, message BLOB, time REAL);"
    "CREATE TABLE incident(id INTEGER PRIMARY KEY, signature TEXT, report TEXT, time REAL);"
    "PRAGMA user_version = 1;"
    "INSERT INTO upload_session VALUES(1, 71, '{}', '{}', 1699999000, 1699999100),"
    " (2, 72, '{}', '{}', 1699999200, NULL), (3, 73, '{}', '{}', 1699999300, NULL);"
    "INSERT INTO upload_message VALUES(1, 2, NULL, NULL, 4, 1, '{}', 1699999250),"
    " (2, 2, NULL, NULL, 4, 1, '{}', 1699999240), (3, 1, NULL, NULL, 4, 1, '{}', 1699999090),"
    " (4, NULL, '{}', '{}', 4, 1, '{}', 1699999999)";

class StoreMigrationTest : public StoreFixture {
protected:
    void makeVersion1() { Reader(options_.path).rows(kVersion1); }
    std::vector<std::string> sessions() {
        return reader().rows("SELECT id, closed, ended FROM upload_session ORDER BY id");
    }
    const platform::Repeats repeats_{1, 2, 3, 1700000004, 1700000005};
    const std::vector<std::string> migrated_ = {
        "1|1699999100.0|stopped", "2|1699999240.0|interrupted", "3|1699999300.0|interrupted"};
};

TEST_F(StoreMigrationTest, TheFirstVersionBecomesTheLast) {
    makeVersion1();
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_EQ(reader().number("PRAGMA user_version"), 2);
    EXPECT_EQ(sessions(), migrated_);
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 4);
    EXPECT_TRUE(store_->addRepeats(store_->openUpload(74, {}, {}), repeats_));
    flush();
    EXPECT_EQ(reader().one("SELECT upload_session, count FROM repeat"), "4|3");
    EXPECT_EQ(log_.countOf("damaged", LogLevel::Error), 0U);
}

TEST_F(StoreMigrationTest, AMigratedStoreHasTheSchemaOfANewOne) {
    const char* const columns = "SELECT t.name, c.name, c.type FROM sqlite_schema t "
                                "JOIN pragma_table_info(t.name) c ORDER BY t.rowid, c.cid";
    open();
    const auto fresh = reader().rows(columns);
    store_.reset();
    std::filesystem::remove(options_.path);
    makeVersion1();
    open();
    EXPECT_EQ(reader().rows(columns), fresh);
}

TEST_F(StoreMigrationTest, AFirstVersionThatIsDamagedIsCarriedOver) {
    makeVersion1();
    // For which it is set aside.
    reader().rows("ALTER TABLE energy_event DROP COLUMN client;"
                  "INSERT INTO energy_event VALUES(8, 'event', '{}', 1699999001)");
    open();
    EXPECT_EQ(log_.countOf("is damaged, set aside", LogLevel::Error), 1U);
    EXPECT_THAT(log_.waitFor("carried over"), ::testing::HasSubstr("carried over 8 rows"));
    EXPECT_THAT(log_.waitFor("carried over"), ::testing::HasSubstr("in 0 places"));
    EXPECT_EQ(sessions(), migrated_);
    EXPECT_EQ(reader().one("SELECT * FROM energy_event"), "8|NULL|event|{}|1699999001.0");
}

TEST_F(StoreMigrationTest, SessionsThatARunLeftOpenWereInterrupted) {
    open();
    const auto upload = store_->openUpload(5, {}, {});
    clock_.advance(std::chrono::seconds(3));
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    const auto silent = store_->openUpload(6, {}, {});
    flush();
    EXPECT_EQ(sessions(), (std::vector<std::string>{"1|NULL|NULL", "2|NULL|NULL"}));
    clock_.advance(std::chrono::hours(1));
    open();
    EXPECT_EQ(sessions(), (std::vector<std::string>{"1|1700000003.0|interrupted",
                                                    "2|1700000003.0|interrupted"}));
}

TEST_F(StoreMigrationTest, OpenSessionsOfThisRunOutliveADamagedFile) {
    open();
    const auto upload = store_->openUpload(5, {}, {});
    flush();
    std::ofstream(options_.path) << std::string(100'000, 'x');
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    flush();
    EXPECT_EQ(reader().one("SELECT session_id, closed, ended FROM upload_session"), "5|NULL|NULL");
}

TEST_F(StoreMigrationTest, RepeatsAreCarriedOver) {
    open();
    EXPECT_TRUE(store_->addRepeats(store_->openUpload(5, {}, {}), repeats_));
    store_.reset();
    reader().rows("ALTER TABLE incident DROP COLUMN time;"
                  "INSERT INTO repeat VALUES(7, 1, 'x', 1, 1, 0, 0)");
    open();
    EXPECT_EQ(reader().one("SELECT * FROM repeat"), "1|1|1|2|3|1700000004.0|1700000005.0");
}

} // namespace
} // namespace halyard::linux_
