// What one client may make the service keep and do.

#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using ::testing::HasSubstr;

class ClientBoundsTest : public ServiceTest {
protected:
    // Of the client's process.
    void limit(const platform::ClientLimits& limits) { client_.connection().limits->set(limits); }
    std::size_t kept() const { return client_.connection().clientBudget->keptBytes(); }
    static bool refused(const Peer::Answer& answer, std::string_view bound) {
        return answer->given() && answer->error && answer->error->domain == kIpcErrorDomain &&
               answer->error->code == 5 &&
               answer->error->message.starts_with("limits." + std::string(bound) + ": ");
    }
    std::uint64_t counted(platform::MessageCount what) {
        return platform::current().messageAccounts.of(what);
    }
    Peer::Answer sendKind(AudioEventCategory category, std::size_t bytes) {
        return client_.ask(protocol::Method::SendMessage,
                           {.dictionary = {{"text", std::string(bytes, 'x')}},
                            .category = category,
                            .type = kAudioEventTypeStart,
                            .reporterIDs = protocol::ReporterIDs{7}});
    }

    const Peer client_ = connect(100);
    const Peer other_ = connect(200);
};

TEST_F(ClientBoundsTest, ASessionTooManyIsRefusedAndOnesPlaceIsGivenBack) {
    limit({.sessions = 2});
    EXPECT_TRUE(succeeded(client_.create(1)));
    EXPECT_TRUE(succeeded(client_.create(2)));
    EXPECT_TRUE(refused(client_.create(3), "sessions"));
    EXPECT_EQ(session(3), nullptr);
    EXPECT_TRUE(succeeded(other_.create(3))) << "another client has its own";
    client_.destroy(1);
    EXPECT_TRUE(succeeded(client_.create(4)));
}

TEST_F(ClientBoundsTest, AConfigurationThatWouldBeTooLargeIsRefusedWhole) {
    limit({.configuration = 1000});
    client_.create(7);
    EXPECT_TRUE(succeeded(client_.configure({{"a", "first"}}, 7)));
    EXPECT_TRUE(refused(client_.configure({{"a", "new"}, {"b", std::string(1000, 'x')}}, 7),
                        "configuration"));
    EXPECT_EQ(session(7)->configuration(), (Dictionary{{"a", "first"}}));
    const std::size_t before = kept();
    for (int i = 0; i < 100; ++i) { // What replaces itself does not grow.
        EXPECT_TRUE(succeeded(client_.configure({{"c", std::string(500, 'x')}}, 7)));
    }
    EXPECT_LT(kept(), before + 1000);
}

