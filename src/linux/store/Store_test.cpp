// The store as its users and an outside reader see it, while all goes well.

#include "linux/store/Store.h"

#include "common/HYReportingUtility.h"
#include "common/Json.h"
#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

class StoreTest : public StoreFixture {
protected:
    StoreUploadPtr openUpload(std::int64_t id) {
        return store_->openUpload(id, {{"kRelayReportingSessionInfoSessionID", id}},
                                  {{"kRelayReportingUserInfoServiceName", "alarms_session"}});
    }
};

TEST_F(StoreTest, CreatesTheSchema) {
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_EQ(reader().number("PRAGMA user_version"), 2);
    EXPECT_EQ(reader().rows("SELECT name FROM sqlite_schema WHERE type = 'table' AND name NOT IN "
                            "('consent', 'identity') ORDER BY rowid"),
              (std::vector<std::string>{"upload_session", "upload_message", "analytics_event",
                                        "energy_event", "metric", "incident", "repeat"}));
    EXPECT_EQ(reader().one("SELECT count(*) FROM sqlite_schema WHERE type = 'index'"), "0");
    EXPECT_EQ(reader().one("PRAGMA journal_mode"), "wal");
}

TEST_F(StoreTest, TablesHaveTheColumnsThatReadersRelyOn) {
    open();
    EXPECT_EQ(
        reader().rows("SELECT t.name || '(' || group_concat(c.name || ' ' || c.type || "
                      "iif(c.pk, ' KEY', ''), ', ') || ')' FROM sqlite_schema t "
                      "JOIN pragma_table_info(t.name) c WHERE t.name NOT IN ('consent', "
                      "'identity') GROUP BY t.name ORDER BY t.rowid, c.cid"),
        (std::vector<std::string>{
            "upload_session(id INTEGER KEY, session_id INTEGER, session_info TEXT, user_info "
            "TEXT, opened REAL, closed REAL, ended TEXT)",
            "upload_message(id INTEGER KEY, upload_session INTEGER, session_info TEXT, "
            "user_info TEXT, category INTEGER, type INTEGER, payload TEXT, time REAL)",
            "analytics_event(id INTEGER KEY, name TEXT, payload TEXT, time REAL)",
            "energy_event(id INTEGER KEY, client INTEGER, name TEXT, payload TEXT, time REAL)",
            "metric(id INTEGER KEY, metric_id INTEGER, message BLOB, time REAL)",
            "incident(id INTEGER KEY, signature TEXT, report TEXT, time REAL)",
            "repeat(id INTEGER KEY, upload_session INTEGER, category INTEGER, type INTEGER, "
            "count INTEGER, first REAL, last REAL)"}));
}

TEST_F(StoreTest, StatusNamesTablesAndLosses) {
    StoreStatus status;
    status.rows = {1, 2, 3, 4, 5, 6, 7};
    status.lost[static_cast<std::size_t>(StoreTable::Metric)] = {1, 2, 3, 4, 5, 6, 7};
    status.removed = {7, 6, 5, 4, 3, 2, 1};
    const Dictionary told = describe(status);
    EXPECT_EQ(toJson(told["rows"]), "{\"upload_session\":1,\"upload_message\":2,"
                                    "\"analytics_event\":3,\"energy_event\":4,"
                                    "\"metric\":5,\"incident\":6,\"repeat\":7}");
    EXPECT_EQ(toJson(told["lost"].dictionary()["metric"]),
              "{\"no_store\":1,\"disk_full\":2,\"read_only\":3,"
              "\"locked\":4,\"io_error\":5,\"stuck\":6,\"rejected\":7}");
    EXPECT_EQ(told["lost"].dictionary().size(), kStoreTables);
    EXPECT_EQ(told["removed"].dictionary()["upload_session"], Value(7));
}

