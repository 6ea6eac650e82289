#include "linux/store/StoreFacts.h"

#include <fstream>
#include <gmock/gmock.h>

#include "linux/store/FaultyDiskTesting.h"
#include "linux/store/Schema.h"
#include "linux/store/StoreSalvage.h"
#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::MatchesRegex;

constexpr const char* kNotes = "SELECT given, CAST(time AS INTEGER) - 1700000000 FROM consent "
                               "ORDER BY id";
constexpr const char* kIdentity = "SELECT device FROM identity";
constexpr const char* kMessages = "SELECT count(*) FROM upload_message";

class StoreFactsTest : public StoreFixture {
protected:
    // A task that was asked for is run between two looks at what is due.
    void untilWritten() {
        for (int i = 0; i < 2; ++i) {
            std::promise<void> done;
            store_->onThread([&] { done.set_value(); });
            done.get_future().wait();
        }
    }
    void openWith(bool consent) {
        open();
        store_->setConsent(consent);
        untilWritten();
    }
    void changeTo(bool consent) {
        clock_.advance(10s);
        store_->setConsent(consent);
        untilWritten();
    }
    std::uint64_t purge() {
        std::promise<std::uint64_t> rows;
        store_->purge([&](const auto& result) { rows.set_value(result.value()); });
        return rows.get_future().get();
    }
    std::vector<std::string> notes() { return reader().rows(kNotes); }
    std::string identity() { return reader().one(kIdentity); }
};

TEST_F(StoreFactsTest, AStoreHasARandomIdentityThatStays) {
    openWith(false);
    const std::string first = identity();
    EXPECT_THAT(first, MatchesRegex("[0-9a-f]{8}-[0-9a-f]{4}-4[0-9a-f]{3}-[89ab][0-9a-f]{3}-"
                                    "[0-9a-f]{12}"));
    openWith(true);
    EXPECT_EQ(identity(), first);

    options_.path = directory_ / "other.db";
    openWith(false);
    EXPECT_NE(identity(), first);
}

TEST_F(StoreFactsTest, NothingIsNotedOfAnOwnerWhoNeverAgreed) {
    openWith(false);
    openWith(false);

    EXPECT_THAT(notes(), ElementsAre());
}

TEST_F(StoreFactsTest, EachChangeIsNotedOnceWithItsTime) {
    openWith(true);
    changeTo(true);
    changeTo(false);
    changeTo(true);

    EXPECT_THAT(notes(), ElementsAre("1|0", "0|20", "1|30"));
}

TEST_F(StoreFactsTest, AStartNotesOnlyWhatHasChangedMeanwhile) {
    openWith(true);
    clock_.advance(10s);
    openWith(true);
    EXPECT_THAT(notes(), ElementsAre("1|0"));

    clock_.advance(10s);
    openWith(false);
    EXPECT_THAT(notes(), ElementsAre("1|0", "0|20"));
}

TEST_F(StoreFactsTest, WhatCannotBeNotedWaitsAndGoesInFrontOfTheRows) {
    options_.vfs = FaultyDisk::kName;
    FaultyDisk disk;
    openWith(true);
    disk.fail(SQLITE_FULL);
    clock_.advance(10s);
    store_->setConsent(false);
    log_.waitFor("cannot write");
    clock_.advance(10s);
    store_->setConsent(true);
    addSingles(1, {});

    disk.fail(SQLITE_OK);
    flush();
    EXPECT_THAT(notes(), ElementsAre("1|0", "0|10", "1|20"));
    EXPECT_EQ(reader().number(kMessages), 1);
    store_.reset(); // The disk goes first.
}

TEST_F(StoreFactsTest, AChangeThatCannotBeNotedIsTriedAgainWithoutRows) {
    options_.vfs = FaultyDisk::kName;
    FaultyDisk disk;
    openWith(false);
    disk.fail(SQLITE_FULL);
    store_->setConsent(true);
    log_.waitFor("cannot write");

    disk.fail(SQLITE_OK);
    log_.waitFor("again after");
    EXPECT_THAT(notes(), ElementsAre("1|0"));
    store_.reset();
}

TEST_F(StoreFactsTest, RetentionLeavesThemAlone) {
    options_.limits.maxAge = 1h;
    openWith(true);
    const std::string before = identity();
    addSingles(10, {});
    flush();
    clock_.advance(48h);
    addSingles(1, {});
    flush();

    EXPECT_EQ(reader().number(kMessages), 1);
    EXPECT_THAT(notes(), ElementsAre("1|0"));
    EXPECT_EQ(identity(), before);
}

TEST_F(StoreFactsTest, APurgeMakesANewIdentityAndNotesWhatIsInForceAnew) {
    openWith(true);
    changeTo(false);
    changeTo(true);
    const std::string before = identity();
    addSingles(3, {});
    flush();

    clock_.advance(10s);
    EXPECT_EQ(purge(), 3U);
    EXPECT_THAT(notes(), ElementsAre("1|30"));
    EXPECT_THAT(identity(), MatchesRegex("[0-9a-f-]{36}"));
    EXPECT_NE(identity(), before);
}

TEST_F(StoreFactsTest, NoByteOfTheOldIdentityIsLeftByAPurge) {
    openWith(true);
    const std::string before = identity();
    (void)purge();

    for (const char* end : {"", "-wal"}) {
        std::ifstream file(options_.path.native() + end, std::ios::binary);
        const std::string bytes{std::istreambuf_iterator<char>(file), {}};
        EXPECT_EQ(bytes.find(before), std::string::npos) << end;
    }
}

