#include "reading/StoreFollower.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "reading/TestStoreTesting.h"

namespace halyard::reading {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class StoreFollowerTest : public ::testing::Test {
protected:
    StoreFollower follow(const std::string& condition = "") {
        auto follower = StoreFollower::open(store_.path(), "upload_message", "time", condition);
        EXPECT_TRUE(follower.ok());
        return std::move(follower).value();
    }
    std::vector<std::int64_t> look(StoreFollower& follower) {
        std::vector<std::int64_t> ids;
        EXPECT_TRUE(follower
                        .look([&](StoreReader&, const Row& row) {
                            ids.push_back(row.integer(0));
                            return true;
                        })
                        .ok());
        return ids;
    }
    void add(int type = 1) { store_.addMessage({}, 4, type, "{}", 10); }

    TestStore store_;
};

TEST_F(StoreFollowerTest, OnlyWhatCameSinceTheLastLookIsNew) {
    add();
    StoreFollower follower = follow();
    EXPECT_THAT(look(follower), IsEmpty());
    add();
    add();
    EXPECT_THAT(look(follower), ElementsAre(2, 3));
    EXPECT_THAT(look(follower), IsEmpty());
}

TEST_F(StoreFollowerTest, RowsOfOtherKindsArePassedOver) {
    StoreFollower follower = follow("type = 7");
    add(7);
    add();
    EXPECT_THAT(look(follower), ElementsAre(1));
    add();
    EXPECT_THAT(look(follower), IsEmpty());
}

TEST_F(StoreFollowerTest, RowsAfterAPurgeAreNewWhateverTheirIds) {
    add();
    add();
    StoreFollower follower = follow();
    store_.execute("DELETE FROM upload_message");
    EXPECT_THAT(look(follower), IsEmpty());
    add();
    EXPECT_THAT(look(follower), ElementsAre(1));
}

TEST_F(StoreFollowerTest, AFileThatTakesThePlaceOfTheOldOneIsFollowed) {
    add();
    add();
    StoreFollower follower = follow();
    TestStore another;
    another.addMessage({}, 4, 1, "{}", 10);
    another.close();
    store_.close();
    for (const char* const companion : {"", "-wal", "-shm"}) {
        std::filesystem::remove(store_.path().string() + companion);
    }
    EXPECT_THAT(look(follower), IsEmpty());
    std::filesystem::copy_file(another.path(), store_.path());
    EXPECT_THAT(look(follower), ElementsAre(1));
}

TEST_F(StoreFollowerTest, AWriterThatComesLaterIsSeen) {
    add();
    store_.close();
    StoreFollower follower = follow();
    store_.reopen();
    add();
    EXPECT_THAT(look(follower), ElementsAre(2));
}

} // namespace
} // namespace halyard::reading
