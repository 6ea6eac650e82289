#include "linux/store/StoreRetention.h"

#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

class StoreRetentionTest : public StoreFixture {
protected:
    StoreRetentionTest() { options_.limits.maxBytes = StoreLimits::kLeastBytes; }

    static Dictionary row() { return {{"text", std::string(250, 'x')}}; }
    // Commits one row, and what retention does along with it.
    void commitOne() {
        store_->addMetric(0, "tick");
        flush();
    }
};

TEST_F(StoreRetentionTest, TheFileStaysWithinItsSizeAndKeepsTheNewest) {
    open();
    for (int i = 0; i < 20; ++i) {
        addSingles(1000, row());
        flush();
        clock_.advance(1s);
    }
    EXPECT_LE(store_->status().fileBytes, StoreLimits::kLeastBytes + 64 * 1024);
    EXPECT_EQ(reader().number("SELECT max(id) FROM upload_message"), 20000);
    EXPECT_GT(reader().number("SELECT count(*) FROM upload_message"), 300);
    EXPECT_EQ(reader().one("SELECT max(id) - min(id) + 1 = count(*) FROM upload_message"), "1");
    EXPECT_EQ(total(store_->status().lost), 0U);
    EXPECT_TRUE(store_->close());
    EXPECT_LE(std::filesystem::file_size(options_.path), StoreLimits::kLeastBytes + 64 * 1024);
}

TEST_F(StoreRetentionTest, WhatRemainsIsTheLastStretchOfEveryTable) {
    open();
    for (int i = 0; i < 3000; ++i) {
        addSingles(1, row());
        store_->addEnergyEvent(1, "event", row());
        clock_.advance(1ms);
    }
    flush();
    const auto messages = reader().number("SELECT count(*) FROM upload_message");
    const auto events = reader().number("SELECT count(*) FROM energy_event");
    EXPECT_GT(messages, 100);
    EXPECT_LE(std::abs(messages - events), 1);
}

TEST_F(StoreRetentionTest, OldRowsGoByAgeAlone) {
    open();
    addSingles(10, {});
    flush();
    clock_.advance(options_.limits.maxAge - 1s);
    addSingles(1, {});
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 11);
    clock_.advance(2 * 60s);
    commitOne();
    EXPECT_EQ(reader().one("SELECT id FROM upload_message"), "11");
    EXPECT_EQ(store_->status().removed[static_cast<std::size_t>(StoreTable::UploadMessage)], 10U);
}

TEST_F(StoreRetentionTest, AClockThatIsSetForwardTakesNoRowsAlong) {
    open();
    addSingles(10, {});
    flush();
    clock_.setWallTime(clock_.wallTime() + std::chrono::days(10));
    clock_.advance(options_.agePeriod);
    commitOne();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 10);
    open(); // The next run does not take them either.
    clock_.advance(options_.agePeriod);
    commitOne();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 10);
    clock_.advance(options_.limits.maxAge - 60s);
    commitOne();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 0);
}

TEST_F(StoreRetentionTest, AJumpIsKnownToTheNextRunHoweverSoonThatComes) {
    for (const bool rowsCome : {true, false}) {
        open();
        addSingles(10, {});
        flush();
        clock_.setWallTime(clock_.wallTime() + std::chrono::days(10));
        if (rowsCome) {
            commitOne();
        }
        open();
        clock_.advance(options_.agePeriod);
        commitOne();
    }
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 20);
}

TEST_F(StoreRetentionTest, AJumpIsKnownAfterAKillIfAnythingWasCommittedSince) {
    open();
    addSingles(10, {});
    flush();
    clock_.setWallTime(clock_.wallTime() + std::chrono::days(10));
    commitOne();
    EXPECT_EQ(reader().number("SELECT count(*) FROM clock_jump"), 1);
}

TEST_F(StoreRetentionTest, LimitsCanBeLoweredAtRunTime) {
    options_.limits.maxBytes = 64 * 1024 * 1024;
    open();
    for (int i = 0; i < 20; ++i) {
        addSingles(1000, row());
    }
    flush();
    EXPECT_GT(store_->status().fileBytes, 4U * 1024 * 1024);
    store_->setLimits({StoreLimits::kLeastBytes, options_.limits.maxAge});
    for (int i = 0; i < 100 && store_->status().fileBytes > 2 * StoreLimits::kLeastBytes; ++i) {
        commitOne();
    }
    EXPECT_LE(store_->status().fileBytes, 2 * StoreLimits::kLeastBytes);
    EXPECT_EQ(reader().number("SELECT max(id) FROM upload_message"), 20000);
    clock_.advance(2s);
    store_->setLimits({StoreLimits::kLeastBytes, 1s});
    commitOne();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 0);
}

TEST_F(StoreRetentionTest, AnOpenSessionStaysAndAClosedOneGoesWithItsMessages) {
    open();
    const auto open = store_->openUpload(1, {}, {});
    const auto closed = store_->openUpload(2, {}, {});
    EXPECT_TRUE(store_->addMessage(open, 1, 1, row()));
    EXPECT_TRUE(store_->addMessage(closed, 1, 1, row()));
    store_->closeUpload(closed);
    clock_.advance(1s);
    for (int i = 0; i < 5; ++i) {
        addSingles(1000, row());
        flush();
        clock_.advance(1s);
    }
    EXPECT_EQ(reader().rows("SELECT session_id FROM upload_session"),
              std::vector<std::string>{"1"});
    EXPECT_TRUE(store_->addMessage(open, 1, 1, {{"late", true}}));
    flush();
    EXPECT_EQ(reader().one("SELECT s.session_id FROM upload_message m JOIN upload_session s "
                           "ON s.id = m.upload_session"),
              "1");
}

TEST_F(StoreRetentionTest, RepeatsGoWithTheirAge) {
    open();
    const auto upload = store_->openUpload(4, {}, {});
    const double now = platform::secondsSince1970(clock_.wallTime());
    EXPECT_TRUE(store_->addRepeats(upload, {1, 1, 5, now, now}));
    flush();
    clock_.advance(options_.limits.maxAge - 60s);
    EXPECT_TRUE(store_->addRepeats(upload, {1, 1, 7, now, now + 1000}));
    commitOne();
    EXPECT_EQ(reader().number("SELECT count(*) FROM repeat"), 2);
    clock_.advance(2 * 60s);
    commitOne();
    EXPECT_EQ(reader().one("SELECT count FROM repeat"), "7");
}

TEST_F(StoreRetentionTest, ASessionThatACrashLeftOpenGoesToo) {
    {
        open();
        const auto upload = store_->openUpload(3, {}, {});
        store_.reset(); // without closing it
    }
    clock_.advance(1s);
    open();
    EXPECT_EQ(reader().one("SELECT ended FROM upload_session"), "interrupted");
    clock_.advance(options_.limits.maxAge + 60s);
    commitOne();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_session"), 0);
}

} // namespace
} // namespace halyard::linux_
