// The watch with a clock, cycles and processes of a script.

#include "GlitchWatch.h"

#include <csignal>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "CycleTesting.h"
#include "ProcessTesting.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {
namespace {

constexpr Nanoseconds kStart = 1'000'000'000'000;
constexpr Nanoseconds kSecond = 1'000'000'000;
constexpr StreamKey kKey = 7;
constexpr ObjectId kNode = 47;
constexpr ObjectId kOther = 48;

class MessageSink final : public SessionSink {
public:
    void open(std::int64_t, std::uint16_t, const Contents&) override {}
    void send(std::int64_t id, const Message& message) override {
        ids.push_back(id);
        messages.push_back(message.contents);
    }
    void close(std::int64_t) override {}

    std::vector<std::int64_t> ids;
    std::vector<Contents> messages;
};

class GlitchWatchTest : public ::testing::Test {
protected:
    GlitchWatchTest() {
        processes_.process(kProgram);
        processes_.thread(kProgram, thread_);
        watch_ = std::make_unique<GlitchWatch>(
            sink_, GlitchWatch::Options{.clock = [this] { return now_; },
                                        .asleep = [this] { return asleep_; },
                                        .realTime = [this] { return realTime_ += 1'000'000; },
                                        .places = processes_.places(),
                                        .note = nullptr,
                                        .busiest = nullptr});
        watch_->settled = [this](StreamKey key) { settled_.push_back(key); };
    }

    static StreamRun run(StreamKey key = kKey, ObjectId node = kNode, pid_t process = kProgram) {
        StreamRun run{.key = key, .node = node};
        run.application = "Player";
        run.nodeName = "player.node";
        run.device = "out.speaker";
        run.process = process;
        return run;
    }
    void plays() {
        watch_->runs(run());
        live(1000);
    }

    // So long, with records of cycles that come at once and a look every 50 ms.
    void live(int milliseconds, Progress progress = Progress::Finished) {
        const Nanoseconds end = now_ + milliseconds * kMillisecond;
        while (graph_.now() + kLength <= end) {
            const Nanoseconds next = graph_.now() + kLength;
            const Cycle cycle = graph_.cycle({{kNode, progress}, {kOther}});
            pass(next);
            watch_->take(cycle);
        }
        pass(end);
    }
    void pass(Nanoseconds until) {
        while (nextTick_ <= until) {
            now_ = nextTick_;
            nextTick_ += 50 * kMillisecond;
            watch_->tick();
        }
        now_ = until;
    }
    // Five cycles are missed while the thread does what `change` makes of it; all is
    // told when this returns.
    template <class Change> void glitch(Change change) {
        live(100, Progress::Triggered);
        change(thread_);
        processes_.thread(kProgram, thread_);
        live(1000);
    }
    void glitch() {
        glitch([](FakeThread&) {});
    }

    std::string cause(std::size_t index = 0) const {
        return index < sink_.messages.size() ? sink_.messages[index].get<std::string>("issue_type")
                                             : "nothing told";
    }
    Contents evidence(std::size_t index = 0) const {
        return sink_.messages.at(index).get<Nested>("glitch_evidence").inner.at(0);
    }
    std::int64_t unreported(std::size_t index) const {
        return sink_.messages.at(index).get<std::int64_t>("glitches_unreported");
    }

    FakeProcesses processes_;
    FakeThread thread_{.id = 2, .name = "data-loop.0"};
    TestGraph graph_{kStart};
    Nanoseconds now_ = kStart - 1;
    Nanoseconds nextTick_ = kStart;
    Nanoseconds asleep_ = 0;
    Nanoseconds realTime_ = kSecond; // is being put right
    MessageSink sink_;
    std::unique_ptr<GlitchWatch> watch_;
    std::vector<StreamKey> settled_;
};

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
