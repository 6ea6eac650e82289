#include "reading/Digest.h"

#include <gtest/gtest.h>

#include "reading/TestStoreTesting.h"

namespace halyard::reading {
namespace {

constexpr double kBegin = 1.7e9;

class DigestTest : public ::testing::Test {
protected:
    Digest digest(const TimeRange& range) {
        StoreReader reader = store_.open();
        const auto result = digestOf(reader, range, kBegin + 1e6);
        EXPECT_TRUE(result.ok());
        return result.ok() ? result.value() : Digest();
    }
    void play(std::int64_t session, double from, double to) {
        for (const auto& [state, at] : {std::pair(1, from), std::pair(0, to)}) {
            store_.addMessage(session, 14, 3,
                              "{\"VQSessionVolumePlayingState\":" + std::to_string(state) + "}",
                              kBegin + at);
        }
    }
    void glitch(const std::string& application, double start, const std::string& cause = "memory",
                double seconds = 0.5) {
        store_.addMessage({}, 4, 7,
                          "{\"rtaid_client\":\"" + application + "\",\"issue_type\":\"" + cause +
                              "\",\"any_channel_silence_seconds\":" + std::to_string(seconds) +
                              ",\"glitch_start\":" + std::to_string(kBegin + start) + "}",
                          kBegin + start);
    }

    TestStore store_;
};

TEST_F(DigestTest, OnlyWhatWasPlayedWithinTheRangeCounts) {
    store_.addSession("player", kBegin, kBegin + 100, ",\"stream_direction\":\"playback\"");
    store_.addSession("recorder", kBegin, {}, ",\"stream_direction\":\"capture\"");
    play(1, 10, 60);
    play(2, 70, 95);
    const Digest found = digest({kBegin + 50, kBegin + 90});
    EXPECT_EQ(found.sessions, 2U);
    EXPECT_EQ(found.openSessions, 1U);
    EXPECT_DOUBLE_EQ(found.playedSeconds, 10);
    EXPECT_DOUBLE_EQ(found.capturedSeconds, 20);
}

TEST_F(DigestTest, TheWorstHasTheMostGlitches) {
    glitch("yesterday", -10);
    glitch("a", 1);
    glitch("b", 2);
    glitch("b", 3);
    const Digest found = digest({kBegin, kBegin + 10});
    EXPECT_EQ(found.glitches.glitches, 3U);
    EXPECT_EQ(found.glitches.seconds, 1.5);
    ASSERT_TRUE(found.worstApplication && found.leadingCause);
    EXPECT_EQ(found.worstApplication->name, "b");
    EXPECT_EQ(found.worstApplication->sum.glitches, 2U);
    EXPECT_EQ(found.leadingCause->name, "memory");
}

TEST_F(DigestTest, OfTwoWithAsManyTheLongerSilentIsWorse) {
    glitch("a", 1);
    glitch("b", 2, "memory", 0.75);
    const Digest found = digest({});
    ASSERT_TRUE(found.worstApplication);
    EXPECT_EQ(found.worstApplication->name, "b");
}

TEST_F(DigestTest, NoCauseLeadsWhereTwoAreAsFrequent) {
    glitch("a", 1, "memory");
    glitch("a", 2, "client_slow", 3);
    EXPECT_FALSE(digest({}).leadingCause);
    glitch("a", 3, "memory");
    const Digest found = digest({});
    ASSERT_TRUE(found.leadingCause);
    EXPECT_EQ(found.leadingCause->name, "memory");
}

TEST_F(DigestTest, OfNothingThereIsNoWorst) {
    const Digest found = digest({});
    EXPECT_EQ(found.sessions, 0U);
    EXPECT_FALSE(found.worstApplication || found.leadingCause);
}

} // namespace
} // namespace halyard::reading