TEST_F(StoreFactsTest, AWithdrawalThatWaitsIsNotedBeforeAPurge) {
    options_.vfs = FaultyDisk::kName;
    FaultyDisk disk;
    openWith(true);
    disk.fail(SQLITE_FULL);
    store_->setConsent(false);
    log_.waitFor("cannot write");
    disk.fail(SQLITE_OK);

    clock_.advance(10s);
    (void)purge();
    EXPECT_THAT(notes(), ElementsAre("0|10"));
    store_.reset();
}

TEST_F(StoreFactsTest, AFileThatTakesTheStoresPlaceIsAnotherStore) {
    openWith(true);
    const std::string before = identity();
    addSingles(1, {});
    flush();
    clock_.advance(10s);
    std::filesystem::rename(options_.path, directory_ / "moved");
    addSingles(1, {});
    flush();

    EXPECT_NE(identity(), before);
    EXPECT_THAT(notes(), ElementsAre("1|0")); // Since when it holds.
}

TEST_F(StoreFactsTest, ADamagedStoreHandsThemOn) {
    openWith(true);
    changeTo(false);
    const std::string before = identity();
    store_.reset();
    // The table of contents says so of the first page of another table.
    Reader(options_.path)
        .rows("PRAGMA writable_schema = ON; UPDATE sqlite_schema SET rootpage = 99999 "
              "WHERE name = 'metric'");

    openWith(false);
    EXPECT_EQ(log_.countOf("is damaged, set aside", LogLevel::Error), 1U);
    EXPECT_EQ(identity(), before);
    EXPECT_THAT(notes(), ElementsAre("1|0", "0|10"));
}

TEST_F(StoreFactsTest, TablesOfAnotherShapeAreAsGoodAsDamaged) {
    Reader(options_.path).rows("CREATE TABLE consent(other TEXT); CREATE TABLE identity(x TEXT)");
    openWith(true);

    EXPECT_THAT(notes(), ElementsAre("1|0"));
    EXPECT_THAT(identity(), MatchesRegex("[0-9a-f-]{36}"));
}

TEST_F(StoreFactsTest, TheNewestThousandNotesAreKept) {
    open();
    for (int i = 0; i < 3; ++i) {
        for (int change = 0; change < 500; ++change) {
            store_->setConsent(change % 2 == 0);
        }
        untilWritten();
    }
    EXPECT_EQ(reader().number("SELECT count(*) FROM consent"), 1000);
    EXPECT_EQ(reader().number("SELECT max(id) FROM consent"), 1500);
}

class WaitingNotesTest : public ::testing::Test {
protected:
    WaitingNotesTest() { sqlite3_open(":memory:", &database_); }
    ~WaitingNotesTest() override { sqlite3_close(database_); }
    std::int64_t number(const char* sql) {
        StoreStatement statement;
        EXPECT_EQ(statement.prepare(database_, sql), SQLITE_OK);
        EXPECT_EQ(statement.step(), SQLITE_ROW);
        return statement.integer(0);
    }
    void carry(sqlite3* from) { EXPECT_EQ(storeCarryFacts(from, database_), SQLITE_OK); }

    testing::ManualClock clock_;
    sqlite3* database_ = nullptr;
};

TEST_F(WaitingNotesTest, BeyondTheirBoundWhatCannotBeNotedCountsAsRefused) {
    StoreFacts facts(clock_);
    for (int i = 0; i < 3000; ++i) {
        clock_.advance(1s);
        facts.setConsent(i % 2 == 0); // Given from 1 s to 2 s, from 3 s to 4 s...
    }
    facts.setConsent(true);
    EXPECT_EQ(facts.write(database_), SQLITE_OK);

    EXPECT_EQ(number("SELECT count(*) FROM consent"), kMaxConsentNotes);
    EXPECT_EQ(number("SELECT given FROM consent ORDER BY id DESC LIMIT 1"), 1);
    EXPECT_EQ(number("SELECT CAST(time AS INTEGER) - 1700000000 FROM consent ORDER BY id DESC "
                     "LIMIT 1"),
              3000);
    EXPECT_EQ(number("SELECT CAST(time AS INTEGER) - 1700000000 FROM consent WHERE given = 0 "
                     "ORDER BY id DESC LIMIT 1"),
              1000);
}

TEST_F(WaitingNotesTest, NotesThatAreReadLaterFallIntoTheirPlaces) {
    sqlite3* older = nullptr;
    sqlite3_open(":memory:", &older);
    ASSERT_EQ(storeMakeFacts(older), SQLITE_OK);
    ASSERT_EQ(storeMakeFacts(database_), SQLITE_OK);
    sqlite3_exec(older, "INSERT INTO consent(given, time) VALUES(1, 1.0), (0, 2.0), (1, 3.0)",
                 nullptr, nullptr, nullptr);
    sqlite3_exec(database_, "INSERT INTO consent(given, time) VALUES(1, 3.0), (0, 4.0)", nullptr,
                 nullptr, nullptr);
    carry(older);
    carry(older);
    sqlite3_close(older);

    EXPECT_EQ(number("SELECT count(*) FROM consent"), 4);
    EXPECT_EQ(number("SELECT sum(id * time) FROM consent"), 1 + 4 + 9 + 16);
    EXPECT_EQ(number("SELECT count(*) FROM identity"), 1);
}

} // namespace
} // namespace halyard::linux_
