#include "reading/Glitches.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "reading/GlitchTally.h"
#include "reading/TestStoreTesting.h"

namespace halyard::reading {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr double kBegin = 1.7e9;

class GlitchesTest : public ::testing::Test {
protected:
    // `fn` sees what goes away with the row.
    void each(const TimeRange& range, const std::function<void(const Glitch&)>& fn) {
        StoreReader reader = store_.open();
        EXPECT_TRUE(forEachGlitch(reader, range, [&](const Glitch& glitch) {
                        fn(glitch);
                        return true;
                    }).ok());
    }
    std::vector<double> lengths(const TimeRange& range = {}) {
        std::vector<double> seconds;
        each(range, [&](const Glitch& glitch) { seconds.push_back(glitch.seconds.value_or(-1)); });
        return seconds;
    }
    void tell(std::optional<std::int64_t> session, double start, double seconds, double at,
              const std::string& more = "") {
        store_.addMessage(session, 4, 7,
                          "{\"glitch_start\":" + std::to_string(kBegin + start) +
                              ",\"any_channel_silence_seconds\":" + std::to_string(seconds) + more +
                              "}",
                          kBegin + at);
    }

    TestStore store_;
};

TEST_F(GlitchesTest, AMessageOfTheKindIsAGlitchWithAllThatItTells) {
    store_.addSession("player", kBegin, {});
    tell(1, 10.5, 0.32, 12,
         ",\"issue_type\":\"memory\",\"rtaid_client\":\"firefox\",\"node\":\"n\",\"glitch_cycles\":"
         "15,"
         "\"glitch_device\":\"out.speaker\",\"glitch_inferred\":1,"
         "\"glitch_evidence\":{\"major_faults\":3}");
    each({}, [](const Glitch& glitch) {
        EXPECT_EQ(glitch.session, 1);
        EXPECT_EQ(glitch.application, "firefox");
        EXPECT_EQ(glitch.direction, Direction::Playback);
        EXPECT_EQ(glitch.node, "n");
        EXPECT_EQ(glitch.device, "out.speaker");
        EXPECT_EQ(glitch.start, kBegin + 10.5);
        EXPECT_EQ(glitch.seconds, 0.32);
        EXPECT_EQ(glitch.cycles, 15);
        EXPECT_EQ(glitch.cause, "memory");
        EXPECT_TRUE(glitch.inferred);
        ASSERT_NE(glitch.evidence, nullptr);
        EXPECT_EQ((*glitch.evidence)["major_faults"].GetInt(), 3);
    });
}

TEST_F(GlitchesTest, WhatIsNotToldIsUnknown) {
    store_.addSession("player", kBegin, {});
    store_.addMessage(1, 1, 7, "{\"glitch_evidence\":7}", kBegin + 10);
    store_.addMessage(1, 2, 7, "no JSON", kBegin + 11);
    std::vector<Direction> directions;
    each({}, [&](const Glitch& glitch) {
        EXPECT_EQ(glitch.application, "player");
        EXPECT_FALSE(glitch.start || glitch.seconds || glitch.cycles || glitch.cause);
        EXPECT_EQ(glitch.evidence, nullptr);
        EXPECT_FALSE(glitch.inferred);
        directions.push_back(glitch.direction);
    });
    EXPECT_THAT(directions, ElementsAre(Direction::Unknown, Direction::Capture));
}

TEST_F(GlitchesTest, OfSeveralMessagesWithOneStartTheLastCounts) {
    tell(1, 10, 0.1, 20);
    tell(1, 11, 0.2, 21);
    tell(1, 10, 12, 30);
    tell(1, 10, 15, 31);
    EXPECT_THAT(lengths(), ElementsAre(0.2, 15));
}

TEST_F(GlitchesTest, OneStartInTwoSessionsIsTwoGlitches) {
    tell(1, 10, 0.1, 20);
    tell(2, 10, 0.2, 20);
    tell({}, 10, 0.3, 20);
    tell({}, 10, 0.4, 20, ",\"node\":\"another\"");
    EXPECT_THAT(lengths(), ElementsAre(0.1, 0.2, 0.3, 0.4));
}

TEST_F(GlitchesTest, ARangeGoesByTheStartOfTheGlitch) {
    tell(1, 10, 1, 12);
    tell(1, 20, 2, 200);
    tell(1, 30, 3, 31);
    EXPECT_THAT(lengths({kBegin + 15, kBegin + 25}), ElementsAre(2));
    EXPECT_THAT(lengths({kBegin + 10, kBegin + 30}), ElementsAre(1, 2));
}

TEST_F(GlitchesTest, OtherMessagesAreNone) {
    store_.addMessage(1, 4, 1, "{\"glitch_start\":1}", kBegin);
    EXPECT_THAT(lengths(), IsEmpty());
}

TEST(GlitchTallyTest, SumsStandByFallingNumbers) {
    GlitchTally tally(GlitchKey::Cause);
    Glitch glitch;
    glitch.seconds = 0.5;
    glitch.cause = "memory";
    tally.add(glitch);
    glitch.seconds = 2;
    tally.add(glitch);
    glitch.cause.reset();
    tally.add(glitch);
    const auto entries = tally.entries();
    ASSERT_EQ(entries.size(), 2U);
    EXPECT_EQ(entries[0].name, "memory");
    EXPECT_EQ(entries[0].sum.glitches, 2U);
    EXPECT_EQ(entries[0].sum.seconds, 2.5);
    EXPECT_EQ(entries[0].sum.longest, 2);
    EXPECT_FALSE(entries[1].name);
}

TEST(GlitchTallyTest, HoursStandInTheirOrder) {
    GlitchTally tally(GlitchKey::Hour);
    Glitch glitch;
    for (const double start : {7300.0, 3700.0, 3600.0, 7200.0, 7201.0}) {
        glitch.start = start;
        tally.add(glitch);
    }
    const auto entries = tally.entries();
    ASSERT_EQ(entries.size(), 2U);
    EXPECT_EQ(entries[0].hour, 3600);
    EXPECT_EQ(entries[1].hour, 7200);
    EXPECT_EQ(entries[1].sum.glitches, 3U);
}

TEST(GlitchTallyTest, ManyNamesTakeTheMemoryOfSome) {
    GlitchTally tally(GlitchKey::Application);
    Glitch glitch;
    for (int i = 0; i < 6000; ++i) {
        glitch.application = std::to_string(i);
        tally.add(glitch);
    }
    glitch.application = "*";
    tally.add(glitch);
    const auto entries = tally.entries();
    ASSERT_EQ(entries.size(), 5001U);
    EXPECT_TRUE(entries[0].isOthers);
    EXPECT_EQ(entries[0].sum.glitches, 1001U);
}

TEST(GlitchTallyTest, NonsenseInLengthsDoesNotSpread) {
    GlitchSum sum;
    Glitch glitch;
    for (const double seconds : {-1.0, 0.0 / 0.0, 1.0 / 0.0, 0.5}) {
        glitch.seconds = seconds;
        sum.add(glitch);
    }
    EXPECT_EQ(sum.glitches, 4U);
    EXPECT_EQ(sum.seconds, 0.5);
}

} // namespace
} // namespace halyard::reading
