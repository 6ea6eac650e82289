// How often the watch tells of a stream, and for how long it looks at it.

#include <gtest/gtest.h>
#include <string>
#include <vector>

#include "GlitchScriptTesting.h"

namespace halyard::pipewire {
namespace {

// ---- How often it is told

TEST_F(GlitchWatchTest, SixAreToldInAMinuteAndTheRestIsCounted) {
    plays();
    for (int i = 0; i < 9; ++i) {
        glitch();
    }
    EXPECT_EQ(sink_.messages.size(), GlitchWatch::kMaxMessages);
    live(60'000);
    glitch();
    ASSERT_EQ(sink_.messages.size(), GlitchWatch::kMaxMessages + 1);
    EXPECT_EQ(unreported(5), 0);
    EXPECT_EQ(unreported(6), 3);
    glitch();
    EXPECT_EQ(unreported(7), 0);
}

TEST_F(GlitchWatchTest, WhatWasNeverToldIsCountedAtTheEnd) {
    plays();
    for (int i = 0; i < 8; ++i) {
        glitch();
    }
    EXPECT_EQ(watch_->closing(kKey).unreported, 2U);
}

TEST_F(GlitchWatchTest, ALongOneIsToldAfterTenSecondsAndAgainAtItsEnd) {
    plays();
    live(10'200, Progress::Triggered);
    ASSERT_EQ(sink_.messages.size(), 1U);
    live(5'000, Progress::Triggered);
    EXPECT_EQ(sink_.messages.size(), 1U);
    live(1000);
    ASSERT_EQ(sink_.messages.size(), 2U);
    EXPECT_EQ(cause(0), "client_blocked");
    EXPECT_EQ(cause(1), "client_blocked");
    EXPECT_EQ(sink_.messages[0].get<double>("glitch_start"),
              sink_.messages[1].get<double>("glitch_start"));
    EXPECT_NEAR(sink_.messages[1].get<double>("any_channel_silence_seconds"), 15.2, 0.03);
}

TEST_F(GlitchWatchTest, TheEndOfALongOneHasAPlaceAmongTheSix) {
    plays();
    for (int i = 0; i < 4; ++i) {
        glitch();
    }
    live(10'200, Progress::Triggered);
    EXPECT_EQ(sink_.messages.size(), 5U);
    live(1000);
    EXPECT_EQ(sink_.messages.size(), 6U);
}

// ---- Streams

TEST_F(GlitchWatchTest, WatchesWhileSomethingRunsOrIsToBeSettled) {
    EXPECT_FALSE(watch_->watching());
    plays();
    EXPECT_TRUE(watch_->watching());
    watch_->gone(kKey);
    EXPECT_TRUE(watch_->watching());
    live(2000);
    EXPECT_FALSE(watch_->watching());
}

TEST_F(GlitchWatchTest, AStreamWithoutARunHasNothingToSettle) {
    plays();
    watch_->stopped(kKey);
    live(3000);
    EXPECT_FALSE(watch_->gone(kKey));
    EXPECT_FALSE(watch_->gone(12345));
}

TEST_F(GlitchWatchTest, WhatIsOpenIsToldWhenAllIsSettled) {
    plays();
    live(300, Progress::Triggered);
    EXPECT_EQ(cause(), "nothing told");
    watch_->settleAll();
    EXPECT_EQ(cause(), "client_blocked");
}

TEST_F(GlitchWatchTest, EachStreamOfAProgramHasItsOwn) {
    plays();
    watch_->runs(run(8, kOther));
    live(1000);
    glitch();
    EXPECT_EQ(sink_.ids, std::vector<std::int64_t>{kKey});
}

TEST_F(GlitchWatchTest, AStreamThatMovedGlitchesOnItsNewDevice) {
    plays();
    watch_->routed(kKey, "out.headphones");
    glitch();
    EXPECT_EQ(sink_.messages.at(0).get<std::string>("glitch_device"), "out.headphones");
}

TEST_F(GlitchWatchTest, ProgramsBeyondTheBoundAreNotLookedAtAndCounted) {
    for (std::size_t i = 0; i < GlitchWatch::kMaxPrograms; ++i) {
        const auto key = static_cast<StreamKey>(100 + i);
        watch_->runs(run(key, static_cast<ObjectId>(1000 + i), kProgram + static_cast<int>(i) + 1));
    }
    EXPECT_EQ(watch_->unwatched(), 0U);
    plays();
    EXPECT_EQ(watch_->unwatched(), 1U);
    glitch();
    EXPECT_EQ(cause(), "unknown");
    watch_->closing(100);
    watch_->closing(kKey);
    watch_->runs(run());
    EXPECT_EQ(watch_->unwatched(), 1U);
}

} // namespace
} // namespace halyard::pipewire
