// What the upload is told of messages that were dropped as repeats.

#include <gtest/gtest.h>

#include "session/SessionFixture.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;

class SessionRepeatsTest : public SessionTest {
protected:
    // As "category/type: count, first to last", in seconds since the first message.
    std::vector<std::string> told() {
        run();
        std::vector<std::string> result;
        for (const platform::Repeats& each : upload().repeats) {
            result.push_back(fmt::format("{}/{}: {}, {} to {}", each.category, each.type,
                                         each.count, each.first - start_, each.last - start_));
        }
        return result;
    }
    void sendEach(HYReportingSession& session, std::initializer_list<int> values) {
        for (const int value : values) {
            send(session, {{"n", value}});
            platform_.clock.advance(1s);
        }
    }

    const double start_ = platform::secondsSince1970(platform_.clock.wallTime());
};

TEST_F(SessionRepeatsTest, AreToldWhenTheNextOfTheirKindIsAccepted) {
    const auto session = makeRelayedSession();
    session->start();
    sendEach(*session, {1, 1, 1});
    EXPECT_EQ(told(), std::vector<std::string>());
    session->sendMessage({{"n", 1}}, kAudioEventCategoryRecord, kAudioEventTypeStart, nullptr);
    EXPECT_EQ(told(), std::vector<std::string>());
    sendEach(*session, {2, 3});
    EXPECT_EQ(told(), std::vector<std::string>{"4/1: 2, 1 to 2"});
}

TEST_F(SessionRepeatsTest, AreToldBeforeTheSessionCloses) {
    const auto session = makeRelayedSession();
    session->start();
    sendEach(*session, {1, 1});
    session->stop();
    EXPECT_EQ(told(), std::vector<std::string>{"4/1: 1, 1 to 1"});
    EXPECT_TRUE(upload().closed);
    session->start();
    sendEach(*session, {1});
    session->stop();
    EXPECT_EQ(told(), std::vector<std::string>());
}

TEST_F(SessionRepeatsTest, KeepTheNumbersThatTheyHad) {
    const auto session = makeRelayedSession();
    session->start();
    const auto sendAs = [&](AudioEventCategory category) {
        session->sendMessage({{"n", 1}}, category, kAudioEventTypeStart, nullptr);
    };
    // Categories without a name of their own share one.
    for (const AudioEventCategory category : {0xFFFFFFF0U, 0xFFFFFFF0U, 0xFFFFFFF1U}) {
        sendAs(category);
    }
    session->stop();
    EXPECT_EQ(told(),
              (std::vector<std::string>{"4294967280/1: 1, 0 to 0", "4294967281/1: 1, 0 to 0"}));
}

TEST_F(SessionRepeatsTest, AreNotToldWhereNothingIsUploaded) {
    const auto session = makeSession();
    session->start();
    sendEach(*session, {1, 1, 2});
    session->stop();
    run();
    EXPECT_TRUE(platform_.relayReporting.uploads.empty());
}

TEST_F(SessionRepeatsTest, AnUploadLearnsWhetherItsClientWasLost) {
    const auto session = makeRelayedSession();
    session->start();
    session->stop(platform::UploadEnding::Disconnected);
    run();
    EXPECT_EQ(upload().ending, platform::UploadEnding::Disconnected);
    session->start();
    session->stop();
    run();
    EXPECT_EQ(upload().ending, platform::UploadEnding::Stopped);
}

} // namespace
} // namespace halyard
