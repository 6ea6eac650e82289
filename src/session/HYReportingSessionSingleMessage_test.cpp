#include "session/SessionFixture.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SingleMessageTest : public SessionTest {
protected:
    void sendSingle(AudioServiceType type, HYReportingSession::SendReply reply = nullptr) {
        HYReportingSession::sendSingleMessage(
            {{"a key", 1}}, kAudioEventCategoryGroupHAL | kAudioEventCategoryIO,
            kAudioEventTypeStop, type, {{"device_name", "ignored"}}, std::move(reply));
    }
};

TEST_F(SingleMessageTest, GoesOutUnderTheLowHalfOfItsCategory) {
    sendSingle(kAudioServiceTypeStandalone);
    platform_.queues.advance(1s);
    ASSERT_EQ(platform_.relayReporting.singles.size(), 1U);
    const auto& single = platform_.relayReporting.singles[0];
    EXPECT_EQ(single.message.category, kAudioEventCategoryIO);
    EXPECT_EQ(single.message.type, kAudioEventTypeStop);
    EXPECT_EQ(single.message.payload, (Dictionary{{"a_key", 1}}));
    EXPECT_FALSE(single.userInfo.contains("device_name"));
}

TEST_F(SingleMessageTest, IsMarkedAndLogged) {
    sendSingle(kAudioServiceTypeStandalone);
    platform_.queues.advance(1s);
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044838));
    EXPECT_THAT(platform_.log.texts(),
                ElementsAre("sending single message after delta 0 for service 5",
                            "sending single message",
                            "message {\n    \"a key\" = 1;\n} : category 536870919 : type 2"));
}

TEST_F(SingleMessageTest, IsLoggedWithSignedNumbers) {
    HYReportingSession::sendSingleMessage({}, 0xFFFFFFFF, 0xFFFFFFFE, kAudioServiceTypeUnknown, {},
                                          nullptr);
    platform_.queues.advance(1s);
    EXPECT_TRUE(logged(LogLevel::Debug, "message {\n} : category -1 : type -2"));
    EXPECT_TRUE(logged(LogLevel::Debug, "sending single message after delta 0 for service 65535"));
}

TEST_F(SingleMessageTest, AlarmsDrawADeltaThatDelaysNothing) {
    platform_.random.next = 59;
    sendSingle(kAudioServiceTypeAlarms);
    EXPECT_EQ(platform_.random.lastBound, 60U);
    EXPECT_TRUE(logged(LogLevel::Debug, "sending single message after delta 59 for service 4"));
    platform_.queues.advance(1s);
    EXPECT_EQ(platform_.relayReporting.singles.size(), 1U);
}

TEST_F(SingleMessageTest, OnlyAlarmsDrawADelta) {
    sendSingle(kAudioServiceTypeAlerts);
    EXPECT_EQ(platform_.random.lastBound, 0U);
}

TEST_F(SingleMessageTest, SuccessIsRepliedWithoutAnError) {
    std::vector<MaybeError> replies;
    sendSingle(kAudioServiceTypeAlerts, [&](const MaybeError& error) { replies.push_back(error); });
    EXPECT_THAT(replies, IsEmpty());
    platform_.queues.advance(1s);
    EXPECT_THAT(replies, ElementsAre(MaybeError()));
}

TEST_F(SingleMessageTest, AFailureIsLoggedAndReplied) {
    platform_.relayReporting.failure = Error{"framework", 5, "store is full"};
    std::vector<MaybeError> replies;
    sendSingle(kAudioServiceTypeAlerts, [&](const MaybeError& error) { replies.push_back(error); });
    platform_.queues.advance(1s);
    EXPECT_TRUE(logged(LogLevel::Error, "sendOneMessageWithSessionInfo store is full"));
    EXPECT_THAT(replies, ElementsAre(platform_.relayReporting.failure));
}

TEST_F(SingleMessageTest, CountsAmongWhatItsClientHasOnItsWay) {
    const auto client =
        std::make_shared<platform::ClientBudget>(std::make_shared<platform::SharedLimits>());
    {
        const platform::BudgetScope pays(client);
        for (int i = 0; i < 20; ++i) {
            HYReportingSession::sendSingleMessage({{"text", std::string(900'000, 'x')}}, 1, 1,
                                                  kAudioServiceTypeGeneric, {}, nullptr);
        }
    }
    EXPECT_TRUE(client->isBacklogged());
    platform_.queues.advance(std::chrono::seconds(1));
    EXPECT_FALSE(client->isBacklogged());
}

} // namespace
} // namespace halyard
