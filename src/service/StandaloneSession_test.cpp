// The temporary session for which the sinks see a message that no session takes.

#include "service/MessageFanOut.h"
#include "service/ServiceFixture.h"
#include "sinks/MessageSinks.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// Keeps what the sinks are offered.
class RecordingSinks final : public MessageSinks {
public:
    void handleEvent(const Message&, const std::shared_ptr<const SessionFacts>& session,
                     const std::optional<std::string>& processName) override {
        offeredFor.push_back(std::dynamic_pointer_cast<const HYReportingSession>(session));
        sender = processName;
    }

    std::vector<std::shared_ptr<const HYReportingSession>> offeredFor;
    std::optional<std::string> sender;
};

// A service without sessions.
class LonelyService final : public HYReportingServiceDelegateProtocol {
public:
    Dictionary getDefaults() const override { return {}; }
    std::optional<Dictionary> getFeaturesState() const override { return std::nullopt; }
    std::vector<Client> getAllClients() const override { return {}; }
    bool isReportingEnabled() const override { return true; }
    std::vector<Session> getAllActiveReportingSessions() const override { return {}; }
    platform::KeptLine& activeSessionsLine() override { return line; }
    Session findReportingSessionForID(std::int64_t) const override { return nullptr; }
    Session findReportingSessionForID(std::int64_t, SessionLookups&) const override {
        return nullptr;
    }
    void tell(const SessionLookups&) const override {}
    void sessionRetired(const HYReportingSession&) override {}
    platform::DriverSnapshotRef getSnapShot() override { return nullptr; }
    void sendDriverLogsForSession(const Session&) override {}
    void removeClient(const HYReportingClientServerInstance&) override {}
    MessageSinks& sinks() override { return recorded; }
    void handleEventForIBX(const Dictionary&, AudioEventCategory, AudioEventType, const Session&,
                           const std::optional<std::string>&) override {}
    std::int64_t activeSessionCount() const override { return 0; }
    void setActiveSessionCount(std::int64_t) override {}

    RecordingSinks recorded;
    platform::KeptLine line;
};

class StandaloneSessionTest : public ::testing::Test {
protected:
    void broadcast() {
        MessageFanOut fanOut({{{"n", 1}}, kAudioEventCategoryPlayback, 1}, std::nullopt, sender_);
        EXPECT_TRUE(fanOut.advance(service_, [](std::int64_t) { return nullptr; }));
    }

    testing::TestPlatform platform_;
    LonelyService service_;
    const std::optional<std::string> sender_ = "player";
};

TEST_F(StandaloneSessionTest, IsOfTheDaemonsOwnProcessAndOfAnUnknownApplication) {
    platform_.ownProcess.ownPID = 4711;
    broadcast();
    ASSERT_EQ(service_.recorded.offeredFor.size(), 1U);
    const HYReportingSession& session = *service_.recorded.offeredFor[0];
    EXPECT_THAT(session.processIdentifiers(), ElementsAre(4711));
    EXPECT_EQ(session.reporterID(), 1);
    EXPECT_EQ(session.serviceType(), kAudioServiceTypeStandalone);
    EXPECT_EQ(session.configuration(), (Dictionary{{"HostApplicationDisplayID", "Unknown"}}));
    EXPECT_EQ(service_.recorded.sender, sender_);
}

TEST_F(StandaloneSessionTest, IsNeitherStartedNorFed) {
    broadcast();
    EXPECT_FALSE(service_.recorded.offeredFor.at(0)->started());
    EXPECT_EQ(platform_.log.count("starting session owned by 1"), 0U);
    EXPECT_EQ(platform_.log.count("sending message for session owned by 1"), 0U);
    EXPECT_THAT(platform_.relayReporting.uploads, IsEmpty());
}

} // namespace
} // namespace halyard