TEST_F(StoreTest, WritesSessionsAndTheirMessages) {
    open();
    const auto upload = openUpload(42);
    clock_.advance(2s);
    EXPECT_TRUE(store_->addMessage(upload, 4, 1, examplePayload()));
    clock_.advance(500ms);
    store_->closeUpload(upload);
    flush();
    EXPECT_EQ(reader().one("SELECT * FROM upload_session"),
              "1|42|{\"kRelayReportingSessionInfoSessionID\":42}|"
              "{\"kRelayReportingUserInfoServiceName\":\"alarms_session\"}|"
              "1700000000.0|1700000002.5|stopped");
    EXPECT_EQ(reader().one("SELECT * FROM upload_message"),
              "1|1|NULL|NULL|4|1|{\"audiotag\":\"Playback_Start\",\"sample_rate\":48000,"
              "\"channels\":2}|1700000002.0");
}

TEST_F(StoreTest, ASessionSaysHowItEnded) {
    open();
    store_->closeUpload(openUpload(1), platform::UploadEnding::Stopped);
    store_->closeUpload(openUpload(2), platform::UploadEnding::Disconnected);
    const auto running = openUpload(3);
    flush();
    EXPECT_EQ(reader().rows("SELECT session_id, ended FROM upload_session ORDER BY id"),
              (std::vector<std::string>{"1|stopped", "2|disconnected", "3|NULL"}));
}

TEST_F(StoreTest, RepeatsHaveRowsOfTheirSession) {
    open();
    const auto upload = openUpload(42);
    EXPECT_TRUE(store_->addRepeats(upload, {0xFFFFFFFF, 0xFFFF, 12, 1700000001.5, 1700000002}));
    flush();
    EXPECT_EQ(reader().one("SELECT * FROM repeat"),
              "1|1|4294967295|65535|12|1700000001.5|1700000002.0");
    EXPECT_EQ(store_->status().rows[static_cast<std::size_t>(StoreTable::Repeat)], 1U);
}

TEST_F(StoreTest, MessagesReferToTheirOwnSession) {
    open();
    const auto first = openUpload(7);
    const auto second = openUpload(8);
    for (int i = 0; i < 3; ++i) {
        EXPECT_TRUE(store_->addMessage(second, 1, 1, {{"i", i}}));
        EXPECT_TRUE(store_->addMessage(first, 1, 1, {{"i", i}}));
    }
    flush();
    EXPECT_EQ(reader().rows("SELECT m.id, s.session_id, m.payload FROM upload_message m "
                            "JOIN upload_session s ON s.id = m.upload_session ORDER BY m.id"),
              (std::vector<std::string>{"1|8|{\"i\":0}", "2|7|{\"i\":0}", "3|8|{\"i\":1}",
                                        "4|7|{\"i\":1}", "5|8|{\"i\":2}", "6|7|{\"i\":2}"}));
    EXPECT_EQ(reader().one("SELECT count(*) FROM upload_session WHERE closed IS NULL"), "2");
}

TEST_F(StoreTest, SingleMessagesCarryTheirOwnInformation) {
    open();
    EXPECT_TRUE(store_->addSingleMessage({{"id", -1}}, {{"name", "alarms"}}, 65535, 4294967295U,
                                         examplePayload()));
    flush();
    EXPECT_EQ(reader().one("SELECT upload_session, session_info, user_info, category, type "
                           "FROM upload_message"),
              "NULL|{\"id\":-1}|{\"name\":\"alarms\"}|65535|4294967295");
}

TEST_F(StoreTest, WritesTheOtherTables) {
    open();
    store_->addAnalyticsEvent("com.kestrel.halyard.Volume.Summary",
                              [] { return examplePayload(); });
    store_->addEnergyEvent(28, "Flexmedia_Haptics", {{"EngineOnDuration", 1.5}});
    store_->addMetric(0x5B0003, std::string("\x08\x01\0\x10", 4));
    store_->addIncident({{"domain", "Audio"}}, "incidents/1");
    flush();
    EXPECT_EQ(reader().one("SELECT id, name, payload ->> 'channels', time FROM analytics_event"),
              "1|com.kestrel.halyard.Volume.Summary|2|1700000000.0");
    EXPECT_EQ(reader().one("SELECT * FROM energy_event"),
              "1|28|Flexmedia_Haptics|{\"EngineOnDuration\":1.5}|1700000000.0");
    EXPECT_EQ(reader().one("SELECT id, metric_id, typeof(message), hex(message) FROM metric"),
              "1|5963779|blob|08010010");
    EXPECT_EQ(reader().one("SELECT * FROM incident"),
              "1|{\"domain\":\"Audio\"}|incidents/1|1700000000.0");
}

