// Each cause of a glitch, provoked for real: what is told must follow from what was
// done. Skipped where PipeWire is not installed, or the machine does not let us.

#include <cmath>
#include <csignal>
#include <fmt/core.h>
#include <functional>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <vector>

#include "GlitchWatchTesting.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {
namespace {

using namespace std::chrono_literals;
using testing::Episode;
using testing::FreezableGroup;
using testing::GlitchPlayer;
using testing::ProcessorHog;

constexpr double kCycle = 1024.0 / 48000;
// What it does is done again when the machine itself came in between.
constexpr int kAttempts = 5;

double realSeconds(std::int64_t nanoseconds) {
    return static_cast<double>(nanoseconds) / 1e9;
}

class RealGlitchesTest : public ::testing::Test {
protected:
    void SetUp() override {
        if (!testing::PrivatePipeWire::installed()) {
            GTEST_SKIP() << "pipewire, wireplumber, pw-play and wpctl are not installed";
        }
        server_.start();
        graph_ = std::make_unique<WatchedGraph>();
    }

    std::unique_ptr<GlitchPlayer> player(const std::string& name,
                                         std::vector<std::string> options = {}) {
        if (options.empty()) {
            options = {"--target=out.speaker"};
        }
        options.push_back("--name=" + name);
        auto player = std::make_unique<GlitchPlayer>(options);
        EXPECT_TRUE(graph_->untilWatched(name)) << graph_->notes();
        graph_->pass(200ms); // of ordinary life
        return player;
    }

    static Episode moment() {
        const Nanoseconds now = monotonicNow();
        const Nanoseconds real = now + realTimeOffset();
        return {now, now, real, real};
    }
    // What happens between two moments, while the loop runs.
    Episode during(std::chrono::milliseconds time, const std::function<void()>& begin,
                   const std::function<void()>& end) {
        Episode result = moment();
        begin();
        const Nanoseconds begun = monotonicNow();
        graph_->pass(time);
        certain_ = monotonicNow() - begun;
        end();
        const Episode after = moment();
        result.monotonicAfter = after.monotonicAfter;
        result.realtimeAfter = after.realtimeAfter;
        return result;
    }

    // The message of `name` of a stretch that overlaps the disturbance. Null when there
    // is none.
    const ToldGlitch* about(const std::string& name, const Episode& disturbance) const {
        for (const ToldGlitch& glitch : graph_->glitches()) {
            if (glitch.application == name &&
                glitch.start() < realSeconds(disturbance.realtimeAfter) + kCycle &&
                glitch.end() > realSeconds(disturbance.realtimeBefore) - kCycle) {
                return &glitch;
            }
        }
        return nullptr;
    }

    // Disturbs until the machine lets it be told for what it is, which is not to be
    // told as anything else.
    void provoke(const std::string& cause, const std::string& name,
                 const std::function<Episode()>& disturb) {
        for (int attempt = 1; attempt <= kAttempts; ++attempt) {
            certain_.reset();
            disturbance_ = disturb();
            ASSERT_TRUE(graph_->until([&] { return about(name, disturbance_) != nullptr; }))
                << "nothing was told\n"
                << graph_->notes();
            told_ = *about(name, disturbance_);
            if (told_.cause() == cause) {
                return;
            }
            ASSERT_TRUE(told_.cause() == "driver_late" || told_.cause() == "unknown")
                << told_.cause() << '\n'
                << graph_->notes();
            graph_->pass(500ms);
        }
        FAIL() << "never told as " << cause << '\n' << graph_->notes();
    }

