#include "reading/StoreCheck.h"

#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sstream>
#include <sys/stat.h>

#include "reading/TestStoreTesting.h"

namespace halyard::reading {
namespace {

namespace fs = std::filesystem;
using ::testing::IsEmpty;

class StoreCheckTest : public ::testing::Test {
protected:
    StoreCheckTest() {
        for (int i = 0; i < 3000; ++i) {
            store_.addMessage({}, 4, 1, "{\"text\":\"a-secret " + std::to_string(i) + "\"}", 10);
        }
        store_.addSession("a-secret", 10, {});
        store_.addSession("a-secret", 10, 20);
        store_.close();
    }
    StoreCheck check() {
        const auto checked = checkStore(store_.path(), [](double) {});
        EXPECT_TRUE(checked.ok());
        return checked.ok() ? checked.value() : StoreCheck();
    }
    // Overwrites some pages in the middle.
    void damage() {
        std::fstream file(store_.path(), std::ios::binary | std::ios::in | std::ios::out);
        file.seekp(20 * 4096);
        file << std::string(4096 * 3, '\x5A');
    }
    std::string bytes() {
        std::ostringstream all;
        for (const auto& entry : fs::directory_iterator(store_.directory())) {
            all << std::ifstream(entry.path(), std::ios::binary).rdbuf();
        }
        return all.str();
    }

    TestStore store_;
};

TEST_F(StoreCheckTest, ASoundStoreIsCounted) {
    const StoreCheck found = check();
    EXPECT_TRUE(found.ok);
    EXPECT_EQ(found.schema, linux_::kStoreSchemaVersion);
    EXPECT_THAT(found.integrity, IsEmpty());
    EXPECT_EQ(found.rows[0],
              std::make_pair(std::string("upload_session"), std::optional<std::int64_t>(2)));
    EXPECT_EQ(found.rows[1].second, 3000);
    EXPECT_EQ(found.unclosedSessions, 1);
    EXPECT_EQ(found.bytes, fs::file_size(store_.path()));
}

TEST_F(StoreCheckTest, DamageIsAResult) {
    damage();
    const StoreCheck found = check();
    EXPECT_FALSE(found.ok);
    EXPECT_FALSE(found.integrity.empty());
}

TEST_F(StoreCheckTest, SoIsAFileThatIsNoDatabase) {
    std::ofstream(store_.path(), std::ios::binary) << std::string(8192, 'x');
    const StoreCheck found = check();
    EXPECT_FALSE(found.ok);
    EXPECT_FALSE(found.schema);
    EXPECT_EQ(found.integrity.size(), 1U);
}

TEST_F(StoreCheckTest, ARepairSavesWhatCanBeReadAndKeepsTheRest) {
    damage();
    ASSERT_EQ(::chmod(store_.path().c_str(), 0640), 0);
    const auto repaired = repairStore(store_.path());
    ASSERT_TRUE(repaired.ok()) << repaired.failure().message();
    EXPECT_GT(repaired.value().rows, 2000U);
    EXPECT_GT(repaired.value().places, 0U);
    EXPECT_TRUE(fs::exists(repaired.value().aside));
    const StoreCheck found = check();
    EXPECT_TRUE(found.ok);
    EXPECT_GT(found.rows[1].second, 2000);
    EXPECT_EQ(fs::status(store_.path()).permissions(), fs::perms(0640));
}

TEST_F(StoreCheckTest, APurgeLeavesNoByteOfARow) {
    ASSERT_NE(bytes().find("a-secret"), std::string::npos);
    const auto rows = purgeStore(store_.path());
    ASSERT_TRUE(rows.ok());
    EXPECT_EQ(rows.value(), 3002U);
    EXPECT_EQ(bytes().find("a-secret"), std::string::npos);
    EXPECT_EQ(check().rows[0].second, 0);
}

TEST_F(StoreCheckTest, ADamagedStoreIsPurgedAsAWhole) {
    damage();
    EXPECT_TRUE(purgeStore(store_.path()).ok());
    EXPECT_EQ(bytes().find("a-secret"), std::string::npos);
}

TEST_F(StoreCheckTest, WithoutAStoreThereIsNothingToPurge) {
    const auto rows = purgeStore(store_.directory() / "none" / "telemetry.db");
    ASSERT_FALSE(rows.ok());
    EXPECT_EQ(rows.failure().exit, Exit::NothingThere);
    EXPECT_FALSE(fs::exists(store_.directory() / "none"));
}

} // namespace
} // namespace halyard::reading
