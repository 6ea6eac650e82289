// Which service type counts when a session's changes while it runs: that of the
// start for the opening of its upload session, the present one for the rest.

#include "session/SessionFixture.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SessionServiceTypeTest : public SessionTest {
protected:
    std::shared_ptr<HYReportingSession> startConnectedSession() {
        auto session = makeRelayedSession();
        session->start();
        run();
        return session;
    }
    void sendNumber(HYReportingSession& session, int number) { send(session, {{"n", number}}); }
};

TEST_F(SessionServiceTypeTest, ATestSessionOpensNothingWhateverItTurnsIntoBeforeTheOpening) {
    const auto session = makeRelayedSession(kAudioServiceTypeTest);
    session->start();
    session->setServiceType(kAudioServiceTypeLongFormAudio);
    run();
    EXPECT_THAT(platform_.relayReporting.uploads, IsEmpty());
}

TEST_F(SessionServiceTypeTest, ASessionThatTurnsIntoATestOpensAllTheSame) {
    const auto session = makeRelayedSession();
    session->start();
    session->setServiceType(kAudioServiceTypeTest);
    run();
    EXPECT_TRUE(session->hasRelayReportingSession());
}

TEST_F(SessionServiceTypeTest, ADeliveryAsksForTheTypeOfItsOwnMoment) {
    const auto session = startConnectedSession();
    sendNumber(*session, 1);
    session->setServiceType(kAudioServiceTypeTest);
    run();
    EXPECT_THAT(upload().messages, IsEmpty());
    sendNumber(*session, 2);
    session->setServiceType(kAudioServiceTypeAlarms);
    run();
    EXPECT_THAT(uploaded(), ElementsAre(2));
}

TEST_F(SessionServiceTypeTest, ASessionThatTurnsIntoATestBeforeItsClosingStaysOpen) {
    const auto session = startConnectedSession();
    session->stop();
    session->setServiceType(kAudioServiceTypeTest);
    run();
    EXPECT_EQ(upload().flushes, 0);
    EXPECT_TRUE(session->hasRelayReportingSession());
    EXPECT_TRUE(session->getRelayReportingStartedState());
    EXPECT_EQ(platform_.log.count("stopping and setting session to nil"), 0U);
}

TEST_F(SessionServiceTypeTest, ASessionThatIsNoTestAnyMoreWhenItClosesIsClosed) {
    const auto session = startConnectedSession();
    session->setServiceType(kAudioServiceTypeTest);
    session->stop();
    session->setServiceType(kAudioServiceTypeAlarms);
    run();
    EXPECT_EQ(upload().flushes, 1);
    EXPECT_FALSE(session->hasRelayReportingSession());
}

TEST_F(SessionServiceTypeTest, AConnectedSessionThatIsATestWhenItClosesStaysOpen) {
    const auto session = startConnectedSession();
    session->setServiceType(kAudioServiceTypeTest);
    session->stop();
    run();
    EXPECT_EQ(upload().flushes, 0);
    EXPECT_FALSE(upload().closed);
    EXPECT_TRUE(loggedByRelay(LogLevel::Debug, "entering relayreporting closeRelayReporting"));
}

} // namespace
} // namespace halyard
