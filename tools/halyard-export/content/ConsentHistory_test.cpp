#include <gtest/gtest.h>

#include "content/ConsentHistory.h"

namespace halyard::exporting {
namespace {

TEST(ConsentHistoryTest, TimeWithoutANoteIsRefused) {
    EXPECT_FALSE(ConsentHistory().isGivenAt(5));
    const ConsentHistory history({{true, 10}});
    EXPECT_FALSE(history.isGivenAt(9.9));
    EXPECT_TRUE(history.isGivenAt(10));
    EXPECT_TRUE(history.isGivenAt(1e12));
}

TEST(ConsentHistoryTest, WhatWasRefusedStaysRefusedAfterANewConsent) {
    const ConsentHistory history({{true, 10}, {false, 20}, {true, 30}});
    EXPECT_TRUE(history.isGivenAt(19.9));
    EXPECT_FALSE(history.isGivenAt(20));
    EXPECT_FALSE(history.isGivenAt(29.9));
    EXPECT_TRUE(history.isGivenAt(30));
}

TEST(ConsentHistoryTest, AStretchIsAgreedToWhereAllOfItIs) {
    const ConsentHistory history({{true, 10}, {false, 20}, {true, 30}});
    EXPECT_TRUE(history.isGivenThroughout(10, 19));
    EXPECT_FALSE(history.isGivenThroughout(9, 19));
    EXPECT_FALSE(history.isGivenThroughout(15, 35));
    EXPECT_FALSE(history.isGivenThroughout(19, 12));
    EXPECT_TRUE(history.isGivenThroughout(30, 99));
}

TEST(ConsentHistoryTest, AClockThatWasSetBackLeavesTheDoubtfulRefused) {
    const ConsentHistory history({{true, 10}, {false, 20}, {true, 12}});
    EXPECT_TRUE(history.isGivenAt(13));
    EXPECT_FALSE(history.isGivenAt(21));
    const ConsentHistory later({{true, 10}, {false, 20}, {true, 12}, {false, 40}, {true, 50}});
    EXPECT_FALSE(later.isGivenAt(21));
    EXPECT_TRUE(later.isGivenAt(51));
}

TEST(ConsentHistoryTest, WhoOnlyLooksSeesEverything) {
    EXPECT_TRUE(ConsentHistory::always().isGivenThroughout(-1e9, 1e12));
}

} // namespace
} // namespace halyard::exporting
