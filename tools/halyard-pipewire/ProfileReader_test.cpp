// Records of real servers of two releases, taken while something known happened; the
// README beside them tells what.

#include "ProfileReader.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <fstream>
#include <gtest/gtest.h>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include "GlitchFinder.h"
#include "PipeWireHeaders.h"

namespace halyard::pipewire {
namespace {

// Portions as they came, 8-byte aligned.
std::vector<std::vector<std::uint64_t>> portionsOf(const std::string& file) {
    std::ifstream input(std::string(HALYARD_PIPEWIRE_RECORDS) + '/' + file, std::ios::binary);
    const std::string bytes(std::istreambuf_iterator<char>(input), {});
    std::vector<std::vector<std::uint64_t>> portions;
    for (std::size_t at = 0; at + 8 <= bytes.size();) {
        std::uint32_t body = 0;
        std::memcpy(&body, bytes.data() + at, sizeof body);
        const std::size_t size = std::min<std::size_t>(body + 8, bytes.size() - at);
        std::vector<std::uint64_t> portion((size + 7) / 8);
        std::memcpy(portion.data(), bytes.data() + at, size);
        portions.push_back(std::move(portion));
        at += size;
    }
    return portions;
}

struct Records {
    std::vector<Cycle> cycles;
    std::size_t portions = 0;
    std::size_t skipped = 0;
};

Records recordsOf(const std::string& file) {
    Records records;
    for (const auto& portion : portionsOf(file)) {
        ++records.portions;
        records.skipped +=
            readProfile(reinterpret_cast<const spa_pod*>(portion.data()),
                        portion.size() * sizeof(std::uint64_t),
                        [&](const Cycle& cycle) { records.cycles.push_back(cycle); });
    }
    return records;
}

// What is told of the streams of these nodes, in the nodes' order; they run all the
// time, and had good cycles before.
std::vector<Episode> episodesOf(const std::string& file, const std::vector<ObjectId>& nodes) {
    const Records records = recordsOf(file);
    std::vector<Episode> episodes;
    GlitchFinder finder;
    finder.tell = [&](const Episode& episode, bool) { episodes.push_back(episode); };
    StreamKey key = 0;
    for (const ObjectId node : nodes) {
        finder.begin(++key, node, 1);
    }
    for (const Cycle& cycle : records.cycles) {
        finder.take(cycle);
    }
    finder.flush();
    std::sort(episodes.begin(), episodes.end(),
              [](const Episode& a, const Episode& b) { return a.stream < b.stream; });
    return episodes;
}

constexpr Nanoseconds kLength = 21'333'333;

TEST(ProfileReaderTest, EveryRecordOfBothReleasesIsRead) {
    const auto expect = [](const char* file, std::size_t portions, std::size_t cycles) {
        const Records records = recordsOf(file);
        EXPECT_EQ(records.portions, portions) << file;
        EXPECT_EQ(records.cycles.size(), cycles) << file;
        EXPECT_EQ(records.skipped, 0U) << file;
    };
    expect("0.3.65-start.pod", 1, 1);
    expect("0.3.65-burn.pod", 1, 23);
    expect("0.3.65-server-stopped.pod", 1, 25);
    expect("0.3.65-two-devices.pod", 1, 22);
    expect("0.3.65-quantum.pod", 1, 23);
    expect("1.4.2-burn.pod", 5, 7);
    expect("1.4.2-server-stopped.pod", 9, 11);
    expect("1.4.2-two-devices.pod", 5, 7);
    expect("1.4.2-quantum.pod", 3, 3);
}

TEST(ProfileReaderTest, WhatARecordSaysIsUnderstood) {
    const Records records = recordsOf("0.3.65-burn.pod");
    ASSERT_FALSE(records.cycles.empty());
    const Cycle& cycle = records.cycles.front();
    EXPECT_EQ(cycle.driver.id, 29U);
    EXPECT_EQ(cycle.frames, 1024);
    EXPECT_EQ(cycle.rateNumerator, 1U);
    EXPECT_EQ(cycle.rateDenominator, 48000U);
    EXPECT_NEAR(static_cast<double>(cycle.length()), kLength, 1000);
    ASSERT_EQ(cycle.followers.size(), 2U);
    EXPECT_EQ(cycle.followers[0].id, 46U);
    EXPECT_EQ(cycle.followers[1].id, 52U);
    EXPECT_EQ(cycle.followers[0].progress, Progress::Finished);
    EXPECT_GT(cycle.followers[0].finish, cycle.followers[0].awake);
    EXPECT_FALSE(cycle.followers[0].missedSoFar);
}

TEST(ProfileReaderTest, NewerRecordsCountWhatEachNodeMissed) {
    const Records records = recordsOf("1.4.2-burn.pod");
    ASSERT_FALSE(records.cycles.empty());
    const auto& first = records.cycles.front().followers;
    const auto& last = records.cycles.back().followers;
    ASSERT_EQ(first.size(), 2U);
    EXPECT_EQ(first[0].id, 51U);
    ASSERT_TRUE(first[0].missedSoFar && last[0].missedSoFar);
    EXPECT_EQ(*first[0].missedSoFar, 0U);
    EXPECT_GT(*last[0].missedSoFar, 0U);
    EXPECT_EQ(*last[1].missedSoFar, 0U);
}

// It burned for 50 ms, two cycles and a bit.
void expectBurn(const std::string& file, ObjectId alpha, ObjectId beta, Nanoseconds begin,
                Nanoseconds end) {
    const auto episodes = episodesOf(file, {alpha, beta});
    ASSERT_EQ(episodes.size(), 1U) << file;
    const Episode& episode = episodes[0];
    EXPECT_EQ(episode.stream, 1) << file;
    EXPECT_EQ(episode.cycles, 2U) << file;
    EXPECT_EQ(episode.lateCycles, 0U) << file;
    EXPECT_NEAR(static_cast<double>(episode.missing), 2 * kLength, 1e5) << file;
    EXPECT_LE(episode.start, begin) << file;
    EXPECT_GT(episode.start, begin - 1'000'000) << file;
    EXPECT_NEAR(static_cast<double>(episode.held), static_cast<double>(end - begin), 2e6) << file;
    EXPECT_NEAR(episode.busyCycles, 50.0 / 21.333, 0.1) << file;
    EXPECT_LT(episode.othersCycles, 0.1) << file;
    EXPECT_TRUE(episode.woke) << file;
}

TEST(ProfileReaderTest, APlayerThatWasBusyForTwoCyclesMissedThem) {
    expectBurn("0.3.65-burn.pod", 46, 52, 12956363686278, 12956413687795);
    expectBurn("1.4.2-burn.pod", 51, 57, 12959465240835, 12959515242552);
}

// Everybody missed seven cycles of 150 ms, and it was nobody's fault but the server's.
void expectLate(const std::string& file, ObjectId alpha, ObjectId beta, Nanoseconds begin,
                Nanoseconds end) {
    const auto episodes = episodesOf(file, {alpha, beta});
    ASSERT_EQ(episodes.size(), 2U) << file;
    for (const Episode& episode : episodes) {
        EXPECT_NEAR(static_cast<double>(episode.cycles),
                    static_cast<double>((end - begin) / kLength), 1)
            << file;
        EXPECT_EQ(episode.lateCycles, episode.cycles) << file;
        EXPECT_NEAR(static_cast<double>(episode.start), static_cast<double>(begin), 22e6) << file;
        EXPECT_NEAR(static_cast<double>(episode.lateness), static_cast<double>(end - begin), 22e6)
            << file;
    }
}

TEST(ProfileReaderTest, AServerThatWasStoppedIsALateDriver) {
    expectLate("0.3.65-server-stopped.pod", 46, 52, 12962560115274, 12962710488531);
    expectLate("1.4.2-server-stopped.pod", 51, 57, 12965748342893, 12965898667228);
}

TEST(ProfileReaderTest, AForcedQuantumIsNoGlitch) {
    EXPECT_TRUE(episodesOf("0.3.65-quantum.pod", {46, 52}).empty());
    EXPECT_TRUE(episodesOf("1.4.2-quantum.pod", {51, 57}).empty());
    EXPECT_TRUE(episodesOf("0.3.65-start.pod", {46}).empty());
}

// The second device was not told to work meanwhile: it waited for the player.
TEST(ProfileReaderTest, ADeviceBehindABusyPlayerWaitsForIt) {
    const auto expect = [](const char* file, ObjectId alpha, ObjectId device) {
        const auto episodes = episodesOf(file, {alpha, device});
        ASSERT_EQ(episodes.size(), 2U) << file;
        EXPECT_EQ(episodes[0].cycles, 2U) << file;
        EXPECT_FALSE(episodes[0].waitedForOthers) << file;
        EXPECT_TRUE(episodes[1].waitedForOthers) << file;
        EXPECT_EQ(episodes[1].held, 0) << file;
    };
    expect("0.3.65-two-devices.pod", 46, 30);
    expect("1.4.2-two-devices.pod", 51, 31);
}

// ---- What is no record

TEST(ProfileReaderTest, APortionThatIsCutOffIsSkipped) {
    const auto portion = portionsOf("0.3.65-burn.pod").front();
    int cycles = 0;
    const auto read = [&](std::size_t size) {
        return readProfile(reinterpret_cast<const spa_pod*>(portion.data()), size,
                           [&](const Cycle&) { ++cycles; });
    };
    for (const std::size_t size :
         {std::size_t{0}, std::size_t{7}, std::size_t{8}, portion.size() * 8 - 8}) {
        EXPECT_EQ(read(size), 1U) << size;
    }
    EXPECT_EQ(cycles, 0);
}

TEST(ProfileReaderTest, ARecordWithoutAClockIsSkippedAndTheOthersAreRead) {
    auto portion = portionsOf("0.3.65-burn.pod").front();
    // The key of the first record's clock becomes one that nobody knows.
    auto* const bytes = reinterpret_cast<std::uint32_t*>(portion.data());
    auto* const end = bytes + portion.size() * 2;
    *std::find(bytes, end, std::uint32_t{SPA_PROFILER_clock}) = 0x1FFFF;
    int cycles = 0;
    EXPECT_EQ(readProfile(reinterpret_cast<const spa_pod*>(portion.data()), portion.size() * 8,
                          [&](const Cycle&) { ++cycles; }),
              1U);
    EXPECT_EQ(cycles, 22);
}

} // namespace
} // namespace halyard::pipewire
