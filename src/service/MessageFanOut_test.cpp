#include "service/MessageFanOut.h"

#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using namespace platform; // The many kRelayReporting... names.
using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class MessageFanOutTest : public ServiceTest {
protected:
    // Internal builds keep the batch, which these tests look at.
    MessageFanOutTest() : ServiceTest(true) {}

    // The numbers that came in under "n" for a session.
    std::vector<std::int64_t> uploadedFor(std::int64_t id) const {
        std::vector<std::int64_t> numbers;
        for (const auto& upload : platform_.relayReporting.uploads) {
            if (upload->sessionInfo[kRelayReportingSessionInfoSessionID] == Value(id)) {
                for (const auto& message : upload->messages) {
                    numbers.push_back(message.payload["n"].integerValue());
                }
            }
        }
        return numbers;
    }
    std::size_t acceptedBy(std::int64_t id, std::size_t client = 0) const {
        return session(id, client)->nestedAggregatedPayloadData().size();
    }
    static bool answered(const Peer::Answer& answer) {
        return answer->count == 1 && !answer->error && answer->result.isNone();
    }

    const Peer client_ = connect(100);
    const Peer other_ = connect(200);
};

TEST_F(MessageFanOutTest, IsLoggedAndMarked) {
    platform_.log.clear();
    platform_.traceMarks.codes.clear();
    client_.send({{"n", 1}}, protocol::ReporterIDs{0, -7});
    EXPECT_TRUE(
        loggedByClient(LogLevel::Debug, "sending message for reporter (\n    0,\n    -7\n)"));
    EXPECT_THAT(platform_.traceMarks.codes, ElementsAre(0x21044824));
    EXPECT_TRUE(platform_.traceMarks.argumentsAllZero);
}

TEST_F(MessageFanOutTest, ADisabledServiceAnswersAnErrorAndSendsNothing) {
    client_.createAndStart(7);
    service_->setReportingEnabled(false);
    for (const auto& ids :
         {std::optional(protocol::ReporterIDs{7}), std::optional<protocol::ReporterIDs>()}) {
        const auto answer = client_.send({{"n", 1}}, ids);
        EXPECT_EQ(answer->error, (Error{"com.kestrel.audio.reporting", 1, ""}));
        EXPECT_EQ(answer->count, 1);
    }
    platform_.queues.advance(1s);
    EXPECT_THAT(uploadedFor(7), IsEmpty());
    EXPECT_THAT(platform_.relayReporting.singles, IsEmpty());
    EXPECT_EQ(acceptedBy(7), 0U);
}

TEST_F(MessageFanOutTest, ReachesTheAddressedSessionsOnly) {
    client_.createAndStart(7);
    client_.createAndStart(8);
    EXPECT_TRUE(answered(client_.send({{"n", 1}}, protocol::ReporterIDs{8})));
    EXPECT_THAT(uploadedFor(7), IsEmpty());
    EXPECT_THAT(uploadedFor(8), ElementsAre(1));
}

TEST_F(MessageFanOutTest, ReachesTheSessionOfAnotherClient) {
    client_.createAndStart(7);
    EXPECT_TRUE(answered(other_.send({{"n", 1}}, protocol::ReporterIDs{7})));
    EXPECT_THAT(uploadedFor(7), ElementsAre(1));
    EXPECT_TRUE(logged(LogLevel::Info, "found reporting session 7 for client 100"));
}

TEST_F(MessageFanOutTest, SkipsZeroAndUnknownIDs) {
    client_.createAndStart(7);
    EXPECT_TRUE(answered(client_.send({{"n", 1}}, protocol::ReporterIDs{0, 99})));
    platform_.queues.advance(1s);
    EXPECT_EQ(acceptedBy(7), 0U);
    EXPECT_THAT(platform_.relayReporting.singles, IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Error, "failed to find reporting session 99"));
    EXPECT_EQ(platform_.log.count("failed to find reporting session 0"), 0U);
}

TEST_F(MessageFanOutTest, AnIDNamedTwiceIsServedTwice) {
    client_.createAndStart(7);
    client_.ask(protocol::Method::SendMessage, {.dictionary = {{"n", 1}},
                                                .category = kAudioEventCategoryError,
                                                .type = kAudioEventTypeStart,
                                                .reporterIDs = protocol::ReporterIDs{7, 7}});
    EXPECT_THAT(uploadedFor(7), ElementsAre(1, 1)); // Errors are never repeats.
}

TEST_F(MessageFanOutTest, AnEmptyListSendsNothingAnywhere) {
    client_.createAndStart(7);
    EXPECT_TRUE(answered(client_.send({{"n", 1}}, protocol::ReporterIDs{})));
    platform_.queues.advance(1s);
    EXPECT_EQ(acceptedBy(7), 0U);
    EXPECT_THAT(platform_.relayReporting.singles, IsEmpty());
}