TEST_F(ClientBoundsTest, ConfigurationsOfAllSessionsShareTheMemory) {
    limit({.memory = 20'000});
    for (const std::int64_t id : {1, 2, 3}) {
        EXPECT_TRUE(succeeded(client_.create(id)));
    }
    const Dictionary large{{"text", std::string(7000, 'x')}};
    EXPECT_TRUE(succeeded(client_.configure(large, 1)));
    EXPECT_TRUE(succeeded(client_.configure(large, 2)));
    EXPECT_TRUE(refused(client_.configure(large, 3), "memory"));
    client_.destroy(1);
    EXPECT_TRUE(succeeded(client_.configure(large, 3)));
}

TEST_F(ClientBoundsTest, AMessageWhoseKindFindsNoRoomIsRefusedAndCounted) {
    limit({.memory = 30'000, .summary = 1000});
    client_.createAndStart(7);
    EXPECT_FALSE(sendKind(1, 10'000)->error);
    EXPECT_FALSE(sendKind(2, 10'000)->error);
    const auto offered = counted(platform::MessageCount::Offered);
    const auto requests = counted(platform::MessageCount::Requests);
    EXPECT_TRUE(refused(sendKind(3, 10'000), "memory"));
    EXPECT_EQ(counted(platform::MessageCount::Bounded), 1U);
    EXPECT_EQ(counted(platform::MessageCount::Offered), offered);
    EXPECT_EQ(counted(platform::MessageCount::Requests), requests);
    EXPECT_FALSE(sendKind(2, 9'000)->error) << "of a kind that is there";
    client_.stop(7);
    client_.destroy(7);
    EXPECT_EQ(kept(), 0U);
}

TEST_F(ClientBoundsTest, CopiesForManySessionsAreLookedAtBeforeTheyAreMade) {
    limit({.copies = 10'500});
    client_.createAndStart(7);
    const Dictionary message{{"text", std::string(900, 'x')}};
    EXPECT_FALSE(client_.send(message, protocol::ReporterIDs(10, 7))->error);
    EXPECT_TRUE(refused(client_.send(message, protocol::ReporterIDs(11, 7)), "copies"));
    EXPECT_EQ(counted(platform::MessageCount::Offered), 10U);
    EXPECT_FALSE(client_.send({{"n", 1}}, protocol::ReporterIDs(11, 7))->error);
}

TEST_F(ClientBoundsTest, ABroadcastIsCopiedToo) {
    limit({.copies = 1500});
    client_.createAndStart(7);
    const Dictionary message{{"text", std::string(900, 'x')}};
    EXPECT_FALSE(client_.send(message, std::nullopt)->error);
    other_.createAndStart(8);
    EXPECT_TRUE(refused(client_.send(message, std::nullopt), "copies"));
    EXPECT_FALSE(other_.send(message, std::nullopt)->error);
}

TEST_F(ClientBoundsTest, WhoSendsPaysAlsoForAnothersSession) {
    other_.createAndStart(7);
    const std::size_t before = other_.connection().clientBudget->keptBytes();
    const std::size_t mine = kept();
    sendKind(4, 10'000);
    EXPECT_EQ(other_.connection().clientBudget->keptBytes(), before);
    EXPECT_GT(kept(), mine + 20'000) << "the kind and the summary";
    other_.destroy(7);
    EXPECT_EQ(kept(), mine);
}

TEST_F(ClientBoundsTest, ASummaryLeavesOutWhatIsBeyondAndSaysHowMuch) {
    limit({.summary = 2000});
    client_.createAndStart(7);
    for (int i = 0; i < 3; ++i) {
        EXPECT_FALSE(client_.send({{"n", i}, {"text", std::string(500, 'x')}}, {{7}})->error);
    }
    client_.stop(7);
    const auto& summary = platform_.relayReporting.uploads.back()->messages.back().payload;
    EXPECT_EQ(summary["n"], Value("0,1,2"));
    EXPECT_EQ(summary["text"], Value(std::string(500, 'x') + "," + std::string(500, 'x')));
    EXPECT_EQ(summary["HY_Session_Summary_Omitted"], Value("1"));
}

TEST_F(ClientBoundsTest, AMessageForManyGivesOthersTheirTurn) {
    client_.createAndStart(7);
    const auto many = client_.connection().send(protocol::Method::SendMessage,
                                                {.dictionary = {{"n", 1}},
                                                 .category = kAudioEventCategoryError,
                                                 .type = kAudioEventTypeStart,
                                                 .reporterIDs = protocol::ReporterIDs(1000, 7)});
    int steps = 0;
    while (!many->given()) {
        ASSERT_TRUE(platform_.queues.runOne());
        ++steps;
    }
    EXPECT_GT(steps, 2);
    run();
    EXPECT_EQ(counted(platform::MessageCount::Offered), 1000U) << "an ID counts each time";
}

TEST_F(ClientBoundsTest, AClientWithManySessionsIsLostInSteps) {
    for (std::int64_t id = 1; id <= 100; ++id) {
        client_.createAndStart(id);
    }
    client_.connection().invalidate();
    int steps = 0;
    while (platform_.queues.runOne()) {
        ++steps;
    }
    EXPECT_GT(steps, 3);
    EXPECT_EQ(service_->getAllClients().size(), 1U);
    EXPECT_TRUE(loggedByClient(LogLevel::Default, "removing 100 from the server client list"));
}

TEST_F(ClientBoundsTest, ManyUnknownIDsMakeOneLine) {
    protocol::ReporterIDs ids;
    for (std::int64_t id = 1001; id <= 61000; ++id) {
        ids.push_back(id);
    }
    client_.send({{"n", 1}}, ids);
    std::vector<std::string> lines = platform_.log.texts(LogLevel::Error);
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0],
              "failed to find reporting session 1001, 1002, 1003, 1004, 1005, 1006, "
              "1007, 1008, 1009, 1010, 1011, 1012, 1013, 1014, 1015, 1016 and 59984 more");
}

TEST_F(ClientBoundsTest, AFewUnknownIDsHaveALineEach) {
    client_.send({{"n", 1}}, {{8, 9}});
    EXPECT_THAT(platform_.log.texts(LogLevel::Error),
                ::testing::ElementsAre("failed to find reporting session 8",
                                       "failed to find reporting session 9"));
}

} // namespace
} // namespace halyard
