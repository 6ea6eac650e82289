#include "client/Backoff.h"

#include <gtest/gtest.h>

namespace halyard::client {
namespace {

using namespace std::chrono_literals;

TEST(BackoffTest, DoublesUpToTheLast) {
    Backoff backoff(100ms, 300ms);
    EXPECT_EQ(backoff.next(), 100ms);
    EXPECT_EQ(backoff.next(), 200ms);
    EXPECT_EQ(backoff.next(), 300ms);
    EXPECT_EQ(backoff.next(), 300ms);
}

TEST(BackoffTest, BeginsAnewOnlyAfterAConnectionThatHeld) {
    Backoff backoff(100ms, 300ms);
    backoff.next();
    backoff.connectionEnded(299ms);
    EXPECT_EQ(backoff.next(), 200ms);
    backoff.connectionEnded(300ms);
    EXPECT_EQ(backoff.next(), 100ms);
}

TEST(BackoffTest, ZeroMeansTheDefaults) {
    Backoff backoff(0ms, 0ms);
    EXPECT_EQ(backoff.next(), Backoff::kDefaultFirst);
    backoff.connectionEnded(Backoff::kDefaultLast - 1ms);
    EXPECT_EQ(backoff.next(), 2 * Backoff::kDefaultFirst);
}

TEST(BackoffTest, TheLastIsNeverBelowTheFirst) {
    Backoff backoff(100ms, 10ms);
    backoff.next();
    EXPECT_EQ(backoff.next(), 100ms);
}

} // namespace
} // namespace halyard::client
