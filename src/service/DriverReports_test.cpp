// When a client's requests take snapshots of the drivers and report them.
#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class DriverReportsTest : public ServiceTest {
protected:
    // Internal builds keep the batch, which these tests look at.
    // The service subscribes once, so the group has to be there before it.
    DriverReportsTest() : ServiceTest(true) {
        platform_.hwReport.groups["Speaker-(null)"] = {};
        restartService();
        platform_.hwReport.calls.clear();
    }
    const Peer& client() {
        if (!client_) {
            client_.emplace(connect(100));
        }
        return *client_;
    }

private:
    std::optional<Peer> client_;
};

TEST_F(DriverReportsTest, TheServiceSubscribesAtItsConstruction) {
    restartService();
    EXPECT_EQ(platform_.hwReport.calls.at(0), "list KestrelZR4QLX-(null)");
    EXPECT_EQ(platform_.hwReport.calls.at(2), "subscribe Speaker-(null)");
}

TEST_F(DriverReportsTest, AStartTakesASnapshotOfTheDriversAndSendsNothing) {
    client().create(7);
    EXPECT_EQ(session(7)->driverSnapShot(), nullptr);
    client().start(7);
    ASSERT_NE(session(7)->driverSnapShot(), nullptr);
    EXPECT_EQ(session(7)->driverSnapShot()->count("Speaker-(null)"), 1U);
    EXPECT_THAT(platform_.hwReport.calls, ElementsAre("sample Speaker-(null)"));
    EXPECT_THAT(session(7)->nestedAggregatedPayloadData(), IsEmpty());
}

TEST_F(DriverReportsTest, AStartTakesItsSnapshotOnceTheSessionHasStarted) {
    client().create(7);
    platform_.logMarksAndQuestions();
    platform_.log.clear();
    client().start(7);
    auto texts = platform_.log.texts();
    texts.resize(7);
    EXPECT_THAT(texts, ElementsAre("starting session for reporter 7", "mark 21044818",
                                   "starting session owned by 7", "mark 2104482c",
                                   "sampling driver Speaker-(null)", "getting features",
                                   "sessions for client 100 : (\n    \"" +
                                       session(7)->description() + "\"\n)"));
}

TEST_F(DriverReportsTest, AStopReportsTheDriversThenTakesASnapshot) {
    client().createAndStart(7);
    const auto atStart = session(7)->driverSnapShot();
    platform_.hwReport.calls.clear();
    client().stop(7);
    EXPECT_THAT(
        platform_.hwReport.calls,
        ElementsAre("sample Speaker-(null)", "delta Speaker-(null) 1 2", "sample Speaker-(null)"));
    EXPECT_NE(session(7)->driverSnapShot(), atStart);
}

TEST_F(DriverReportsTest, AStopDoesBothBeforeTheSessionEnds) {
    client().createAndStart(7);
    platform_.log.clear();
    client().stop(7);
    auto texts = platform_.log.texts();
    texts.resize(6);
    EXPECT_THAT(texts, ElementsAre("stopping session for reporter 7", "getting latest samples",
                                   "done getting latest samples", "sampling driver Speaker-(null)",
                                   "ending session 7", "ending session 7"));
}

TEST_F(DriverReportsTest, TheReportReachesTheUploadSessionBeforeItEnds) {
    client().createAndStart(7);
    platform::HWReportChannel channel;
    channel.format = platform::kHWReportFormatSimple;
    channel.name = "Underruns";
    channel.value = 3;
    platform_.hwReport.groups["Speaker-(null)"].delta = {channel};
    client().stop(7);
    const auto& messages = platform_.relayReporting.uploads.at(0)->messages;
    ASSERT_FALSE(messages.empty()); // The summary follows.
    EXPECT_EQ(messages[0].payload["Simple_Underruns"], Value(3));
}

TEST_F(DriverReportsTest, ADestroyReportsNoDrivers) {
    client().createAndStart(7);
    platform_.hwReport.calls.clear();
    client().destroy(7);
    EXPECT_THAT(platform_.hwReport.calls, IsEmpty());
}

} // namespace
} // namespace halyard
