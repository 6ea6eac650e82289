#include "session/MessageBatch.h"

#include <gmock/gmock.h>
#include <limits>

#include "testing/Printers.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;

class MessageBatchTest : public ::testing::Test {
protected:
    bool add(const Dictionary& message) { return add(message, kAudioEventCategoryPlayback); }
    bool add(const Dictionary& message, AudioEventCategory category,
             AudioEventType type = kAudioEventTypeStart) {
        return batch_.addUnlessRedundant(category, type, message);
    }
    std::vector<std::string> identifiers() const {
        std::vector<std::string> result;
        for (const auto& entry : batch_.entries()) {
            result.push_back(entry.identifier());
        }
        return result;
    }

    const Dictionary a_{{"route", "speaker"}};
    const Dictionary b_{{"route", "headphones"}};
    MessageBatch batch_;
};

TEST_F(MessageBatchTest, CountsEachKindFromOne) {
    EXPECT_FALSE(add(a_));
    EXPECT_FALSE(add(a_, kAudioEventCategoryGroupDSP | kAudioEventCategoryIO));
    EXPECT_FALSE(add(a_, kAudioEventCategoryPlayback, kAudioEventTypeStop));
    EXPECT_FALSE(add(b_));
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "DSP_IO_Start_1", "Playback_Stop_1",
                                           "Playback_Start_2"));
    EXPECT_EQ(batch_.countFor("Playback_Start"), 2U);
}

TEST_F(MessageBatchTest, AnUnseenKindHasTheCountZero) {
    EXPECT_TRUE(batch_.empty());
    EXPECT_EQ(batch_.countFor("Playback_Start"), 0U);
}

TEST_F(MessageBatchTest, KindsOfOneNameCountTogether) {
    // An unlisted type goes by the name of type 0.
    EXPECT_FALSE(add(a_, kAudioEventCategoryPlayback, 0));
    EXPECT_FALSE(add(b_, kAudioEventCategoryPlayback, 4711));
    EXPECT_TRUE(add(b_, kAudioEventCategoryPlayback, 0));
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Generic_1", "Playback_Generic_2"));
}

TEST_F(MessageBatchTest, KindsThatDifferInOneNumberOnlyAreNotMixedUp) {
    EXPECT_FALSE(add(a_, kAudioEventCategoryPlayback, kAudioEventTypeStart));
    EXPECT_FALSE(add(a_, kAudioEventCategoryPlayback, 0));
    EXPECT_FALSE(add(a_, kAudioEventCategoryUndefined, 0));
    EXPECT_TRUE(add(a_, kAudioEventCategoryPlayback, 0));
    EXPECT_TRUE(add(a_, kAudioEventCategoryUndefined, 0));
    EXPECT_TRUE(add(a_, kAudioEventCategoryPlayback, kAudioEventTypeStart));
    EXPECT_THAT(identifiers(),
                ElementsAre("Playback_Start_1", "Playback_Generic_1", "Undefined_Generic_1"));
}

TEST_F(MessageBatchTest, KeepsMessagesOnlyWhereSomebodyWillReadThem) {
    MessageBatch batch({.keepsMessages = false, .minimumPlaytime = 0.5});
    EXPECT_FALSE(batch.addUnlessRedundant(4, 1, a_));
    EXPECT_TRUE(batch.addUnlessRedundant(4, 1, a_));
    EXPECT_TRUE(batch.entries().empty());
    EXPECT_FALSE(batch.empty());
    EXPECT_EQ(batch.countFor("Playback_Start"), 1U);
}

TEST_F(MessageBatchTest, ARepeatIsInNoSummary) {
    EXPECT_FALSE(add(a_));
    EXPECT_TRUE(add(a_));
    EXPECT_EQ((*batch_.takeSummary(4))["route"], Value("speaker"));
}

class TimeStampTest : public MessageBatchTest, public ::testing::WithParamInterface<const char*> {};

TEST_P(TimeStampTest, DoesNotMakeADifference) {
    Dictionary first = a_;
    Dictionary second = a_;
    first.set(GetParam(), 1.5);
    second.set(GetParam(), 2.5);
    EXPECT_FALSE(add(first));
    EXPECT_TRUE(add(second));
    EXPECT_TRUE(add(a_)) << "nor does its absence";
    EXPECT_EQ(batch_.countFor("Playback_Start"), 1U);
}

TEST_P(TimeStampTest, IsKeptInTheBatch) {
    Dictionary message = a_;
    message.set(GetParam(), 1.5);
    EXPECT_FALSE(add(message));
    EXPECT_EQ(batch_.entries().front().message, message);
}

INSTANTIATE_TEST_SUITE_P(All, TimeStampTest,
                         ::testing::Values("processuptime_ms", "systemuptime_sec",
                                           "hyreporting_timestamp"));

