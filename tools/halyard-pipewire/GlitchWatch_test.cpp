// What causes the watch finds, with a clock, cycles and processes of a script.

#include "GlitchWatch.h"

#include <csignal>
#include <gtest/gtest.h>
#include <string>
#include <vector>

#include "GlitchScriptTesting.h"

namespace halyard::pipewire {
namespace {

// ---- Causes

TEST_F(GlitchWatchTest, AThreadThatRanMeanwhileWasSlow) {
    plays();
    glitch([](FakeThread& thread) { thread.cpu += 100 * kMillisecond; });
    EXPECT_EQ(cause(), "client_slow");
    EXPECT_EQ(evidence().get<double>("cpu_seconds"), 0.1);
}

TEST_F(GlitchWatchTest, AThreadThatWaitedMeanwhileGotNoProcessor) {
    plays();
    glitch([](FakeThread& thread) { thread.delay += 100 * kMillisecond; });
    EXPECT_EQ(cause(), "processor_wait");
    EXPECT_EQ(evidence().get<double>("run_delay_seconds"), 0.1);
}

TEST_F(GlitchWatchTest, AThreadThatFaultedMeanwhileWaitedForMemory) {
    plays();
    glitch([](FakeThread& thread) { thread.majorFaults += 3; });
    EXPECT_EQ(cause(), "memory");
    EXPECT_EQ(evidence().get<std::int64_t>("major_faults"), 3);
}

TEST_F(GlitchWatchTest, AThreadThatDidNothingWasBlocked) {
    plays();
    glitch();
    EXPECT_EQ(cause(), "client_blocked");
    EXPECT_EQ(evidence(), (Contents{{"process_state", "S"}}));
}

TEST_F(GlitchWatchTest, AMachineThatSleptWasPaused) {
    plays();
    glitch([this](FakeThread&) { asleep_ += 3 * kSecond; });
    EXPECT_EQ(cause(), "machine_paused");
    EXPECT_EQ(evidence().get<double>("asleep_seconds"), 3);
}

TEST_F(GlitchWatchTest, ASleepWhileNothingPlayedPausedNobody) {
    plays();
    watch_->stopped(kKey);
    asleep_ += 3600 * kSecond;
    const Nanoseconds again = now_ + 3600 * kSecond;
    nextTick_ = again + 60 * kMillisecond;
    graph_.skip(again - graph_.now());
    now_ = again;
    watch_->runs(run());
    live(20);
    live(20, Progress::Triggered); // before the first look
    live(1000);
    EXPECT_EQ(cause(), "client_blocked");
}

// The driver comes late by half a second, and nobody looked meanwhile.
TEST_F(GlitchWatchTest, TimeThatStoodStillForAllIsAPausedMachine) {
    plays();
    const Nanoseconds begin = graph_.now();
    now_ = begin + 500 * kMillisecond;
    nextTick_ = now_;
    for (int i = 0; i < 25; ++i) {
        watch_->take(graph_.cycle({{kNode, Progress::Triggered}, {kOther}},
                                  500 * kMillisecond - i * (kLength - 100'000)));
    }
    live(1000);
    EXPECT_EQ(cause(), "machine_paused");
}

TEST_F(GlitchWatchTest, ADriverThatIsLateWhileWeLookOnIsLate) {
    plays();
    const Nanoseconds begin = graph_.now();
    pass(begin + 500 * kMillisecond);
    for (int i = 0; i < 25; ++i) {
        watch_->take(graph_.cycle({{kNode, Progress::Triggered}, {kOther}},
                                  500 * kMillisecond - i * (kLength - 100'000)));
    }
    live(1000);
    EXPECT_EQ(cause(), "driver_late");
    EXPECT_EQ(evidence().get<double>("driver_late_seconds"), 0.5);
}

TEST_F(GlitchWatchTest, AProcessThatWasSeenStoppedIsToldAsStopped) {
    plays();
    live(60, Progress::Triggered);
    thread_.state = 'T';
    processes_.thread(kProgram, thread_);
    live(60, Progress::Triggered);
    thread_.state = 'S';
    processes_.thread(kProgram, thread_);
    live(1000);
    EXPECT_EQ(cause(), "process_stopped");
    EXPECT_EQ(evidence().get<std::string>("process_state"), "T");
}

TEST_F(GlitchWatchTest, AFrozenGroupIsToldAsFrozen) {
    processes_.frozen(false);
    plays();
    live(20, Progress::Triggered);
    processes_.frozen(true);
    live(80, Progress::Triggered);
    processes_.frozen(false);
    live(1000);
    EXPECT_EQ(cause(), "process_frozen");
}

TEST_F(GlitchWatchTest, AProgramThatDiedIsGone) {
    plays();
    processes_.process(kProgram, 'Z', SIGKILL);
    EXPECT_TRUE(watch_->gone(kKey));
    EXPECT_TRUE(settled_.empty());
    live(1000);
    EXPECT_EQ(cause(), "process_gone");
    EXPECT_EQ(sink_.messages[0].get<std::int64_t>("glitch_cycles"), 1);
    EXPECT_EQ(sink_.messages[0].get<std::int64_t>("glitch_inferred"), 1);
    EXPECT_EQ(settled_, std::vector<StreamKey>{kKey});
    EXPECT_STREQ(watch_->closing(kKey).program, "died");
}

TEST_F(GlitchWatchTest, AGlitchOfATimeBeforeAProgramDiedHasItsOwnCause) {
    plays();
    live(100, Progress::Triggered);
    thread_.cpu += 100 * kMillisecond;
    processes_.thread(kProgram, thread_);
    live(180);
    processes_.process(kProgram, 'Z', SIGKILL);
    live(100); // 280 ms after its end
    watch_->gone(kKey);
    live(2000);
    EXPECT_EQ(cause(), "client_slow");
}

TEST_F(GlitchWatchTest, AProgramThatEndsAsItShouldHasNoGlitch) {
    plays();
    processes_.process(kProgram, 'Z', 0);
    EXPECT_TRUE(watch_->gone(kKey));
    live(2000);
    EXPECT_EQ(cause(), "nothing told");
    EXPECT_STREQ(watch_->closing(kKey).program, "ended");
}

TEST_F(GlitchWatchTest, WhatAThreadDidWhileItWasPausedIsNotCounted) {
    plays();
    watch_->stopped(kKey);
    thread_.cpu += 10 * kSecond; // of a second stream, perhaps
    processes_.thread(kProgram, thread_);
    graph_.skip(60 * kSecond);
    now_ = graph_.now();
    nextTick_ = now_ + 45 * kMillisecond;
    watch_->runs(run());
    live(20);
    glitch();
    EXPECT_EQ(cause(), "client_blocked");
}

TEST_F(GlitchWatchTest, WhatAThreadDidJustBeforeItStoppedIsCounted) {
    plays();
    live(220, Progress::Triggered);
    thread_.cpu += 220 * kMillisecond;
    processes_.thread(kProgram, thread_);
    watch_->stopped(kKey); // between two looks
    live(2000);
    EXPECT_EQ(cause(), "client_slow");
}

TEST_F(GlitchWatchTest, WhatWasNotMeasuredIsNotSaid) {
    auto unknown = run();
    unknown.process.reset();
    watch_->runs(unknown);
    live(1000);
    glitch();
    EXPECT_EQ(cause(), "unknown");
    EXPECT_TRUE(sink_.messages[0].get<Nested>("glitch_evidence").inner.empty());
}

// ---- Programs behind a server

class ServedGlitchWatchTest : public GlitchWatchTest {
protected:
    void playsThroughServer() {
        StreamRun served = run();
        served.viaServer = true;
        served.bufferSeconds = 0.2;
        watch_->runs(served);
        live(1000);
    }
    void state(char letter) {
        thread_.state = letter;
        processes_.thread(kProgram, thread_);
        processes_.process(kProgram, letter);
    }
};

TEST_F(ServedGlitchWatchTest, AStopIsInferredOnceTheBufferIsEmpty) {
    playsThroughServer();
    state('T');
    live(500);
    state('S');
    live(2000);
    ASSERT_EQ(cause(), "process_stopped");
    EXPECT_EQ(sink_.messages[0].get<std::int64_t>("glitch_inferred"), 1);
    // Less what lies between two looks at both ends.
    EXPECT_NEAR(sink_.messages[0].get<double>("any_channel_silence_seconds"), 0.25, 0.051);
    EXPECT_EQ(sink_.messages.size(), 1U);
}

TEST_F(ServedGlitchWatchTest, AStopThatTheBufferOutlastsIsNoGlitch) {
    playsThroughServer();
    state('T');
    live(200);
    state('S');
    live(3000);
    EXPECT_EQ(cause(), "nothing told");
}

TEST_F(ServedGlitchWatchTest, WhatTheServerMissedIsNotTheProgramsFault) {
    playsThroughServer();
    state('T');
    live(100, Progress::Triggered);
    thread_.cpu += 100 * kMillisecond;
    state('S');
    live(2000);
    EXPECT_EQ(cause(), "unknown");
    EXPECT_EQ(evidence().get<double>("cpu_seconds"), 0);
}

} // namespace
} // namespace halyard::pipewire
