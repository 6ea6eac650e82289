// Rows that are many enough to be inserted by one statement.
#include "linux/store/FaultyDiskTesting.h"
#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

// More than are inserted by one statement.
constexpr int kMany = 1200;

class StoreTogetherTest : public StoreFixture {
protected:
    StoreTogetherTest() { options_.groupRows = 4 * kMany; }

    // Each message is an event as well, which is added first.
    void addMessages(const StoreUploadPtr& upload, int count) {
        for (int n = 1; n <= count; ++n) {
            const Dictionary message{{"n", n}};
            store_->addAnalyticsEvent("event " + std::to_string(n), [message] {
                return platform::EventPayload(message, "app", "player");
            });
            EXPECT_TRUE(store_->addMessage(upload, 4, 7, message));
        }
    }
    // Rows that refuse to be what `when` says.
    void addTrigger(const std::string& when, const std::string& raise) {
        reader().rows("CREATE TRIGGER picky BEFORE INSERT ON upload_message WHEN " + when +
                      " BEGIN SELECT " + raise + "; END");
    }
    std::vector<std::string> numbers(const std::string& where = "1") {
        return reader().rows("SELECT payload ->> 'n' FROM upload_message WHERE " + where +
                             " ORDER BY id");
    }
    static std::vector<std::string> allBut(int missing, int count) {
        std::vector<std::string> texts;
        for (int n = 1; n <= count; ++n) {
            if (n != missing) {
                texts.push_back(std::to_string(n));
            }
        }
        return texts;
    }
};

TEST_F(StoreTogetherTest, RowsOfEachTableKeepTheirOrder) {
    open();
    addMessages(store_->openUpload(5, {}, {}), kMany);
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message WHERE payload ->> 'n' = id"),
              kMany);
    EXPECT_EQ(reader().number("SELECT count(*) FROM analytics_event WHERE name = 'event ' || id "
                              "AND payload = '{\"n\":' || id || ',\"app\":\"player\"}'"),
              kMany);
    EXPECT_EQ(store_->status().rows[static_cast<std::size_t>(StoreTable::AnalyticsEvent)],
              std::uint64_t{kMany});
}

TEST_F(StoreTogetherTest, ARowIsTheSameAsOneInsertedByItself) {
    open();
    const auto upload = store_->openUpload(5, {}, {});
    addMessages(upload, 1);
    EXPECT_TRUE(store_->addSingleMessage({{"a", 1}}, {{"b", 2}}, 3, 4, {{"n", 2}}));
    flush();
    addMessages(upload, kMany);
    for (int i = 0; i < kMany; ++i) {
        EXPECT_TRUE(store_->addSingleMessage({{"a", 1}}, {{"b", 2}}, 3, 4, {{"n", 2}}));
    }
    flush();
    const std::string rows = "SELECT DISTINCT upload_session, session_info, user_info, category, "
                             "type, payload, typeof(time) FROM upload_message WHERE ";
    EXPECT_EQ(reader().rows(rows + "session_info IS NOT NULL"),
              std::vector<std::string>{R"(NULL|{"a":1}|{"b":2}|3|4|{"n":2}|real)"});
    EXPECT_EQ(reader().rows(rows + "session_info IS NULL AND payload ->> 'n' = 1"),
              std::vector<std::string>{R"(1|NULL|NULL|4|7|{"n":1}|real)"});
}

TEST_F(StoreTogetherTest, ARowThatIsRefusedForItselfIsLostAlone) {
    for (const char* raise : {"RAISE(ABORT, 'not this')", "RAISE(FAIL, 'not this')"}) {
        open();
        addTrigger("new.payload = '{\"n\":600}'", raise);
        addMessages(store_->openUpload(5, {}, {}), kMany);
        flush();
        EXPECT_EQ(numbers(), allBut(600, kMany)) << raise;
        EXPECT_EQ(reader().number("SELECT count(*) FROM analytics_event"), kMany);
        EXPECT_EQ(lost(StoreLoss::Rejected), 1U);
        EXPECT_FALSE(store_->status().failing);
        store_.reset();
        std::filesystem::remove(options_.path);
    }
}

TEST_F(StoreTogetherTest, ARowThatIsTooLargeIsLostAlone) {
    options_.limits.maxBytes = 1024 * 1024;
    open();
    const auto upload = store_->openUpload(5, {}, {});
    addMessages(upload, 100);
    EXPECT_TRUE(store_->addMessage(upload, 4, 7, {{"n", 101}, {"x", std::string(200'000, 'x')}}));
    addMessages(upload, 100);
    flush();
    std::vector<std::string> expected = allBut(0, 100);
    for (const std::string& again : allBut(0, 100)) {
        expected.push_back(again);
    }
    EXPECT_EQ(numbers(), expected);
    EXPECT_EQ(lost(StoreLoss::Rejected), 1U);
}

TEST_F(StoreTogetherTest, RowsThatSomebodyElseHasInsertedStay) {
    open();
    const auto upload = store_->openUpload(5, {}, {});
    addMessages(upload, 2);
    flush();
    reader().rows("INSERT INTO upload_message(id, payload) VALUES(300, '{\"n\":\"theirs\"}')");
    addMessages(upload, kMany);
    flush();
    EXPECT_EQ(numbers("id = 300"), std::vector<std::string>{"theirs"});
    EXPECT_EQ(numbers("id > 2 AND id != 300"), allBut(0, kMany));
    EXPECT_EQ(total(store_->status().lost), 0U);
}

TEST_F(StoreTogetherTest, AGroupThatCouldNotBeWrittenIsThereOnceItCan) {
    FaultyDisk disk;
    options_.vfs = FaultyDisk::kName;
    open();
    disk.fail(SQLITE_FULL);
    addMessages(store_->openUpload(5, {}, {}), kMany);
    store_->flush([] {});
    log_.waitFor("cannot write");
    disk.fail(SQLITE_OK);
    flush();
    EXPECT_EQ(numbers(), allBut(0, kMany));
    EXPECT_EQ(reader().number("SELECT count(*) FROM analytics_event"), kMany);
    store_.reset();
}

} // namespace
} // namespace halyard::linux_
