#include "client/MessageRing.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <thread>
#include <vector>

namespace halyard::client {
namespace {

using Outcome = MessageRing::Claim::Outcome;

constexpr std::size_t kCapacity = 4096;

class MessageRingTest : public testing::Test {
protected:
    Outcome put(const std::string& text, std::size_t limit = kCapacity) {
        const MessageRing::Claim claim = ring_.claim(text.size() + 1, limit);
        if (claim.outcome == Outcome::Granted) {
            std::memcpy(claim.bytes, text.c_str(), text.size() + 1);
            ring_.publish(claim);
        }
        return claim.outcome;
    }
    std::string take() {
        MessageRing::Record record;
        if (!ring_.read(ring_.releasedTo(), record)) {
            return "nothing";
        }
        const std::string text = record.bytes;
        ring_.release(record.next);
        return text;
    }

    void rewindIfRead() {
        if (ring_.used() == 0) {
            ring_.rewind();
        }
    }

    MessageRing ring_{kCapacity};
};

TEST_F(MessageRingTest, GivesRecordsInTheOrderOfTheirClaims) {
    put("one");
    put("two");
    EXPECT_EQ(take(), "one");
    EXPECT_EQ(take(), "two");
    EXPECT_EQ(take(), "nothing");
}

TEST_F(MessageRingTest, ShowsNothingBehindAnUnpublishedClaim) {
    const MessageRing::Claim slow = ring_.claim(8, kCapacity);
    put("later");
    EXPECT_EQ(take(), "nothing");
    std::strcpy(slow.bytes, "first");
    ring_.publish(slow);
    EXPECT_EQ(take(), "first");
    EXPECT_EQ(take(), "later");
}

TEST_F(MessageRingTest, RefusesWhatExceedsTheLimitAndTakesItAfterARelease) {
    const std::string half(kCapacity / 2 - 16, 'x');
    ASSERT_EQ(put(half), Outcome::Granted);
    ASSERT_EQ(put(half), Outcome::Granted);
    EXPECT_EQ(put("x"), Outcome::Full);
    EXPECT_EQ(take(), half);
    EXPECT_EQ(put("x"), Outcome::Granted);
}

TEST_F(MessageRingTest, LeavesWhatIsAboveTheLimitToOthers) {
    ASSERT_EQ(put(std::string(1000, 'x'), 2048), Outcome::Granted);
    EXPECT_EQ(put(std::string(1100, 'x'), 2048), Outcome::Full);
    EXPECT_EQ(put(std::string(1100, 'x'), kCapacity), Outcome::Granted);
}

// Lengths that do not divide the capacity, so that every lap ends with a filler
// of another size.
TEST_F(MessageRingTest, KeepsRecordsWholeOverManyLaps) {
    for (int i = 0; i < 2000; ++i) {
        const std::string text(static_cast<std::size_t>(i * 7 % 900),
                               static_cast<char>('a' + i % 26));
        ASSERT_EQ(put(text), Outcome::Granted);
        ASSERT_EQ(take(), text);
    }
    EXPECT_EQ(ring_.used(), 0U);
}

TEST_F(MessageRingTest, SealedRefusesWritersAndStillGivesWhatItHas) {
    put("last");
    ring_.seal();
    EXPECT_EQ(put("late"), Outcome::Sealed);
    EXPECT_EQ(take(), "last");
    EXPECT_EQ(ring_.releasedTo(), ring_.end());
}

// Its memory is what the process pays for.
TEST_F(MessageRingTest, RewindsOverWhatItNeedNotUse) {
    put(std::string(kCapacity / 2 - 16, 'x'));
    put("more");
    take();
    take();
    ring_.rewind();
    EXPECT_EQ(ring_.used(), 0U);
    EXPECT_EQ(ring_.releasedTo() % kCapacity, 0U);
    put("next");
    EXPECT_EQ(take(), "next");
}

TEST_F(MessageRingTest, DoesNotRewindOverAClaim) {
    put(std::string(kCapacity / 2 - 16, 'x'));
    put("more");
    take();
    take();
    put("next");
    ring_.rewind();
    EXPECT_EQ(take(), "next");
}

TEST_F(MessageRingTest, StaysSealedWhenItRewinds) {
    put(std::string(kCapacity / 2 - 16, 'x'));
    put("more");
    take();
    take();
    ring_.seal();
    ring_.rewind();
    EXPECT_EQ(put("late"), Outcome::Sealed);
    EXPECT_EQ(ring_.used(), 0U);
}

TEST_F(MessageRingTest, ManyWritersLoseAndMixNothing) {
    constexpr int kWriters = 4;
    constexpr int kEach = 2000;
    std::vector<std::thread> writers;
    for (int writer = 0; writer < kWriters; ++writer) {
        writers.emplace_back([&, writer] {
            for (int i = 0; i < kEach;) {
                const std::string text = std::to_string(writer) + ' ' + std::to_string(i);
                if (put(text) == Outcome::Granted) {
                    ++i;
                } else {
                    std::this_thread::yield();
                }
            }
        });
    }
    std::vector<int> next(kWriters, 0);
    for (int taken = 0; taken < kWriters * kEach;) {
        const std::string text = take();
        if (text != "nothing") {
            const std::size_t writer = static_cast<std::size_t>(text[0] - '0');
            ASSERT_EQ(text.substr(2), std::to_string(next[writer]++));
            ++taken;
        } else {
            std::this_thread::yield();
            rewindIfRead();
        }
    }
    for (std::thread& writer : writers) {
        writer.join();
    }
}

} // namespace
} // namespace halyard::client