    // That the message says what follows from the disturbance.
    void expectFigures(double cycle = kCycle) const {
        const auto most = disturbance_.monotonicAfter - disturbance_.monotonicBefore;
        const auto least = certain_.value_or(most);
        const auto cycles = static_cast<double>(told_.cycles());
        EXPECT_GE(told_.start(), realSeconds(disturbance_.realtimeBefore) - 1.2 * cycle);
        EXPECT_LE(told_.start(),
                  realSeconds(disturbance_.realtimeBefore + most - least) + 1.2 * cycle);
        EXPECT_GE(cycles, std::floor(realSeconds(least) / cycle) - 1) << graph_->notes();
        // Who is let go on does so when the machine comes to it.
        EXPECT_LE(cycles, std::floor(realSeconds(most) / cycle) + 3) << graph_->notes();
        EXPECT_NEAR(told_.silence(), cycles * cycle, 1e-6);
        EXPECT_NEAR(told_.contents.get<double>("glitch_quantum_seconds"), cycle, 1e-8);
        EXPECT_EQ(told_.contents.get<std::int64_t>("glitch_inferred"), 0);
    }
    void expectNames(const std::string& name, const std::string& device,
                     std::uint32_t category = HALYARD_CATEGORY_PLAYBACK) const {
        EXPECT_EQ(told_.contents.get<std::string>("rtaid_client"), name);
        EXPECT_EQ(told_.contents.get<std::string>("node"), name);
        EXPECT_EQ(told_.contents.get<std::string>("glitch_device"), device);
        EXPECT_EQ(told_.category, category);
    }
    const Contents& evidence() const {
        static const Contents kNone;
        for (const auto& entry : told_.contents) {
            if (entry.key == "glitch_evidence") {
                return std::get<Nested>(entry.value).inner.front();
            }
        }
        return kNone;
    }

