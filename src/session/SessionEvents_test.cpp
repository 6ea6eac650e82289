#include "session/MessageBatch.h"

#include <gtest/gtest.h>
#include <memory>

#include "common/Description.h"

namespace halyard {
namespace {

class SessionEventsTest : public ::testing::Test {
protected:
    void add(const Dictionary& message) { messages_.push_back(message); }
    void addVolume(double volume, bool playing, double time) {
        add(Dictionary{{"VQSessionVolume", volume},
                       {"VQSessionVolumePlayingState", playing ? 1 : 0},
                       {"hyreporting_timestamp", time},
                       {"n", messages_.size()}}); // Never a repeat.
    }
    std::unique_ptr<MessageBatch> batch(double minimum = 0.5) {
        auto result = std::make_unique<MessageBatch>(
            MessageBatch::Options{.keepsMessages = false, .minimumPlaytime = minimum});
        for (const Dictionary& message : messages_) {
            EXPECT_FALSE(result->addUnlessRedundant(kAudioEventCategoryVolume, kAudioEventTypeSetup,
                                                    message));
        }
        return result;
    }
    std::vector<Dictionary> volumeEvents(double minimum) { return batch(minimum)->volumeEvents(); }
    std::optional<Dictionary> summary(AudioServiceType type) { return batch()->takeSummary(type); }