TEST_F(MessageBatchTest, ErrorCategoryIsNeverRedundant) {
    EXPECT_FALSE(add(a_, kAudioEventCategoryError));
    EXPECT_FALSE(add(a_, kAudioEventCategoryError));
    EXPECT_THAT(identifiers(), ElementsAre("Error_Start_1", "Error_Start_2"));
}

TEST_F(MessageBatchTest, ErrorTypeIsNeverRedundant) {
    EXPECT_FALSE(add(a_, kAudioEventCategoryPlayback, kAudioEventTypeError));
    EXPECT_FALSE(add(a_, kAudioEventCategoryPlayback, kAudioEventTypeError));
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Error_1", "Playback_Error_2"));
}

TEST_F(MessageBatchTest, GroupedErrorCategoryIsDeDuplicatedLikeAnyOther) {
    const AudioEventCategory grouped = kAudioEventCategoryGroupHAL | kAudioEventCategoryError;
    EXPECT_FALSE(add(a_, grouped));
    EXPECT_TRUE(add(a_, grouped));
    EXPECT_EQ(batch_.countFor("HAL_Error_Start"), 1U);
}

TEST_F(MessageBatchTest, ComparesWithTheLastAcceptedOnly) {
    EXPECT_FALSE(add(a_));
    EXPECT_FALSE(add(b_));
    EXPECT_FALSE(add(a_));
    EXPECT_TRUE(add(a_));
    EXPECT_EQ(batch_.entries().size(), 3U);
}

TEST_F(MessageBatchTest, DropsTheRepeatBeforeAChange) {
    EXPECT_FALSE(add(a_));
    EXPECT_TRUE(add(a_));
    EXPECT_FALSE(add(b_));
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "Playback_Start_2"));
}

TEST_F(MessageBatchTest, OtherKindsBetweenDoNotHideARepeat) {
    EXPECT_FALSE(add(a_));
    EXPECT_FALSE(add(a_, kAudioEventCategoryRecord));
    EXPECT_TRUE(add(a_));
}

TEST_F(MessageBatchTest, ThrottleAndBlacklistKeysCountLikeAnyOther) {
    Dictionary throttled = a_;
    throttled.set("_throttle_seconds", 5);
    Dictionary listed = throttled;
    listed.set("_comparison_field_blacklist", List{Value("route")});
    EXPECT_FALSE(add(a_));
    EXPECT_FALSE(add(throttled));
    EXPECT_FALSE(add(listed));
}

TEST(EqualButForTimeStamps, ComparesNumbersByTheirValue) {
    EXPECT_TRUE(equalButForTimeStamps({{"n", 1}}, {{"n", 1.0}}));
    EXPECT_TRUE(equalButForTimeStamps({{"n", true}}, {{"n", 1}}));
    EXPECT_FALSE(equalButForTimeStamps({{"n", 1}}, {{"n", "1"}}));
    // 2^53 + 1 has no double of its own.
    EXPECT_FALSE(equalButForTimeStamps({{"n", 9007199254740993}}, {{"n", 9007199254740992.0}}));
}

TEST(EqualButForTimeStamps, NotANumberIsNeverARepeat) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    const Dictionary direct{{"n", nan}};
    const Dictionary nested{{"list", List{Value(Dictionary{{"n", nan}})}}};
    EXPECT_FALSE(equalButForTimeStamps(direct, direct));
    EXPECT_FALSE(equalButForTimeStamps(nested, nested));
    EXPECT_TRUE(equalButForTimeStamps({{"hyreporting_timestamp", nan}}, {}));
}

TEST(EqualButForTimeStamps, DoesNotMindTheOrderOfKeys) {
    EXPECT_TRUE(
        equalButForTimeStamps({{"a", 1}, {"systemuptime_sec", 7}, {"b", 2}}, {{"b", 2}, {"a", 1}}));
}

TEST(EqualButForTimeStamps, SeesAMissingAndAnExtraKey) {
    EXPECT_FALSE(equalButForTimeStamps({{"a", 1}}, {{"a", 1}, {"b", 2}}));
    EXPECT_FALSE(equalButForTimeStamps({{"a", 1}, {"b", 2}}, {{"a", 1}}));
    EXPECT_FALSE(equalButForTimeStamps({{"a", 1}}, {{"b", 1}}));
    EXPECT_FALSE(equalButForTimeStamps({}, {{"a", 1}}));
    EXPECT_FALSE(equalButForTimeStamps({{"a", 1}, {"systemuptime_sec", 1}}, {{"b", 1}, {"a", 1}}));
    EXPECT_TRUE(equalButForTimeStamps({}, {{"processuptime_ms", 1}}));
}

} // namespace
} // namespace halyard
