// Files that cannot be read for a while, or go away piece by piece.

#include <fstream>

#include "linux/store/FaultyDiskTesting.h"
#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

class StoreKeeperTest : public StoreFixture {
protected:
    StoreKeeperTest() {
        options_.vfs = FaultyDisk::kName;
        options_.lookPause = 0ms;
    }
    ~StoreKeeperTest() override { store_.reset(); }

    // A closed store of one session and so many messages.
    void makeStore(int messages) {
        open();
        const auto upload = store_->openUpload(77, {}, {});
        for (int i = 0; i < messages; ++i) {
            EXPECT_TRUE(store_->addMessage(upload, 1, 1, examplePayload()));
        }
        store_.reset();
    }
    void add(int count) {
        addSingles(count, {});
        flush();
    }
    std::int64_t messages() { return reader().number("SELECT count(*) FROM upload_message"); }
    std::size_t setAside() {
        std::size_t files = 0;
        for (const auto& entry : std::filesystem::directory_iterator(directory_.path())) {
            files += entry.path().string().find(".damaged-") != std::string::npos ? 1U : 0U;
        }
        return files;
    }
    // By another's commit, with nothing left in the log.
    void makeItReadAgain() {
        Reader(options_.path)
            .rows("INSERT INTO incident(id, signature) VALUES(1, '{}'); "
                  "PRAGMA wal_checkpoint(TRUNCATE)");
    }
    std::filesystem::path companion(const char* end) { return options_.path.string() + end; }
    void remove(const char* end) { std::filesystem::remove(companion(end)); }
    // Sets an unreadable store aside, with one new message in its place.
    void giveUpAStoreOf(int messages) {
        makeStore(messages);
        disk_.failReadsOf(options_.path);
        open();
        addSingles(1, {});
        store_->flush([] {});
        log_.waitFor("cannot be read");
        clock_.advance(options_.unreadableFor);
        log_.waitFor("cannot be read, set aside");
        flush();
    }

    FaultyDisk disk_;
};

TEST_F(StoreKeeperTest, AFileThatCannotBeReadForAWhileIsKept) {
    makeStore(100);
    disk_.failReadsOf(options_.path);
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_NE(log_.waitFor("cannot write").find("input/output error"), std::string::npos);
    addSingles(2, {});
    store_->flush([] {});
    clock_.advance(options_.unreadableFor - 1ns);
    disk_.readAgain();
    flush();
    EXPECT_EQ(messages(), 102);
    EXPECT_EQ(setAside(), 0U);
    EXPECT_EQ(total(store_->status().lost), 0U);
}

TEST_F(StoreKeeperTest, ReadErrorsWhileRunningCostNothingEither) {
    makeStore(100);
    open();
    add(1);
    makeItReadAgain();
    disk_.failReadsOf(options_.path);
    addSingles(2, {});
    store_->flush([] {});
    log_.waitFor("cannot write");
    disk_.readAgain();
    flush();
    EXPECT_EQ(messages(), 103);
    EXPECT_EQ(setAside(), 0U);
}

TEST_F(StoreKeeperTest, NonsenseThatIsReadOnceIsNotBelieved) {
    makeStore(1000);
    disk_.garble(1);
    open();
    add(1);
    EXPECT_EQ(messages(), 1001);
    EXPECT_EQ(setAside(), 0U);
    EXPECT_EQ(log_.countOf("looked damaged and is not", LogLevel::Default), 1U);
}

TEST_F(StoreKeeperTest, AFileThatStaysUnreadableIsGivenUpAndCarriedOverLater) {
    giveUpAStoreOf(100);
    EXPECT_EQ(messages(), 1);
    disk_.readAgain();
    clock_.advance(options_.firstRereading);
    store_->setLimits(options_.limits); // Wakes the writer.
    log_.waitFor("carried over 101 rows");
    EXPECT_EQ(messages(), 101);
    EXPECT_EQ(reader().one("SELECT id < (SELECT max(id) FROM upload_message), ended "
                           "FROM upload_session"),
              "1|interrupted");
    add(1);
    EXPECT_EQ(setAside(), 1U); // and no note that there is something to read
}

TEST_F(StoreKeeperTest, TheNextRunCarriesOverWhatCouldNotBeRead) {
    giveUpAStoreOf(100);
    open();
    disk_.readAgain();
    clock_.advance(options_.lastRereading);
    store_->setLimits(options_.limits);
    log_.waitFor("carried over 101 rows");
    EXPECT_EQ(messages(), 101);
}

TEST_F(StoreKeeperTest, OpenSessionsOfThisRunOutliveAFileThatIsGivenUp) {
    open();
    const auto upload = store_->openUpload(5, {}, {});
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    flush();
    makeItReadAgain();
    disk_.failReadsOf(options_.path);
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    store_->flush([] {});
    log_.waitFor("cannot write");
    clock_.advance(options_.unreadableFor);
    flush();
    disk_.readAgain();
    clock_.advance(options_.firstRereading);
    store_->setLimits(options_.limits);
    log_.waitFor("carried over 3 rows");
    EXPECT_EQ(reader().rows("SELECT session_id, ended FROM upload_session ORDER BY id"),
              (std::vector<std::string>{"5|interrupted", "5|NULL"}));
    EXPECT_EQ(messages(), 2);
}

TEST_F(StoreKeeperTest, ALogThatIsRemovedTakesNothingAlong) {
    open();
    add(1);
    remove("-wal");
    add(1);
    EXPECT_EQ(messages(), 2); // What a kill would leave.
    add(1);
    EXPECT_EQ(messages(), 3);
    EXPECT_EQ(log_.countOf("was removed or replaced, what was in it is kept", LogLevel::Error), 1U);
}

TEST_F(StoreKeeperTest, AnIndexOfTheLogThatIsRemovedTakesNothingAlongEither) {
    open();
    add(1);
    remove("-shm");
    add(1);
    EXPECT_EQ(messages(), 2);
    EXPECT_EQ(reader().one("PRAGMA integrity_check"), "ok");
}

TEST_F(StoreKeeperTest, AnOldCopyInThePlaceOfTheLogIsNotUsed) {
    open();
    add(5);
    std::filesystem::copy_file(companion("-wal"), companion("-copy"));
    add(5);
    std::filesystem::rename(companion("-copy"), companion("-wal"));
    add(1);
    EXPECT_EQ(messages(), 11);
    EXPECT_EQ(reader().one("PRAGMA integrity_check"), "ok");
}

TEST_F(StoreKeeperTest, ALogThatIsRemovedBeforeTheEndIsKeptAsWell) {
    open();
    add(2);
    remove("-wal");
    store_.reset();
    EXPECT_EQ(messages(), 2);
}

TEST_F(StoreKeeperTest, AReaderThatHoldsALostLogUpCostsNothing) {
    open();
    add(1);
    auto reading = std::make_unique<Reader>(options_.path);
    reading->rows("BEGIN; SELECT * FROM upload_message");
    add(1);
    remove("-wal");
    addSingles(1, {});
    store_->flush([] {});
    EXPECT_NE(log_.waitFor("cannot write").find("locked"), std::string::npos);
    reading->rows("COMMIT");
    add(1);
    EXPECT_EQ(messages(), 4);
}

} // namespace
} // namespace halyard::linux_