TEST_F(MessageFanOutTest, WithoutAListEveryStartedSessionIsServed) {
    client_.createAndStart(7);
    client_.create(8);
    other_.createAndStart(9);
    EXPECT_TRUE(answered(client_.send({{"n", 1}}, std::nullopt)));
    EXPECT_THAT(uploadedFor(7), ElementsAre(1));
    EXPECT_THAT(uploadedFor(9), ElementsAre(1));
    platform_.queues.advance(1s);
    EXPECT_THAT(platform_.relayReporting.singles, IsEmpty()) << "8 has not started";
}

TEST_F(MessageFanOutTest, ABroadcastTellsWhomItReaches) {
    client_.createAndStart(7);
    platform_.log.clear();
    client_.send({{"n", 1}}, std::nullopt);
    EXPECT_TRUE(loggedByClient(LogLevel::Debug, "sending message for reporter (null)"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "active reporting sessions 1 : (\n    \"" +
                                                      session(7)->description() + "\"\n)"));
}

TEST_F(MessageFanOutTest, EachBroadcastTellsWhomItReachesByThen) {
    const auto broadcast = [this] {
        platform_.log.clear();
        client_.send({{"n", 1}}, std::nullopt);
        return platform_.log.texts(LogLevel::Default);
    };
    const auto list = [](const std::string& of) {
        return of.empty() ? of : "    \"" + of + "\"\n";
    };
    const auto expected = [&](const std::string& first, const std::string& second) {
        return std::vector{"sessions for client 100 : (\n" + list(first) + ")",
                           "sessions for client 200 : (\n" + list(second) + ")",
                           "active reporting sessions 1 : (\n" + list(first) + ")"};
    };
    client_.createAndStart(7);
    EXPECT_EQ(broadcast(), expected(session(7)->description(), ""));
    EXPECT_EQ(broadcast(), expected(session(7)->description(), ""));
    client_.configure({{"HostApplicationDisplayID", "org.player"}}, 7);
    EXPECT_EQ(broadcast(), expected(session(7)->description(), ""));
    EXPECT_NE(session(7)->description().find("org.player"), std::string::npos);
    other_.create(9);
    EXPECT_EQ(broadcast(), expected(session(7)->description(), session(9, 1)->description()));
    other_.connection().invalidate();
    connect(300);
    EXPECT_EQ(broadcast()[1], "sessions for client 300 : (\n)");
}

TEST_F(MessageFanOutTest, WithNoStartedSessionTheMessageLeavesAlone) {
    client_.create(7);
    EXPECT_TRUE(answered(client_.send({{"n", 1}}, std::nullopt)));
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "active reporting sessions 0 : (\n)"));
    EXPECT_TRUE(loggedByClient(LogLevel::Default,
                               "no active reporting sessions found, sending as standalone"));
    platform_.queues.advance(1s);
    ASSERT_THAT(platform_.relayReporting.singles, SizeIs(1));
    const auto& single = platform_.relayReporting.singles[0];
    EXPECT_EQ(single.userInfo[kRelayReportingUserInfoServiceName], Value("standalone"));
    EXPECT_EQ(single.message.payload, (Dictionary{{"n", 1}}));
    EXPECT_EQ(single.message.category, kAudioEventCategoryPlayback);
}

TEST_F(MessageFanOutTest, AStandaloneMessageLeavesNoSessionBehind) {
    client_.send({{"n", 1}}, std::nullopt);
    EXPECT_THAT(service_->getAllActiveReportingSessions(), IsEmpty());
    EXPECT_EQ(service_->activeSessionCount(), 0);
    EXPECT_EQ(client_.ask(protocol::Method::GetAllReporters)->result, List());
}

TEST_F(MessageFanOutTest, TheDefaultsOfAStandaloneMessageStayAtHome) {
    platform_.preferences.values[{"com.kestrel.halyard", "device_name"}] = "kitchen";
    restartService();
    connect(300).send({{"n", 1}}, std::nullopt);
    platform_.queues.advance(1s);
    EXPECT_FALSE(platform_.relayReporting.singles.at(0).userInfo.contains("device_name"));
}

TEST_F(MessageFanOutTest, AMessageForASessionThatHasNotStartedLeavesAlone) {
    client_.create(7);
    client_.send({{"n", 1}}, protocol::ReporterIDs{7});
    platform_.queues.advance(1s);
    ASSERT_THAT(platform_.relayReporting.singles, SizeIs(1));
    EXPECT_EQ(platform_.relayReporting.singles[0].userInfo[kRelayReportingUserInfoServiceName],
              Value("unknown"));
}

} // namespace
} // namespace halyard