TEST_F(StoreTest, IdsGoOnAfterReopening) {
    open();
    addSingles(3, {});
    open();
    addSingles(1, {});
    flush();
    EXPECT_EQ(reader().one("SELECT max(id), count(*) FROM upload_message"), "4|4");
}

TEST_F(StoreTest, RowsOfOthersAreLeftAlone) {
    open();
    addSingles(1, {});
    flush();
    reader().rows("INSERT INTO upload_message(id, type) VALUES(2, 77), (9, 77)");
    addSingles(2, {});
    flush();
    EXPECT_EQ(reader().rows("SELECT id, type FROM upload_message"),
              (std::vector<std::string>{"1|2", "2|77", "9|77", "10|2", "11|2"}));
    EXPECT_EQ(total(store_->status().lost), 0U);
}

TEST_F(StoreTest, ClosingStoresWhatIsWaitingAndLeavesOneFile) {
    open();
    addSingles(5, examplePayload());
    EXPECT_TRUE(store_->close());
    EXPECT_FALSE(std::filesystem::exists(options_.path.string() + "-wal"));
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 5);
}

TEST_F(StoreTest, CommitsAtTheGroupsSizeAndNotBefore) {
    std::promise<void> full;
    options_.groupRows = 4;
    options_.mostGroups = 1;
    open();
    addSingles(3, {});
    EXPECT_EQ(store_->status().commits, 0U);
    store_->addAnalyticsEvent("fourth", [&full] {
        full.set_value();
        return Dictionary();
    });
    full.get_future().wait(); // without a flush
    addSingles(5, {});        // one group and one row more
    flush();
    EXPECT_EQ(store_->status().commits, 3U);
}

TEST_F(StoreTest, GroupsThatWaitForTheWriterBecomeOneUpToABound) {
    std::promise<void> begun;
    std::promise<void> hold;
    options_.groupRows = 4;
    options_.mostGroups = 3;
    open();
    addSingles(3, {});
    store_->addAnalyticsEvent("held", [&] {
        begun.set_value();
        hold.get_future().wait();
        return Dictionary();
    });
    begun.get_future().wait();
    addSingles(13, {});
    hold.set_value();
    flush();
    EXPECT_EQ(store_->status().commits, 3U); // of 4, 12 and 1 rows
}

TEST_F(StoreTest, CommitsAfterTheDelayToo) {
    options_.limits.syncInterval = 1ms;
    open();
    std::promise<void> written;
    store_->addAnalyticsEvent("lonely", [&written] {
        written.set_value();
        return Dictionary();
    });
    written.get_future().wait();
}

TEST_F(StoreTest, ALongIntervalMakesLargerGroups) {
    std::promise<void> full;
    options_.groupRows = 4;
    options_.patientRows = 8;
    open();
    addSingles(7, {});
    EXPECT_EQ(store_->status().commits, 0U);
    EXPECT_EQ(store_->status().queuedRows, 7U);
    store_->addAnalyticsEvent("eighth", [&full] {
        full.set_value();
        return Dictionary();
    });
    full.get_future().wait();
    flush();
    EXPECT_EQ(store_->status().commits, 1U);
}

TEST_F(StoreTest, BytesMakeAGroupToo) {
    options_.marks.lowBytes = 4096;
    open();
    addSingles(1, {{"text", std::string(8192, 'x')}});
    while (store_->status().commits == 0) { // without a flush, an hour ahead of its time
        std::this_thread::yield();
    }
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 1);
}

