#include "commands/GlitchWords.h"

#include <cstdlib>
#include <ctime>
#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

using reading::Direction;
using reading::Glitch;

constexpr double kNow = 1700000000; // 22:13:20 UTC

class GlitchWordsTest : public ::testing::Test {
protected:
    GlitchWordsTest() {
        ::setenv("TZ", "UTC0", 1);
        ::tzset();
        glitch_.application = "firefox";
        glitch_.direction = Direction::Playback;
        glitch_.device = "out.speaker";
        glitch_.start = kNow - 29408 + 0.4;
        glitch_.seconds = 0.32;
        glitch_.cause = "process_stopped";
    }
    std::string sentence() { return sentenceOf(terminal_, glitch_, kNow); }

    Terminal terminal_; // none, in a test
    Glitch glitch_;
};

TEST_F(GlitchWordsTest, AGlitchIsASentence) {
    EXPECT_EQ(sentence(),
              "14:03:12.4  firefox, 320 ms silent on out.speaker: the process was stopped");
}

TEST_F(GlitchWordsTest, RecordingsMissWhatPlayersAreSilentOf) {
    glitch_.direction = Direction::Capture;
    glitch_.device = "in.mic";
    EXPECT_EQ(sentence(),
              "14:03:12.4  firefox, 320 ms missing from in.mic: the process was stopped");
}

TEST_F(GlitchWordsTest, WhatIsNotKnownIsLeftOut) {
    glitch_ = Glitch();
    glitch_.told = kNow;
    EXPECT_EQ(sentence(), "22:13:20.0  an application, silent");
}

TEST_F(GlitchWordsTest, AnotherDayIsTold) {
    *glitch_.start -= 86400;
    glitch_.inferred = true;
    EXPECT_EQ(sentence(), "2023-11-13 14:03:12.4  firefox, 320 ms silent on out.speaker: the "
                          "process was stopped (inferred)");
}

TEST_F(GlitchWordsTest, ForeignTextIsMadeHarmless) {
    glitch_.application = "a\x1b[31m\n";
    glitch_.device = "\u202e";
    glitch_.cause = "\a";
    EXPECT_EQ(sentence(), "14:03:12.4  a\\x1b[31m\\n, 320 ms silent on \\u{202e}: \\x07");
}

TEST_F(GlitchWordsTest, EveryCauseHasItsWords) {
    for (const char* const cause :
         {"process_stopped", "process_frozen", "process_gone", "machine_paused", "driver_late",
          "graph_overloaded", "processor_wait", "client_slow", "memory", "client_blocked",
          "unknown"}) {
        EXPECT_NE(causeInWords(cause), cause);
    }
    EXPECT_EQ(causeInWords("other"), "other");
}

} // namespace
} // namespace halyard::ctl
