// Which sessions count as active, and what that decides.

#include "service/ServiceFixture.h"

namespace halyard {
namespace {

class ActiveSessionsTest : public ServiceTest {
protected:
    static void settle(platform::SessionRules::Values values) {
        platform::current().sessionRules.set(values);
    }
    std::size_t episodes() const {
        return platform_.log.count(
            "6 sessions count as active: those started beyond 5 are not uploaded");
    }
};

TEST_F(ActiveSessionsTest, LostOnesStayCountedByDefault) {
    const Peer peer = connect(10);
    peer.createAndStart(1);
    peer.destroy(1);
    peer.createAndStart(2);
    peer.create(2);
    peer.createAndStart(3);
    peer.connection().invalidate();
    run();
    EXPECT_EQ(service_->activeSessionCount(), 3);
}

TEST_F(ActiveSessionsTest, LostOnesAreUncountedWhereTheOperatorWantsIt) {
    settle({.recount = true});
    const Peer peer = connect(10);
    peer.createAndStart(1);
    peer.destroy(1);
    EXPECT_EQ(service_->activeSessionCount(), 0);
    peer.createAndStart(2);
    peer.create(2);
    EXPECT_EQ(service_->activeSessionCount(), 0);
    peer.createAndStart(3);
    peer.create(4); // never started
    peer.connection().invalidate();
    run();
    EXPECT_EQ(service_->activeSessionCount(), 0);
}

TEST_F(ActiveSessionsTest, TheLimitIsTheOperators) {
    settle({.uploadLimit = 1});
    const Peer peer = connect(10);
    peer.createAndStart(1);
    peer.createAndStart(2);
    EXPECT_TRUE(session(1)->relayReportingEnabled());
    EXPECT_FALSE(session(2)->relayReportingEnabled());
    EXPECT_EQ(service_->status()["sessions_not_uploaded"], Value(1));
    EXPECT_EQ(service_->status()["upload_limit"], Value(1));
}

TEST_F(ActiveSessionsTest, OneLineAnEpisodeTellsThatUploadsAreWithheld) {
    const Peer peer = connect(10);
    for (std::int64_t id = 1; id <= 5; ++id) {
        peer.createAndStart(id);
    }
    EXPECT_EQ(episodes(), 0U);
    peer.createAndStart(6);
    peer.createAndStart(7);
    EXPECT_EQ(episodes(), 1U);
    peer.stop(7);
    peer.stop(6);
    peer.createAndStart(6);
    EXPECT_EQ(episodes(), 2U);
}

} // namespace
} // namespace halyard