    std::vector<Dictionary> messages_;
};

TEST_F(SessionEventsTest, AStretchMustLastLongerThanTheMinimum) {
    addVolume(0.5, true, 10);
    addVolume(0.5, true, 20);
    addVolume(0.5, false, 40);

    EXPECT_TRUE(volumeEvents(30).empty());
    const auto events = volumeEvents(29.9);
    ASSERT_EQ(events.size(), 1u);
    EXPECT_EQ(events[0]["play_seconds"], Value(30));
    EXPECT_EQ(events[0]["VQSessionVolume"], Value(0.5));
}

TEST_F(SessionEventsTest, TheMinimumIsHalfASecondUnlessItIsToldOtherwise) {
    for (const auto& [end, events] : {std::pair(10.5, 0U), std::pair(10.75, 1U)}) {
        MessageBatch batch;
        for (const bool playing : {true, false}) {
            EXPECT_FALSE(batch.addUnlessRedundant(
                kAudioEventCategoryVolume, kAudioEventTypeSetup,
                Dictionary{{"VQSessionVolume", 0.5},
                           {"VQSessionVolumePlayingState", playing},
                           {"hyreporting_timestamp", playing ? 10 : end}}));
        }
        EXPECT_EQ(batch.volumeEvents().size(), events);
    }
}

TEST_F(SessionEventsTest, AVolumeChangeWhilePlayingEndsOneStretchAndStartsTheNext) {
    addVolume(0.5, true, 10);
    addVolume(0.75, true, 14);
    addVolume(0.75, false, 24);

    const auto events = volumeEvents(0.5);
    ASSERT_EQ(events.size(), 2u);
    EXPECT_EQ(events[0]["VQSessionVolume"], Value(0.5));
    EXPECT_EQ(events[0]["play_seconds"], Value(4));
    EXPECT_EQ(events[1]["VQSessionVolume"], Value(0.75));
    EXPECT_EQ(events[1]["play_seconds"], Value(10));
}

TEST_F(SessionEventsTest, WhatWasNeverSeenIsUnknown) {
    addVolume(0.5, true, 10);
    addVolume(0.5, false, 11);

    const Dictionary event = volumeEvents(0.5).at(0);
    EXPECT_EQ(event["session_selected_format"], Value("Unknown"));
    EXPECT_EQ(event["active_devices"], Value("Unknown"));
    EXPECT_EQ(event["VQSessionVolumeOperationProcess"], Value("Unknown"));
    EXPECT_EQ(event.size(), 7u);
}

TEST_F(SessionEventsTest, AMessagesOwnContextCountsForTheStretchThatItEnds) {
    addVolume(0.5, true, 10);
    add(Dictionary{{"VQSessionVolume", 0.5},
                   {"VQSessionVolumePlayingState", 0},
                   {"hyreporting_timestamp", 20},
                   {"active_devices", List{"headphones"}},
                   {"session_selected_format", "F32LE"}});

    const Dictionary event = volumeEvents(0.5).at(0);
    EXPECT_EQ(event["active_devices"], Value(List{"headphones"}));
    EXPECT_EQ(event["session_selected_format"], Value("F32LE"));
}

TEST_F(SessionEventsTest, AnyMessageTellsTheContext) {
    add(Dictionary{{"session_selected_format", "S16LE"},
                   {"active_devices", "speaker"},
                   {"VQSessionVolumeOperationProcess", "mixer"}});
    addVolume(0.5, true, 10);
    add(Dictionary{{"VQSessionVolumeOperationProcess", "remote"}});
    addVolume(0.5, false, 11);

    const Dictionary event = volumeEvents(0.5).at(0);
    EXPECT_EQ(event["session_selected_format"], Value("S16LE"));
    EXPECT_EQ(event["active_devices"], Value("speaker"));
    EXPECT_EQ(event["VQSessionVolumeOperationProcess"], Value("remote"));
}

TEST_F(SessionEventsTest, WhatComesAfterAStretchIsNotItsContext) {
    addVolume(0.5, true, 10);
    addVolume(0.5, false, 11);
    add(Dictionary{{"session_selected_format", "S16LE"},
                   {"active_devices", "speaker"},
                   {"VQSessionVolumeOperationProcess", "mixer"}});

    const Dictionary event = volumeEvents(0.5).at(0);
    EXPECT_EQ(event["session_selected_format"], Value("Unknown"));
    EXPECT_EQ(event["active_devices"], Value("Unknown"));
    EXPECT_EQ(event["VQSessionVolumeOperationProcess"], Value("Unknown"));
}

TEST_F(SessionEventsTest, AStretchEndsWhenThePlayingStops) {
    addVolume(0.5, true, 10);
    addVolume(0.5, false, 12);
    addVolume(0.5, false, 20);
    addVolume(0.5, true, 50);
    addVolume(0.5, false, 53);

    const auto events = volumeEvents(0.5);
    ASSERT_EQ(events.size(), 2u);
    EXPECT_EQ(events[0]["play_seconds"], Value(2));
    EXPECT_EQ(events[1]["play_seconds"], Value(3));
}

TEST_F(SessionEventsTest, AStretchBeginsOnlyWhereSomethingPlays) {
    addVolume(0.5, false, 10);
    addVolume(0.75, false, 20);
    EXPECT_TRUE(volumeEvents(0.5).empty());
    addVolume(0.75, true, 30);
    addVolume(0.75, false, 34);

    const auto events = volumeEvents(0.5);
    ASSERT_EQ(events.size(), 1u);
    EXPECT_EQ(events[0]["play_seconds"], Value(4));
}

TEST_F(SessionEventsTest, APlayingStateIsTrueWhenItIsNoZero) {
    for (const Value& state : {Value(-1), Value(2), Value("1"), Value(true)}) {
        messages_.clear();
        add(Dictionary{{"VQSessionVolume", 0.5},
                       {"VQSessionVolumePlayingState", state},
                       {"hyreporting_timestamp", 10}});
        addVolume(0.5, false, 12);
        EXPECT_EQ(volumeEvents(0.5).size(), 1u) << describe(state);
    }
}

TEST_F(SessionEventsTest, AVolumeWithoutAPlayingStateDoesNotPlay) {
    add(Dictionary{{"VQSessionVolume", 0.5}, {"hyreporting_timestamp", 10}});
    addVolume(0.5, false, 12);
    EXPECT_TRUE(volumeEvents(0.5).empty());
}

TEST_F(SessionEventsTest, NumbersAreBucketed) {
    addVolume(0.3, true, 10);
    addVolume(0.3, false, 13);

    const Dictionary event = volumeEvents(0.5).at(0);
    EXPECT_EQ(event["VQSessionVolumeBucketed"], Value("0.3125"));
    EXPECT_EQ(event["play_secondsBucketed"], Value("5")) << "a tie goes to the larger";
}

TEST_F(SessionEventsTest, SecondsAreSinglePrecision) {
    addVolume(1, true, 1700000000.1);
    addVolume(1, false, 1700000002.4);

    const Dictionary event = volumeEvents(0.5).at(0);
    EXPECT_EQ(event["play_seconds"].kind(), Value::Kind::Float);
    EXPECT_EQ(describe(event["play_seconds"]), "2.3000002");
}

TEST_F(SessionEventsTest, VolumesCompareAsNumbers) {
    addVolume(1, true, 10);
    add(Dictionary{{"VQSessionVolume", 1},
                   {"VQSessionVolumePlayingState", true},
                   {"hyreporting_timestamp", 15}});
    addVolume(1, false, 20);

    EXPECT_EQ(volumeEvents(0.5).at(0)["play_seconds"], Value(10));
}

TEST_F(SessionEventsTest, AStretchThatStillPlaysHasNoEvent) {
    addVolume(0.5, true, 10);
    addVolume(0.5, true, 1000);

    EXPECT_TRUE(volumeEvents(0.5).empty());
}

TEST_F(SessionEventsTest, AnEmptyBatchYieldsNothing) {
    EXPECT_TRUE(volumeEvents(0).empty());
    EXPECT_FALSE(summary(kAudioServiceTypeTest).has_value());
}

TEST_F(SessionEventsTest, TheSummaryJoinsAllValuesOfEachKey) {
    add(Dictionary{{"a", 1}, {"hyreporting_timestamp", 1.5}});
    add(Dictionary{{"a", "two"}, {"b", List{1, 2}}, {"hyreporting_timestamp", 2.25}});
    add(Dictionary{{"a", 3.0f}});

    const auto event = summary(kAudioServiceTypeLongFormAudio);
    ASSERT_TRUE(event.has_value());
    EXPECT_EQ(*event, (Dictionary{{"HY_Session_Summary_Event", "7"},
                                  {"a", "1,two,3"},
                                  {"hyreporting_timestamp", "1.5,2.25"},
                                  {"b", "(\n    1,\n    2\n)"}}));
}

TEST_F(SessionEventsTest, ASummaryThatWasTakenStartsAnew) {
    add(Dictionary{{"a", 1}});
    const auto taken = batch();
    ASSERT_TRUE(taken->takeSummary(4).has_value());
    EXPECT_FALSE(taken->takeSummary(4).has_value());
    EXPECT_TRUE(taken->empty());
    EXPECT_FALSE(taken->addUnlessRedundant(4, 1, Dictionary{{"b", 2}}));
    EXPECT_EQ(*taken->takeSummary(5), (Dictionary{{"HY_Session_Summary_Event", "5"}, {"b", "2"}}));
}

TEST_F(SessionEventsTest, AnEmptyTextIsAValueLikeAnyOther) {
    add(Dictionary{{"a", ""}});
    add(Dictionary{{"a", "x"}});
    add(Dictionary{{"a", ""}});

    EXPECT_EQ((*summary(4))["a"], Value(",x,"));
}

TEST_F(SessionEventsTest, KeysMayComeInAnyOrderAndNumber) {
    add(Dictionary{{"a", 1}, {"b", 2}, {"c", 3}});
    add(Dictionary{{"c", 4}, {"a", 5}});
    add(Dictionary{{"b", 6}, {"d", 7}, {"a", 8}});

    EXPECT_EQ(*summary(4), (Dictionary{{"HY_Session_Summary_Event", "4"},
                                       {"a", "1,5,8"},
                                       {"b", "2,6"},
                                       {"c", "3,4"},
                                       {"d", "7"}}));
}

TEST_F(SessionEventsTest, TheTextOfALongSessionIsWhole) {
    std::string expected;
    for (int i = 0; i < 20000; ++i) { // Some hundred kilobytes, in values of many lengths.
        const std::string value(static_cast<std::size_t>(i % 37), static_cast<char>('a' + i % 26));
        add(Dictionary{{"a", value}, {"n", i}});
        expected += (i == 0 ? "" : ",") + value;
    }

    EXPECT_EQ((*summary(4))["a"], Value(expected));
}

TEST_F(SessionEventsTest, AClientsOwnSummaryKeyIsJoinedBehindTheServiceType) {
    add(Dictionary{{"HY_Session_Summary_Event", "x"}});

    EXPECT_EQ((*summary(4))["HY_Session_Summary_Event"], Value("4,x"));
}

} // namespace
} // namespace halyard