TEST_F(StoreTest, AnErrorDoesNotWaitForALongInterval) {
    open();
    addSingles(1, {});
    EXPECT_EQ(store_->status().commits, 0U);
    const auto upload = store_->openUpload(1, {}, {});
    EXPECT_TRUE(store_->addMessage(upload, kAudioEventCategoryError, 1, {}));
    while (store_->status().commits == 0) { // an hour ahead of its time
        std::this_thread::yield();
    }
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 2);
}

TEST_F(StoreTest, AnIntervalThatIsSetHoldsForWhatWaits) {
    open();
    addSingles(1, {});
    StoreLimits limits = options_.limits;
    limits.syncInterval = StoreLimits::kLeastSyncInterval;
    store_->setLimits(limits);
    // Without the new interval this would wait for the old one, for good.
    while (store_->status().queuedRows != 0) {
        std::this_thread::yield();
    }
    EXPECT_GE(store_->status().commits, 1U);
}

TEST_F(StoreTest, StatusTellsHowLongTheOldestRowHasWaited) {
    open();
    EXPECT_EQ(store_->status().oldestWaiting, 0);
    addSingles(1, {});
    EXPECT_GT(store_->status().oldestWaiting, 0);
    flush();
    EXPECT_EQ(store_->status().oldestWaiting, 0);
}

TEST_F(StoreTest, FlushAnswersAtOnceWhenNothingWaits) {
    open();
    bool done = false;
    store_->flush([&done] { done = true; });
    EXPECT_TRUE(done);
}

TEST_F(StoreTest, CountsWhatItStores) {
    open();
    addSingles(2, {});
    store_->addMetric(1, "");
    flush();
    const StoreStatus status = store_->status();
    EXPECT_TRUE(status.open);
    EXPECT_FALSE(status.failing);
    EXPECT_EQ(status.rows, (StoreDatabase::RowCounts{0, 2, 0, 0, 1, 0, 0}));
    EXPECT_EQ(status.queuedRows, 0U);
    EXPECT_EQ(status.queuedBytes, 0U);
    EXPECT_EQ(total(status.lost), 0U);
    EXPECT_GT(status.fileBytes, 0U);
}

TEST_F(StoreTest, PressesBetweenTheMarksAndDropsNothing) {
    std::vector<bool> told;
    std::promise<void> hold;
    options_.marks = {.highRows = 8, .lowRows = 2, .highBytes = 1 << 20, .lowBytes = 1 << 19};
    options_.onPressure = [&told](bool on) { told.push_back(on); };
    open();
    store_->addAnalyticsEvent("slow", [released = hold.get_future().share()] {
        released.wait();
        return Dictionary();
    });
    addSingles(20, {});
    EXPECT_EQ(told, std::vector<bool>{true});
    hold.set_value();
    flush();
    EXPECT_EQ(told, (std::vector<bool>{true, false}));
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 20);
}

TEST_F(StoreTest, AFileThatIsWrittenToSeldomIsMadeOfSmallerPages) {
    options_.patientPageBytes = StoreOptions().patientPageBytes;
    ASSERT_LT(options_.patientPageBytes, StoreDatabase::kPageBytes);
    options_.limits.syncInterval = kPromptInterval;
    open();
    EXPECT_EQ(reader().number("PRAGMA page_size"), StoreDatabase::kPageBytes);
    store_.reset();
    std::filesystem::remove(options_.path);
    options_.limits.syncInterval = kPromptInterval + std::chrono::milliseconds(1);
    open();
    EXPECT_EQ(reader().number("PRAGMA page_size"), options_.patientPageBytes);
}

TEST_F(StoreTest, ReplacesAFileThatWasRemovedWhileOpen) {
    open();
    addSingles(1, {});
    flush();
    for (const char* end : {"", "-wal", "-shm"}) {
        std::filesystem::remove(options_.path.string() + end);
    }
    const auto upload = openUpload(9);
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    flush();
    EXPECT_EQ(reader().one("SELECT s.session_id FROM upload_message m JOIN upload_session s "
                           "ON s.id = m.upload_session"),
              "9");
    EXPECT_EQ(log_.countOf("was removed or replaced", LogLevel::Error), 1U);
}

} // namespace
} // namespace halyard::linux_
