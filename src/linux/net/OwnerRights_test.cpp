#include "linux/net/OwnerRights.h"

#include <gtest/gtest.h>
#include <pwd.h>
#include <unistd.h>

#include "testing/ManualClock.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

constexpr std::uint32_t kDaemon = 900;

class OwnerRightsTest : public ::testing::Test {
protected:
    void allow(Access access) { access_ = std::make_shared<const Access>(std::move(access)); }

    testing::ManualClock clock_;
    std::shared_ptr<const Access> access_ = std::make_shared<const Access>();
    std::vector<std::uint32_t> groups_;
    int lookUps_ = 0;
    OwnerRights rights_{clock_, [this] { return access_; }, kDaemon,
                        [this](std::uint32_t uid) {
                            ++lookUps_;
                            return Peer{0, uid, 100, groups_};
                        }};
};

TEST_F(OwnerRightsTest, RootAndTheDaemonsUserNeedNobodysWord) {
    EXPECT_TRUE(rights_.mayConnect(0));
    EXPECT_TRUE(rights_.mayConnect(kDaemon));
    EXPECT_EQ(lookUps_, 0);
}

TEST_F(OwnerRightsTest, OthersMayWhatTheListsSay) {
    allow({.users = {"1000"}, .groups = {"29"}, .adminUsers = {"1001"}});
    EXPECT_TRUE(rights_.mayConnect(1000));
    EXPECT_TRUE(rights_.mayConnect(1001));
    EXPECT_FALSE(rights_.mayConnect(1002));
    groups_ = {29};
    EXPECT_TRUE(rights_.mayConnect(1003));
}

TEST_F(OwnerRightsTest, AsksAboutAUserOnceAMinute) {
    allow({{}, {"29"}, {}});
    EXPECT_FALSE(rights_.mayConnect(1000));
    groups_ = {29};
    clock_.advance(1min - 1ns);
    EXPECT_FALSE(rights_.mayConnect(1000));
    EXPECT_EQ(lookUps_, 1);
    clock_.advance(1ns);
    EXPECT_TRUE(rights_.mayConnect(1000));
    EXPECT_EQ(lookUps_, 2);
}

TEST_F(OwnerRightsTest, OtherListsHoldAtOnce) {
    EXPECT_FALSE(rights_.mayConnect(1000));
    allow({{"1000"}, {}, {}});
    EXPECT_TRUE(rights_.mayConnect(1000));
    allow({});
    EXPECT_FALSE(rights_.mayConnect(1000));
}

TEST_F(OwnerRightsTest, RemembersSoManyUsersAndNoMore) {
    for (std::uint32_t uid = 1000; uid < 1064; ++uid) {
        (void)rights_.mayConnect(uid);
    }
    (void)rights_.mayConnect(1063);
    EXPECT_EQ(lookUps_, 64);
    (void)rights_.mayConnect(2000);
    (void)rights_.mayConnect(1063);
    EXPECT_EQ(lookUps_, 66);
}

TEST(PeerOfUserTest, HasTheGroupsOfTheUserDatabase) {
    const Peer root = peerOfUser(0);
    EXPECT_EQ(root.uid, 0U);
    EXPECT_EQ(root.gid, 0U);
    EXPECT_TRUE(root.isInGroup(0));
    for (const char* name : {"games", "daemon"}) {
        if (const passwd* const user = ::getpwnam(name)) {
            EXPECT_EQ(peerOfUser(user->pw_uid).gid, user->pw_gid);
        }
    }
}

TEST(PeerOfUserTest, OfAnUnknownUserIsInNoGroup) {
    const Peer nobody = peerOfUser(4'000'000'000);
    EXPECT_EQ(nobody.uid, 4'000'000'000);
    EXPECT_EQ(nobody.gid, static_cast<std::uint32_t>(-1));
    EXPECT_TRUE(nobody.groups.empty());
}

} // namespace
} // namespace halyard::linux_
