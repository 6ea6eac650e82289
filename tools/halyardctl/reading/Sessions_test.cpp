#include "reading/Sessions.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "reading/TestStoreTesting.h"

namespace halyard::reading {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr double kBegin = 1.7e9;

class SessionsTest : public ::testing::Test {
protected:
    std::vector<Session> read(const TimeRange& range = {}) {
        StoreReader reader = store_.open();
        std::vector<Session> sessions;
        const auto result =
            forEachSession(reader, range, kBegin + 1e6, nullptr, [&](const Session& session) {
                sessions.push_back(session);
                return true;
            });
        EXPECT_TRUE(result.ok());
        return sessions;
    }
    Session one() {
        const auto sessions = read();
        EXPECT_EQ(sessions.size(), 1U);
        return sessions.empty() ? Session() : sessions.front();
    }
    // A volume message at some second of the session.
    void addState(int state, double at, const std::string& stamp = "") {
        store_.addMessage(1, 14, 3,
                          "{\"VQSessionVolumePlayingState\":" + std::to_string(state) + stamp + "}",
                          kBegin + at);
    }

    TestStore store_;
};

TEST_F(SessionsTest, ASessionIsNamedByItsUserInformation) {
    store_.addSession("player", kBegin, kBegin + 10, ",\"stream_direction\":\"capture\"");
    const Session session = one();
    EXPECT_EQ(session.application, "player");
    EXPECT_EQ(session.service, "alarms");
    EXPECT_EQ(session.direction, Direction::Capture);
    EXPECT_EQ(session.sessionID, 4711);
    EXPECT_EQ(session.closed, kBegin + 10);
}

TEST_F(SessionsTest, WhatIsBrokenOrAbsentIsUnknown) {
    store_.insert("upload_session(session_info, user_info)", "'{', NULL");
    const Session session = one();
    EXPECT_FALSE(session.application);
    EXPECT_FALSE(session.service);
    EXPECT_FALSE(session.opened);
    EXPECT_EQ(session.direction, Direction::Unknown);
}

TEST_F(SessionsTest, WithoutUserInformationTheSessionsOwnNamesTheApplication) {
    store_.insert("upload_session(session_info, user_info)",
                  "'{\"kRelayReportingSessionInfoClientBundleID\":\"bundle\"}', '{}'");
    EXPECT_EQ(one().application, "bundle");
}

TEST_F(SessionsTest, PlayedTimeIsTheSumOfStretchesWithPlayingState) {
    store_.addSession("player", kBegin, kBegin + 100);
    addState(1, 10);
    addState(1, 15); // another volume, the same stretch
    addState(0, 20);
    addState(0, 30);
    addState(1, 40);
    addState(0, 42.5);
    EXPECT_DOUBLE_EQ(one().playedSeconds, 12.5);
}

TEST_F(SessionsTest, StretchesGoByTheMessagesOwnTimeStamps) {
    store_.addSession("player", kBegin, kBegin + 100);
    addState(1, 10, ",\"hyreporting_timestamp\":1700000001.5");
    addState(0, 10, ",\"hyreporting_timestamp\":1700000004");
    EXPECT_DOUBLE_EQ(one().playedSeconds, 2.5);
}

TEST_F(SessionsTest, AStretchThatNobodyEndedEndsWithTheSession) {
    store_.addSession("player", kBegin, kBegin + 100);
    addState(1, 90);
    EXPECT_DOUBLE_EQ(one().playedSeconds, 10);
}

TEST_F(SessionsTest, AStretchOfASessionThatNobodyClosedEndsWithItsLastMessage) {
    store_.addSession("player", kBegin, {});
    addState(1, 10);
    store_.addMessage(1, 1, 1, "{}", kBegin + 25);
    EXPECT_DOUBLE_EQ(one().playedSeconds, 15);
}

TEST_F(SessionsTest, AClockThatWasSetBackTakesNothingOff) {
    store_.addSession("player", kBegin, kBegin + 100);
    addState(1, 50);
    addState(0, 51, ",\"hyreporting_timestamp\":1600000000");
    EXPECT_DOUBLE_EQ(one().playedSeconds, 0);
}

TEST_F(SessionsTest, DevicesComeInTheOrderOfTheirFirstUse) {
    store_.addSession("player", kBegin, kBegin + 100);
    const auto use = [&](const std::string& devices) {
        store_.addMessage(1, 4, 1, "{\"active_devices\":" + devices + "}", kBegin + 1);
    };
    use("[\"speaker\",\"hdmi\"]");
    use("[\"headphones\"]");
    use("\"speaker\"");
    use("\"Unknown\"");
    use("{}");
    EXPECT_THAT(one().devices, ElementsAre("speaker", "hdmi", "headphones"));
}

TEST_F(SessionsTest, TheSummaryOfASessionNamesNoDevices) {
    store_.addSession("player", kBegin, kBegin + 100);
    store_.addMessage(1, 65535, 65535, "{\"active_devices\":\"(speaker),(hdmi)\"}", kBegin + 1);
    const Session session = one();
    EXPECT_THAT(session.devices, IsEmpty());
    EXPECT_EQ(session.messages, 1U);
}

TEST_F(SessionsTest, TheDirectionIsThatOfItsMessagesWhereItIsNotTold) {
    store_.addSession("player", kBegin, kBegin + 100);
    store_.addSession("recorder", kBegin, kBegin + 100);
    store_.addSession("phone", kBegin, kBegin + 100);
    store_.addMessage(1, 4, 1, "{}", kBegin + 1);
    store_.addMessage(2, 2, 1, "{}", kBegin + 1);
    store_.addMessage(3, 2, 1, "{}", kBegin + 1);
    store_.addMessage(3, 4, 1, "{}", kBegin + 1);
    const auto sessions = read();
    ASSERT_EQ(sessions.size(), 3U);
    EXPECT_EQ(sessions[0].direction, Direction::Playback);
    EXPECT_EQ(sessions[1].direction, Direction::Capture);
    EXPECT_EQ(sessions[2].direction, Direction::Unknown);
}

TEST_F(SessionsTest, AGlitchThatIsToldTwiceCountsOnce) {
    store_.addSession("player", kBegin, kBegin + 100);
    const auto tell = [&](const std::string& payload) {
        store_.addMessage(1, 4, 7, payload, kBegin + 20);
    };
    tell("{\"glitch_start\":1700000010.25}");
    tell("{\"glitch_start\":1700000010.25}");
    tell("{\"glitch_start\":1700000012}");
    tell("{}");
    tell("broken");
    EXPECT_EQ(one().glitches, 4U);
}

TEST_F(SessionsTest, SessionsOfARangeAreThoseThatReachIntoIt) {
    store_.addSession("over", kBegin, kBegin + 10);
    store_.addSession("reaches in", kBegin, kBegin + 60);
    store_.addSession("open", kBegin, {});
    store_.addSession("inside", kBegin + 60, kBegin + 61);
    store_.addSession("later", kBegin + 70, kBegin + 80);
    std::vector<std::string> names;
    for (const Session& session : read({kBegin + 50, kBegin + 70})) {
        names.push_back(session.application.value_or(""));
    }
    EXPECT_THAT(names, ElementsAre("reaches in", "open", "inside"));
}

TEST_F(SessionsTest, MessagesOfOtherSessionsDoNotCount) {
    store_.addSession("over", kBegin, kBegin + 10);
    store_.addSession("player", kBegin + 100, kBegin + 110);
    store_.addMessage(1, 4, 1, "{}", kBegin + 105);
    store_.addMessage(2, 4, 1, "{}", kBegin + 105);
    store_.addMessage(3, 4, 1, "{}", kBegin + 105);
    store_.addMessage({}, 4, 1, "{}", kBegin + 105);
    const auto sessions = read({kBegin + 50, kBegin + 200});
    ASSERT_EQ(sessions.size(), 1U);
    EXPECT_EQ(sessions[0].messages, 1U);
}

TEST_F(SessionsTest, ADirectoryKnowsTheNamesOfSessionsByTheirRows) {
    store_.addSession("player", kBegin, kBegin + 10);
    StoreReader reader = store_.open();
    SessionDirectory directory(reader);
    EXPECT_EQ(directory.namesOf(1).application, "player");
    EXPECT_FALSE(directory.namesOf(2).application);
    EXPECT_FALSE(directory.namesOf(INT64_MIN).application);
}

} // namespace
} // namespace halyard::reading
