#include "session/SessionBatch.h"

#include <gmock/gmock.h>

#include "testing/TestPlatform.h"

namespace halyard {
namespace {

using ::testing::IsEmpty;
using ::testing::SizeIs;

class SessionBatchTest : public ::testing::Test {
protected:
    bool add(const Dictionary& message) {
        return batch_
            .createMessageIdentifierWithCategory(kAudioEventCategoryPlayback, kAudioEventTypeStart,
                                                 message)
            .redundant;
    }

    testing::TestPlatform platform_;
    SessionBatch batch_;
};

TEST_F(SessionBatchTest, WhatIsNotStartedRecordsNothing) {
    EXPECT_FALSE(batch_.started());
    EXPECT_FALSE(add({{"n", 1}}));
    EXPECT_FALSE(add({{"n", 1}}));
    EXPECT_EQ(batch_.countFor("Playback_Start"), 0U);
    EXPECT_THAT(batch_.entries(), IsEmpty());
    EXPECT_EQ(batch_.summaryFileText(), std::nullopt);
    EXPECT_EQ(batch_.takeSummary(kAudioServiceTypeGeneric), std::nullopt);
}

TEST_F(SessionBatchTest, KeepsWhatIsNoRepeatUntilTheStop) {
    batch_.start({});
    EXPECT_TRUE(batch_.started());
    EXPECT_EQ(batch_.summaryFileText(), std::nullopt);
    EXPECT_FALSE(add({{"n", 1}}));
    EXPECT_TRUE(add({{"n", 1}}));
    ASSERT_THAT(batch_.entries(), SizeIs(1));
    EXPECT_EQ(batch_.entries()[0].identifier, "Playback_Start_1");
    EXPECT_NE(batch_.summaryFileText(), std::nullopt);
    batch_.stop();
    EXPECT_FALSE(batch_.started());
    EXPECT_THAT(batch_.entries(), IsEmpty());
}

TEST_F(SessionBatchTest, CountsTheRepeatsOfAllBatches) {
    for (int i = 0; i < 2; ++i) {
        batch_.start({});
        EXPECT_FALSE(add({{"n", 1}}));
        EXPECT_TRUE(add({{"n", 1}}));
        batch_.stop();
    }
    EXPECT_EQ(batch_.redundantMessages(), 2U);
    EXPECT_EQ(platform_.log.count("dropping redundant event"), 2U);
}

} // namespace
} // namespace halyard