    testing::PrivatePipeWire server_;
    std::unique_ptr<WatchedGraph> graph_;
    ToldGlitch told_;
    Episode disturbance_;
    // How long it lasted at least, where its times also hold its begin and end.
    std::optional<Nanoseconds> certain_;
};

TEST_F(RealGlitchesTest, AProgramThatComputesTooLongIsSlow) {
    auto victim = player("victim");
    provoke("client_slow", "victim", [&] { return graph_->command(*victim, "burn 100"); });
    expectFigures();
    expectNames("victim", "out.speaker");
    EXPECT_GT(evidence().get<double>("cpu_seconds"), 0.05);
    EXPECT_NEAR(evidence().get<double>("busy_cycles"), 0.1 / kCycle, 0.5);
}

TEST_F(RealGlitchesTest, AProgramThatWaitsForTimeIsBlocked) {
    auto victim = player("victim");
    provoke("client_blocked", "victim", [&] { return graph_->command(*victim, "sleep 100"); });
    expectFigures();
    expectNames("victim", "out.speaker");
    EXPECT_LT(evidence().get<double>("cpu_seconds"), 0.05);
}

TEST_F(RealGlitchesTest, AProgramWhosePagesComeLateWaitsForMemory) {
    if (!GlitchPlayer::canFault()) {
        GTEST_SKIP() << "takes the right to mount a file system";
    }
    auto victim = player("victim");
    provoke("memory", "victim", [&] { return graph_->command(*victim, "fault 100"); });
    expectFigures();
    EXPECT_GE(evidence().get<std::int64_t>("major_faults"), 1);
}

TEST_F(RealGlitchesTest, AProgramThatIsStoppedIsToldAsStopped) {
    auto victim = player("victim");
    provoke("process_stopped", "victim", [&] {
        return during(
            300ms, [&] { victim->process().signal(SIGSTOP); },
            [&] { victim->process().signal(SIGCONT); });
    });
    expectFigures();
    expectNames("victim", "out.speaker");
    EXPECT_EQ(evidence().get<std::string>("process_state"), "T");
}

class FrozenTest : public RealGlitchesTest,
                   public ::testing::WithParamInterface<FreezableGroup::Version> {};

TEST_P(FrozenTest, AProgramOfAFrozenGroupIsToldAsFrozen) {
    const auto group = FreezableGroup::make(GetParam());
    if (group == nullptr) {
        GTEST_SKIP() << "no such control groups here, or not ours to change";
    }
    auto victim = player("victim");
    group->add(victim->pid());
    provoke("process_frozen", "victim", [&] {
        return during(
            300ms, [&] { group->freeze(); }, [&] { group->thaw(); });
    });
    expectFigures();
}

INSTANTIATE_TEST_SUITE_P(Versions, FrozenTest,
                         ::testing::Values(FreezableGroup::Version::One,
                                           FreezableGroup::Version::Two),
                         [](const auto& version) {
                             return version.param == FreezableGroup::Version::One ? "One" : "Two";
                         });

TEST_F(RealGlitchesTest, AProgramThatDiesInTheMiddleOfItsSoundIsGone) {
    auto victim = player("victim");
    disturbance_ = moment();
    victim->process().signal(SIGKILL);
    victim->process().wait();
    ASSERT_TRUE(graph_->until([&] { return graph_->closed("victim"); }));
    const ToldGlitch* const told = about("victim", disturbance_);
    ASSERT_NE(told, nullptr) << graph_->notes();
    told_ = *told;
    EXPECT_EQ(told_.cause(), "process_gone");
    EXPECT_GE(told_.cycles(), 1);
    expectNames("victim", "out.speaker");
    ASSERT_NE(graph_->lastStop("victim"), nullptr);
    EXPECT_EQ(graph_->lastStop("victim")->contents.get<std::string>("stream_program"), "died");
}

TEST_F(RealGlitchesTest, AnAudioServerThatIsStoppedMakesTheDriverLate) {
    auto victim = player("victim");
    auto other = player("other");
    provoke("driver_late", "victim", [&] {
        return during(
            400ms, [&] { server_.daemon().signal(SIGSTOP); },
            [&] { server_.daemon().signal(SIGCONT); });
    });
    expectFigures();
    EXPECT_GT(evidence().get<double>("driver_late_seconds"), 0.3);
    ASSERT_TRUE(graph_->until([&] { return about("other", disturbance_) != nullptr; }));
    EXPECT_EQ(about("other", disturbance_)->cause(), "driver_late");
}

TEST_F(RealGlitchesTest, NodesThatOnlyTogetherTakeTooLongOverloadTheGraph) {
    std::vector<std::unique_ptr<GlitchPlayer>> players;
    for (const char* name : {"one", "two", "three"}) {
        players.push_back(player(name));
        ASSERT_TRUE(testing::pin(players.back()->dataThread(), 1));
    }
    const auto overload = [&] {
        Episode first;
        for (const auto& each : players) {
            each->send("burn 10 6");
        }
        for (const auto& each : players) {
            std::optional<Episode> answer;
            graph_->until([&] { return (answer = each->answered()).has_value(); });
            first = first.monotonicBefore == 0 ? *answer : first;
        }
        return first;
    };
    // Who of them misses its cycles depends on who runs first.
    for (int attempt = 1; attempt <= kAttempts; ++attempt) {
        const Episode when = overload();
        ASSERT_TRUE(graph_->untilSeen(when.monotonicAfter));
        int overloads = 0;
        for (const char* name : {"one", "two", "three"}) {
            if (const ToldGlitch* const told = about(name, when)) {
                overloads += told->cause() == "graph_overloaded" ? 1 : 0;
                // Beside other programs they wait for the processor as well.
                EXPECT_THAT(told->cause(), ::testing::AnyOf("graph_overloaded", "unknown",
                                                            "driver_late", "processor_wait"))
                    << graph_->notes();
            }
        }
        if (overloads > 0) {
            return;
        }
    }
    FAIL() << graph_->notes();
}

TEST_F(RealGlitchesTest, AProgramThatGetsNoProcessorWaitsForOne) {
    if (!ProcessorHog::allowed()) {
        GTEST_SKIP() << "no real-time class for this user, or one processor";
    }
    auto victim = player("victim");
    ASSERT_TRUE(testing::pin(victim->dataThread(), 1));
    provoke("processor_wait", "victim", [&] {
        ProcessorHog hog(1, 150ms);
        graph_->pass(150ms);
        return hog.wait();
    });
    expectNames("victim", "out.speaker");
    EXPECT_GT(evidence().get<double>("run_delay_seconds"), 0.08);
}

// ---- Others than players of one device

TEST_F(RealGlitchesTest, ARecordersGlitchesAreToldOfTheMicrophone) {
    auto recorder = player("recorder", {"--capture", "--target=in.microphone"});
    provoke("client_slow", "recorder", [&] { return graph_->command(*recorder, "burn 100"); });
    expectFigures();
    expectNames("recorder", "in.microphone", HALYARD_CATEGORY_RECORD);
    provoke("client_blocked", "recorder", [&] { return graph_->command(*recorder, "sleep 100"); });
    expectFigures();
    provoke("process_stopped", "recorder", [&] {
        return during(
            300ms, [&] { recorder->process().signal(SIGSTOP); },
            [&] { recorder->process().signal(SIGCONT); });
    });
    expectFigures();
}

TEST_F(RealGlitchesTest, AJackProgramsGlitchesAreTold) {
    GlitchPlayer synth({"--filter", "--name=synth"});
    server_.run({"pw-link", "synth:out_1", "out.speaker:playback_FL"});
    ASSERT_TRUE(graph_->untilWatched("synth")) << graph_->notes();
    graph_->pass(500ms);
    provoke("client_slow", "synth", [&] { return graph_->command(synth, "burn 100"); });
    expectFigures();
    expectNames("synth", "out.speaker");
}

TEST_F(RealGlitchesTest, OnlyWhoMissedIsTold) {
    auto victim = player("victim");
    auto other = player("other");
    provoke("client_blocked", "victim", [&] { return graph_->command(*victim, "sleep 100"); });
    ASSERT_TRUE(graph_->untilSeen(disturbance_.monotonicAfter));
    const ToldGlitch* const others = about("other", disturbance_);
    EXPECT_TRUE(others == nullptr || others->cause() == "driver_late") << graph_->notes();
}

TEST_F(RealGlitchesTest, ShortCyclesAreCountedAsWell) {
    // Shorter ones are missed by a busy machine without our help.
    server_.forceQuantum(256);
    auto victim = player("victim");
    provoke("client_blocked", "victim", [&] { return graph_->command(*victim, "sleep 100"); });
    const double length = realSeconds(disturbance_.monotonicAfter - disturbance_.monotonicBefore);
    EXPECT_GE(told_.silence(), length - 0.011); // two cycles
    EXPECT_NEAR(told_.contents.get<double>("glitch_quantum_seconds"), 256.0 / 48000, 1e-8);
}

TEST_F(RealGlitchesTest, LongCyclesAreCountedAsWell) {
    server_.forceQuantum(8192);
    auto victim = player("victim", {"--target=out.speaker", "--latency=8192/48000"});
    provoke("client_blocked", "victim", [&] { return graph_->command(*victim, "sleep 400"); });
    expectFigures(told_.contents.get<double>("glitch_quantum_seconds"));
}

TEST_F(RealGlitchesTest, AGlitchSoonAfterTheStartHasItsCause) {
    GlitchPlayer victim({"--target=out.speaker", "--name=victim"});
    ASSERT_TRUE(graph_->until([&] { return graph_->playing("victim"); }));
    graph_->pass(100ms); // a good cycle or two
    disturbance_ = graph_->command(victim, "sleep 100");
    ASSERT_TRUE(graph_->until([&] { return about("victim", disturbance_) != nullptr; }));
    told_ = *about("victim", disturbance_);
    EXPECT_TRUE(told_.cause() == "client_blocked" || told_.cause() == "driver_late")
        << told_.cause() << graph_->notes();
}

} // namespace
} // namespace halyard::pipewire
