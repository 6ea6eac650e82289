#include "linux/store/StorePurge.h"

#include <fstream>
#include <gtest/gtest.h>
#include <limits>
#include <sstream>

#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

constexpr const char* kSecret = "a-secret-name";

class StorePurgeTest : public StoreFixture {
protected:
    // What lies in the state directory, all together.
    std::string bytes() {
        std::ostringstream all;
        for (const auto& entry : std::filesystem::directory_iterator(directory_.path())) {
            all << std::ifstream(entry.path(), std::ios::binary).rdbuf();
        }
        return all.str();
    }
    Result<std::uint64_t, StoreFailure> purge() {
        std::promise<Result<std::uint64_t, StoreFailure>> answer;
        store_->purge([&](const auto& result) { answer.set_value(result); });
        return answer.get_future().get();
    }
    static Dictionary secret() { return {{"name", kSecret}}; }
    void addSecrets(int count) {
        for (int i = 0; i < count; ++i) {
            (void)store_->addSingleMessage(secret(), secret(), 4, 1, secret());
        }
        flush();
    }
};

TEST_F(StorePurgeTest, NothingOfTheRowsIsLeftInTheDirectory) {
    open();
    addSecrets(3000);
    (void)store_->addIncident(secret(), kSecret);
    (void)store_->addMetric(1, kSecret);
    (void)store_->addEnergyEvent(1, kSecret, secret());
    flush();
    ASSERT_NE(bytes().find(kSecret), std::string::npos);
    const auto purged = purge();
    ASSERT_TRUE(purged.ok());
    EXPECT_EQ(purged.value(), 3003U);
    EXPECT_EQ(bytes().find(kSecret), std::string::npos);
}

TEST_F(StorePurgeTest, AnOpenSessionKeepsItsRowWithoutWhatItTold) {
    open();
    const auto upload = store_->openUpload(7, secret(), secret());
    const auto closed = store_->openUpload(8, secret(), secret());
    (void)store_->addMessage(upload, 4, 1, secret());
    store_->closeUpload(closed);
    flush();
    EXPECT_EQ(purge().value(), 2U);
    EXPECT_EQ(bytes().find(kSecret), std::string::npos);
    EXPECT_EQ(reader().one("SELECT id, session_id, session_info, user_info FROM upload_session"),
              "1|7|{}|{}");
    (void)store_->addMessage(upload, 4, 1, {{"a", 1}});
    store_->closeUpload(upload);
    flush();
    EXPECT_EQ(reader().one("SELECT m.id, m.upload_session, s.closed IS NULL FROM upload_message m "
                           "JOIN upload_session s ON s.id = m.upload_session"),
              "2|1|0");
}

TEST_F(StorePurgeTest, SessionsThatAnEarlierRunLeftOpenGo) {
    open();
    (void)store_->openUpload(7, secret(), secret());
    flush();
    open();
    EXPECT_EQ(purge().value(), 1U);
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_session"), 0);
}

TEST_F(StorePurgeTest, AReaderThatHoldsTheRowsIsToldOf) {
    open();
    addSecrets(3);
    Reader other = reader();
    (void)other.rows("BEGIN; SELECT * FROM upload_message");
    const auto purged = purge();
    ASSERT_FALSE(purged.ok());
    EXPECT_TRUE(purged.failure().isLock());
    (void)other.rows("COMMIT");
    EXPECT_TRUE(purge().ok());
    EXPECT_EQ(bytes().find(kSecret), std::string::npos);
}

TEST_F(StorePurgeTest, WithoutAStoreThereIsNothingToPurge) {
    Reader(options_.path).rows("PRAGMA user_version = 99");
    open();
    const auto purged = purge();
    ASSERT_FALSE(purged.ok());
    EXPECT_EQ(purged.failure().text, "the daemon runs without a store");
}

} // namespace
} // namespace halyard::linux_
