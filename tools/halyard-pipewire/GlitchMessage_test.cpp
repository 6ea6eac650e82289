#include "GlitchMessage.h"

#include <gtest/gtest.h>

#include "halyard/halyard.h"

namespace halyard::pipewire {
namespace {

constexpr Nanoseconds kSecond = 1'000'000'000;

Episode threeCycles() {
    return {.stream = 1,
            .start = 5 * kSecond,
            .end = 5 * kSecond + 60'000'000,
            .missing = 60'000'000,
            .cycleLength = 20'000'000,
            .cycles = 3};
}

TEST(GlitchMessageTest, SaysWhoWhenHowLongOnWhatAndWhy) {
    const GlitchMessage glitch{.cause = GlitchCause::ClientSlow,
                               .application = "Player",
                               .node = "player.node",
                               .device = "out.speaker",
                               .evidence = {{"cpu_seconds", 0.05}}};
    const Message message = messageOf(threeCycles(), glitch, Direction::Playback, 100 * kSecond);
    EXPECT_EQ(message.category, std::uint32_t{HALYARD_CATEGORY_PLAYBACK});
    EXPECT_EQ(message.type, HALYARD_TYPE_ISSUE_DETECTOR);
    const Contents expected{{"issue_type", "client_slow"},
                            {"rtaid_client", "Player"},
                            {"node", "player.node"},
                            {"any_channel_silence_seconds", 0.06},
                            {"glitch_start", 105.0},
                            {"glitch_cycles", std::int64_t{3}},
                            {"glitch_device", "out.speaker"},
                            {"glitch_quantum_seconds", 0.02},
                            {"glitch_evidence", Nested{{Contents{{"cpu_seconds", 0.05}}}}}};
    EXPECT_EQ(message.contents, expected);
}

TEST(GlitchMessageTest, ARecordersGlitchIsOfItsCategory) {
    const Message message = messageOf(threeCycles(), {}, Direction::Capture, 0);
    EXPECT_EQ(message.category, std::uint32_t{HALYARD_CATEGORY_RECORD});
}

TEST(GlitchMessageTest, SaysWhatWasInferredAndWhatWasLeftOut) {
    Episode episode = threeCycles();
    episode.inferred = true;
    const Message message = messageOf(episode, {.unreported = 4}, Direction::Playback, 0);
    EXPECT_EQ(message.contents.get<std::int64_t>("glitch_inferred"), 1);
    EXPECT_EQ(message.contents.get<std::int64_t>("glitches_unreported"), 4);
}

TEST(GlitchMessageTest, EvidenceHoldsWhatGrewAndNothingElse) {
    const GlitchEvidence evidence{
        .state = 'T',
        .threadBefore = ThreadSample{.cpu = 1, .delay = 5, .majorFaults = 2, .ioDelay = 0},
        .threadAfter =
            ThreadSample{.cpu = 1 + kSecond, .delay = 5, .majorFaults = 3, .ioDelay = kSecond},
        .machineBefore = MachineSample{.cpuPressure = 0, .ioPressure = 4},
        .machineAfter = MachineSample{.cpuPressure = kSecond / 2,
                                      .memoryPressure = kSecond,
                                      .ioPressure = 4 + kSecond},
        .busyCycles = 2.5};
    const Contents expected{
        {"process_state", "T"},    {"cpu_seconds", 1.0},          {"major_faults", std::int64_t{1}},
        {"io_delay_seconds", 1.0}, {"pressure_cpu_seconds", 0.5}, {"pressure_io_seconds", 1.0},
        {"busy_cycles", 2.5}};
    EXPECT_EQ(contentsOf(evidence), expected);
}

TEST(GlitchMessageTest, NothingMeasuredIsNoEvidence) {
    EXPECT_TRUE(contentsOf({}).empty());
    const Message message = messageOf(threeCycles(), {}, Direction::Playback, 0);
    EXPECT_TRUE(message.contents.get<Nested>("glitch_evidence").inner.empty());
}

} // namespace
} // namespace halyard::pipewire
