#include "ExporterTesting.h"

#include <fmt/format.h>
#include <set>

namespace halyard::exporting {
namespace {

using ::testing::Test;
using Names = std::vector<std::string>;

TEST_F(ExporterTest, SendsEachRowOnce) {
    message(1);
    message(2, "{}", {}, 14, 3);
    EXPECT_FALSE(run().isLeft);
    EXPECT_EQ(eventNames(), (Names{"halyard.playback.start", "halyard.volume.activate"}));
    message(3, "{}", {}, 4, 2);
    restarted();
    run();
    EXPECT_EQ(eventNames(), (Names{"halyard.playback.start", "halyard.volume.activate",
                                   "halyard.playback.stop"}));
}

TEST_F(ExporterTest, WithoutConsentNothingIsSent) {
    message(1);
    plan_.options.consent = false;
    run();
    EXPECT_TRUE(receiver_.requests.empty());
}

TEST_F(ExporterTest, RowsFromATimeWithoutConsentAreNeverSent) {
    message(1, "{}", {}, 1, 1);
    note(false, kBegin + 10);
    message(11, "{}", {}, 4, 2);
    note(true, kBegin + 20);
    message(21, "{}", {}, 4, 3);
    run();
    ASSERT_EQ(receiver_.items(Signal::Logs).size(), 2U);
    EXPECT_EQ(eventNames().back(), "halyard.playback.activate");
    EXPECT_EQ(lost(Signal::Logs, Loss::Removed), 0U);
}

TEST_F(ExporterTest, ASessionThatBeganWithoutConsentLeavesNoNameBehind) {
    const auto session = store_.addSession("player", kBegin - 5, kBegin + 5);
    message(1, "{}", session);
    run();
    EXPECT_TRUE(receiver_.items(Signal::Traces).empty());
    EXPECT_EQ(receiver_.requests.at(0).json.find("player"), std::string::npos);
    EXPECT_EQ(receiver_.items(Signal::Logs).size(), 1U);
}

TEST_F(ExporterTest, AStoreWithoutIdentityIsNotSent) {
    store_.execute("DELETE FROM identity");
    message(1);
    run();
    EXPECT_TRUE(receiver_.requests.empty());
}

TEST_F(ExporterTest, ANewIdentityBeginsAnew) {
    message(1);
    run();
    store_.execute("UPDATE identity SET device = 'b0b'; DELETE FROM upload_message");
    message(2);
    run();
    ASSERT_EQ(receiver_.items(Signal::Logs).size(), 2U);
    EXPECT_NE(receiver_.requests.back().json.find("b0b"), std::string::npos);
}

TEST_F(ExporterTest, RowsThatBeganAnewAreSeenAndNotLost) {
    message(1);
    message(2);
    run();
    store_.execute("DELETE FROM upload_message");
    message(50);
    run();
    EXPECT_EQ(receiver_.items(Signal::Logs).size(), 3U);
    EXPECT_EQ(lost(Signal::Logs, Loss::Removed), 0U);
}

TEST_F(ExporterTest, WhatRetentionTookIsCountedAsLostAndTold) {
    for (int i = 1; i <= 5; ++i) {
        message(i);
    }
    plan_.options.limits.records = 1;
    receiver_.answerWith(200);
    receiver_.answerWith(503);
    run();
    store_.execute("DELETE FROM upload_message WHERE id IN (2, 3)");
    now_ += 600;
    run();
    EXPECT_EQ(lost(Signal::Logs, Loss::Removed), 2U);
    const auto metrics = receiver_.items(Signal::Metrics);
    ASSERT_EQ(metrics.size(), 1U);
    EXPECT_STREQ(metrics[0]["name"].GetString(), "halyard.export.lost");
    const auto& point = metrics[0]["sum"]["dataPoints"][0];
    EXPECT_STREQ(point["asInt"].GetString(), "2");
    EXPECT_EQ(attribute(point, "reason"), "removed");
}

TEST_F(ExporterTest, ALeapOfIdsIsNoLoss) {
    message(1);
    run();
    store_.execute(fmt::format("INSERT INTO upload_message(id, category, type, payload, time) "
                               "VALUES({}, 4, 1, '{{}}', {})",
                               std::int64_t{1} << 40, kBegin + 2));
    run();
    EXPECT_EQ(receiver_.items(Signal::Logs).size(), 2U);
    EXPECT_EQ(lost(Signal::Logs, Loss::Removed), 0U);
}

TEST_F(ExporterTest, RowsThatAreSavedLaterBelowALeapAreSentOnce) {
    const auto insert = [this](std::int64_t id, double at) {
        store_.execute(fmt::format("INSERT INTO upload_message(id, category, type, payload, time) "
                                   "VALUES({}, 4, 1, '{{}}', {})",
                                   id, kBegin + at));
    };
    insert(1, 1);
    run();
    insert(std::int64_t{1} << 40, 9);
    run();
    insert(3, 2);
    restarted();
    run();
    insert((std::int64_t{1} << 40) + 1, 10);
    insert(4, 3);
    run();
    run();
    std::vector<std::string> times;
    for (const auto& record : receiver_.items(Signal::Logs)) {
        times.emplace_back(record["timeUnixNano"].GetString(), 10);
    }
    EXPECT_EQ(times, (std::vector<std::string>{"1700000001", "1700000009", "1700000002",
                                               "1700000003", "1700000010"}));
    EXPECT_EQ(lost(Signal::Logs, Loss::Removed), 0U);
}

TEST_F(ExporterTest, SessionsThatAreSavedLaterBelowALeapAreSentOnce) {
    store_.addSession("first", kBegin + 1, kBegin + 2);
    const auto moved = store_.addSession("second", kBegin + 5, kBegin + 6);
    store_.execute(fmt::format("UPDATE upload_session SET id = {} WHERE id = {}",
                               std::int64_t{1} << 40, moved));
    run();
    store_.execute(fmt::format("UPDATE upload_session SET id = 2 WHERE id = {}",
                               store_.addSession("late", kBegin + 3, kBegin + 4)));
    run();
    run();
    EXPECT_EQ(receiver_.items(Signal::Traces).size(), 3U);
    EXPECT_EQ(lost(Signal::Traces, Loss::Removed), 0U);
}

TEST_F(ExporterTest, OfAnyNumberOfOpenSessionsEachIsSentOnceItIsClosed) {
    constexpr std::size_t kMany = SessionWalk::kMostOpen + 2;
    store_.execute(fmt::format("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n "
                               "WHERE i < {}) INSERT INTO upload_session(session_id, session_info, "
                               "user_info, opened) SELECT i, '{{}}', '{{}}', {} FROM n",
                               kMany, kBegin + 1));
    run();
    store_.execute(fmt::format("UPDATE upload_session SET closed = {} WHERE id IN (1, {})",
                               kBegin + 2, kMany));
    run();
    EXPECT_EQ(receiver_.items(Signal::Traces).size(), 2U);
    run();
    EXPECT_EQ(receiver_.items(Signal::Traces).size(), 2U);
}

TEST_F(ExporterTest, WhatIsSentAgainHasTheSameIdentity) {
    message(1);
    receiver_.answerWith(503);
    EXPECT_TRUE(run().isLeft);
    restarted();
    run();
    const auto records = receiver_.items(Signal::Logs);
    ASSERT_EQ(records.size(), 2U);
    EXPECT_NE(attribute(records[0], "log.record.uid"), "none");
    EXPECT_EQ(attribute(records[0], "log.record.uid"), attribute(records[1], "log.record.uid"));
}

TEST_F(ExporterTest, RowsThatGotTheIdsOfOthersHaveIdentitiesOfTheirOwn) {
    const auto opened = [this](double at) {
        const auto session = store_.addSession("player", kBegin + at, kBegin + at + 5);
        message(at + 1, "{}", session);
        message(at + 1);
        run();
        // As a power cut does, or who puts a store back to an earlier state.
        store_.execute("DELETE FROM upload_message; DELETE FROM upload_session");
    };
    opened(10);
    opened(20);
    std::set<std::string> names;
    for (const auto& record : receiver_.items(Signal::Logs)) {
        names.insert(attribute(record, "log.record.uid"));
    }
    EXPECT_EQ(names.size(), 4U);
}

TEST_F(ExporterTest, OfRowsOfASessionOnlyTheRowDiffersInTheirIdentity) {
    const auto session = store_.addSession("player", kBegin + 1, kBegin + 9);
    message(2, "{}", session);
    message(3, "{}", session);
    run();
    const auto records = receiver_.items(Signal::Logs);
    const std::string first = attribute(records.at(0), "log.record.uid");
    EXPECT_TRUE(first.ends_with("/1")) << first;
    EXPECT_EQ(attribute(records.at(1), "log.record.uid"), first.substr(0, first.size() - 1) + "2");
}

TEST_F(ExporterTest, ARetryWaitsAsLongAsTheReceiverAsks) {
    message(1);
    receiver_.answerWith(429, 30);
    const auto step = run();
    EXPECT_TRUE(step.isLeft);
    EXPECT_EQ(step.next, now_ + 30);
    now_ += 29;
    run();
    EXPECT_EQ(receiver_.requests.size(), 1U);
    now_ += 1;
    EXPECT_FALSE(run().isLeft);
    EXPECT_EQ(receiver_.requests.size(), 2U);
}

TEST_F(ExporterTest, ARefusalKeepsTheDataForAnHourOrANewConfiguration) {
    message(1);
    receiver_.answerWith(401);
    EXPECT_EQ(run().next, now_ + 3600);
    now_ += 3000;
    run();
    EXPECT_EQ(receiver_.requests.size(), 1U);
    exporter_->follow(plan_);
    EXPECT_FALSE(run().isLeft);
    EXPECT_EQ(lost(Signal::Logs, Loss::Refused), 0U);
    EXPECT_EQ(receiver_.requests.size(), 2U);
}

TEST_F(ExporterTest, OtherAnswersGiveTheDataUpAndAreCounted) {
    message(1);
    message(2);
    receiver_.answerWith(400);
    EXPECT_FALSE(run().isLeft);
    EXPECT_EQ(lost(Signal::Logs, Loss::Refused), 2U);
    message(3);
    run();
    EXPECT_EQ(receiver_.items(Signal::Logs).size(), 3U);
}

TEST_F(ExporterTest, TheLossOfWhatTellsOfLossesIsNone) {
    const auto session = store_.addSession("player", kBegin + 1, kBegin + 9);
    message(2, glitch(1, 0.5), session, 4, 7);
    for (int i = 0; i < 20; ++i) {
        receiver_.answerWith(404);
    }
    EXPECT_FALSE(run().isLeft);
    EXPECT_EQ(lost(Signal::Logs, Loss::Refused), 1U);
    EXPECT_EQ(lost(Signal::Traces, Loss::Refused), 2U);
    EXPECT_EQ(lost(Signal::Metrics, Loss::Refused), 1U);
    EXPECT_LT(receiver_.requests.size(), 6U);
}

TEST_F(ExporterTest, APartialSuccessIsCountedAndNotRepeated) {
    message(1);
    message(2);
    // partial_success { rejected: 1 }
    receiver_.answerWith(200, 0, std::string("\x0a\x02\x08\x01", 4));
    run();
    EXPECT_EQ(lost(Signal::Logs, Loss::Rejected), 1U);
    EXPECT_EQ(receiver_.items(Signal::Logs).size(), 2U);
}

TEST_F(ExporterTest, TheDaysBytesAreABound) {
    plan_.options.maxBytesPerDay = 10;
    message(1);
    const auto step = run();
    EXPECT_TRUE(step.isLeft);
    EXPECT_TRUE(receiver_.requests.empty());
    EXPECT_GT(step.next, now_);
    EXPECT_LE(step.next, now_ + 86400);
    EXPECT_EQ(std::fmod(step.next, 86400), 0);
}

TEST_F(ExporterTest, ManyRowsGoInRequestsOfABoundedSize) {
    plan_.options.limits.records = 100;
    for (int i = 0; i < 250; ++i) {
        message(i);
    }
    run();
    EXPECT_EQ(receiver_.requests.size(), 3U);
    EXPECT_EQ(receiver_.items(Signal::Logs).size(), 250U);
}

TEST_F(ExporterTest, ARowBeyondAnyRequestIsGivenUpAlone) {
    plan_.options.limits.bytes = 1000;
    message(1);
    message(2, "{\"a\":\"" + std::string(2000, 'x') + "\"}");
    message(3);
    run();
    EXPECT_EQ(receiver_.items(Signal::Logs).size(), 2U);
    EXPECT_EQ(lost(Signal::Logs, Loss::TooLarge), 1U);
}

TEST_F(ExporterTest, ASignalThatIsRefusedDoesNotHoldUpTheOthers) {
    const auto session = store_.addSession("player", kBegin + 1, kBegin + 9);
    message(2, "{}", session);
    receiver_.answerWith(503);
    EXPECT_TRUE(run().isLeft);
    EXPECT_EQ(receiver_.items(Signal::Traces).size(), 1U);
}

TEST_F(ExporterTest, AnOpenSessionIsSentWhenItIsClosed) {
    const auto session = store_.addSession("player", kBegin + 1, {});
    const auto later = store_.addSession("other", kBegin + 2, kBegin + 3);
    message(2, "{}", session);
    EXPECT_FALSE(run().isLeft);
    ASSERT_EQ(receiver_.items(Signal::Traces).size(), 1U);
    store_.execute(
        fmt::format("UPDATE upload_session SET closed = {} WHERE id = {}", kBegin + 20, session));
    restarted();
    run();
    run();
    const auto spans = receiver_.items(Signal::Traces);
    ASSERT_EQ(spans.size(), 2U);
    EXPECT_EQ(attribute(spans[1], "halyard.application"), "player");
    EXPECT_NE(later, session);
}

TEST_F(ExporterTest, NothingIsSentOnceItMayNotGoOn) {
    message(1);
    mayGoOn_ = false;
    EXPECT_TRUE(run().isLeft);
    EXPECT_TRUE(receiver_.requests.empty());
}

TEST_F(ExporterTest, OneLineAnEpisodeTellsOfAReceiverThatIsGone) {
    message(1);
    for (int i = 0; i < 3; ++i) {
        receiver_.answerWith(503);
        run();
        now_ += 600;
    }
    run();
    std::vector<std::string> lines;
    for (const auto& line : log_.lines()) {
        lines.push_back(line.text);
    }
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0], "http://r/v1/logs does not take logs: it answers 503; it is tried again");
    EXPECT_EQ(lines[1], "logs are taken again");
}

} // namespace
} // namespace halyard::exporting
