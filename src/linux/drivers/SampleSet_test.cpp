#include "linux/drivers/SampleSet.h"

#include <gmock/gmock.h>
#include <limits>

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr std::int64_t kMin = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();

// Two sets of one channel, ten seconds apart.
class SampleSetTest : public ::testing::Test {
protected:
    void channelOf(ChannelFormat format) {
        DriverChannel names;
        names.group = "Speaker";
        names.name = "n";
        names.format = format;
        auto list = std::make_shared<ChannelList>();
        list->channels.push_back(
            std::make_shared<const ChannelFacts>(ChannelFacts{names, 1'000'000}));
        list->places.push_back(0);
        list_ = list;
    }
    static Reading reading(std::vector<std::uint64_t> numbers, ReadingShape shape = {}) {
        Reading result;
        result.status = ReadStatus::Read;
        result.numbers = std::move(numbers);
        if (shape != ReadingShape()) {
            result.shape = std::make_shared<const ReadingShape>(std::move(shape));
        }
        return result;
    }
    static Reading missing(ReadStatus status) {
        Reading result;
        result.status = status;
        return result;
    }
    // What the delta says of the channel, as text.
    std::vector<std::string> delta(const Reading& before, const Reading& after) {
        SampleSet first(list_, platform::SteadyTime(100s));
        SampleSet second(list_, platform::SteadyTime(110s));
        first.add(before);
        second.add(after);
        std::vector<std::string> result;
        second.since(first)->iterate([&](const platform::HWReportChannel& channel) {
            result.push_back(describe(channel));
            return 0;
        });
        return result;
    }
    std::vector<std::string> counter(std::int64_t before, std::int64_t after) {
        channelOf(ChannelFormat::Simple);
        return delta(reading({static_cast<std::uint64_t>(before)}),
                     reading({static_cast<std::uint64_t>(after)}));
    }
    static std::string describe(const platform::HWReportChannel& channel) {
        std::string text;
        switch (channel.format) {
        case platform::kHWReportFormatSimple:
            return std::to_string(channel.value);
        case platform::kHWReportFormatState:
            for (const auto& state : channel.states) {
                text += std::string(*state.name) + "=" + std::to_string(state.residency) + "/" +
                        std::to_string(state.transitions) + "/" + std::to_string(state.dutyCycle) +
                        " ";
            }
            return text;
        default:
            for (const auto& bucket : channel.buckets) {
                EXPECT_EQ(bucket.boundsError, 0);
                text += std::to_string(bucket.lower) + "-" + std::to_string(bucket.upper) + ":" +
                        std::to_string(bucket.hits) + " ";
            }
            return text + "min " + std::to_string(channel.min) + " max " +
                   std::to_string(channel.max);
        }
    }

    ChannelListRef list_;
};

TEST_F(SampleSetTest, CountersSubtract) {
    EXPECT_THAT(counter(5, 12), ElementsAre("7"));
    EXPECT_THAT(counter(5, 5), ElementsAre("0"));
    EXPECT_THAT(counter(-5, -3), ElementsAre("2"));
}

TEST_F(SampleSetTest, ACounterThatWentBackBeganAnew) {
    EXPECT_THAT(counter(100, 3), ElementsAre("3"));
}

TEST_F(SampleSetTest, AChangeThatNoNumberHoldsIsTheLargest) {
    EXPECT_THAT(counter(kMin, kMax), ElementsAre(std::to_string(kMax)));
}

TEST_F(SampleSetTest, ResidenciesSubtractAndTheirShareIsOfTheTimeBetween) {
    channelOf(ChannelFormat::State);
    const ReadingShape shape{{"on", "off"}, {}};
    EXPECT_THAT(
        delta(reading({1'000'000, 3, 500, 2}, shape), reading({3'500'000, 5, 500, 3}, shape)),
        ElementsAre("on=2500000/2/0.250000 off=0/1/0.000000 "));
}

TEST_F(SampleSetTest, NoShareIsMoreThanAll) {
    channelOf(ChannelFormat::State);
    const ReadingShape shape{{"on"}, {}};
    EXPECT_THAT(delta(reading({0, 0}, shape), reading({99'000'000, 1}, shape)),
                ElementsAre("on=99000000/1/1.000000 "));
}

TEST_F(SampleSetTest, StatesOfAReloadedDriverBeganAnew) {
    channelOf(ChannelFormat::State);
    const ReadingShape shape{{"on", "off"}, {}};
    EXPECT_THAT(delta(reading({10, 9, 10, 9}, shape), reading({20, 1, 20, 10}, shape)),
                ElementsAre("on=20/1/0.000002 off=20/10/0.000002 "));
}

TEST_F(SampleSetTest, StatesAreFoundByNameWhenTheListChanged) {
    channelOf(ChannelFormat::State);
    EXPECT_THAT(
        delta(reading({10, 1, 20, 2}, {{"a", "b"}, {}}), reading({25, 3, 7, 1}, {{"b", "c"}, {}})),
        ElementsAre("b=5/1/0.000001 c=7/1/0.000001 "));
}

TEST_F(SampleSetTest, HitsSubtractAndTheEndsAreThoseOfTheInterval) {
    channelOf(ChannelFormat::Histogram);
    const ReadingShape shape{{}, {{0, 10}, {10, 20}, {20, 30}}};
    EXPECT_THAT(delta(reading({5, 1, 0}, shape), reading({5, 3, 4}, shape)),
                ElementsAre("0-10:0 10-20:2 20-30:4 min 10 max 30"));
    EXPECT_THAT(delta(reading({5, 1, 0}, shape), reading({5, 1, 0}, shape)),
                ElementsAre("0-10:0 10-20:0 20-30:0 min 0 max 0"));
}

TEST_F(SampleSetTest, BucketsAreFoundByBoundsWhenTheListChanged) {
    channelOf(ChannelFormat::Histogram);
    EXPECT_THAT(delta(reading({5}, {{}, {{10, 20}}}), reading({2, 6}, {{}, {{0, 10}, {10, 20}}})),
                ElementsAre("0-10:2 10-20:1 min 0 max 20"));
}

TEST_F(SampleSetTest, WhatCameMeanwhileBeganAtZero) {
    channelOf(ChannelFormat::Simple);
    EXPECT_THAT(delta(missing(ReadStatus::Absent), reading({7})), ElementsAre("7"));
}

TEST_F(SampleSetTest, WhatCouldNotBeReadIsNotReported) {
    channelOf(ChannelFormat::Simple);
    EXPECT_THAT(delta(missing(ReadStatus::Failed), reading({7})), IsEmpty());
    EXPECT_THAT(delta(reading({7}), missing(ReadStatus::Failed)), IsEmpty());
    EXPECT_THAT(delta(reading({7}), missing(ReadStatus::Absent)), IsEmpty());
}

TEST_F(SampleSetTest, AChannelHasNothingOfOtherFormatsAndNoShareWithoutAnInterval) {
    channelOf(ChannelFormat::State);
    SampleSet set(list_, platform::SteadyTime(100s));
    set.add(reading({1, 2}, {{"on"}, {}}));
    set.iterate([](const platform::HWReportChannel& channel) {
        EXPECT_EQ(channel.value, 0);
        EXPECT_THAT(channel.buckets, IsEmpty());
        EXPECT_EQ(channel.states.size(), 1U);
        EXPECT_EQ(channel.states[0].dutyCycle, 0);
        return 0;
    });
}

TEST_F(SampleSetTest, AReadingThatIsTooShortEndsInZeros) {
    channelOf(ChannelFormat::State);
    SampleSet set(list_, platform::SteadyTime(100s));
    set.add(reading({1, 2, 3}, {{"on", "off", "idle"}, {}}));
    set.iterate([](const platform::HWReportChannel& channel) {
        EXPECT_EQ(describe(channel), "on=1/2/0.000000 off=3/0/0.000000 idle=0/0/0.000000 ");
        return 0;
    });
}

TEST_F(SampleSetTest, AChannelKeepsNothingOfTheOneBefore) {
    channelOf(ChannelFormat::Histogram);
    auto list = std::make_shared<ChannelList>(*list_);
    DriverChannel names;
    names.name = "counter";
    list->channels.push_back(std::make_shared<const ChannelFacts>(ChannelFacts{names, 1}));
    list->places.push_back(1);
    SampleSet set(list, platform::SteadyTime(100s));
    set.add(reading({1}, {{}, {{10, 20}}}));
    set.add(reading({7}));
    std::vector<platform::HWReportChannel> seen;
    set.iterate([&](const platform::HWReportChannel& channel) {
        seen.push_back(channel);
        return 0;
    });
    ASSERT_EQ(seen.size(), 2U);
    EXPECT_EQ(seen[0].max, 20);
    EXPECT_EQ(seen[1].value, 7);
    EXPECT_EQ(seen[1].group, std::nullopt);
    EXPECT_THAT(seen[1].buckets, IsEmpty());
    EXPECT_EQ(seen[1].max, 0);
}

// Channels that come and go with their devices: sets of an empty list.
class FoundChannelsTest : public ::testing::Test {
protected:
    using Found = std::vector<std::pair<std::string, std::uint64_t>>; // source and number

    SampleSet setOf(const Found& found) const {
        SampleSet set(list_, platform::SteadyTime(100s));
        for (const auto& [source, number] : found) {
            auto facts = std::make_shared<ChannelFacts>();
            facts->names.name = source;
            facts->names.source = source;
            Reading reading;
            reading.status = ReadStatus::Read;
            reading.numbers = {number};
            set.addFound(facts, reading);
        }
        return set;
    }
    static std::vector<std::string> delta(const SampleSet& before, const SampleSet& after) {
        std::vector<std::string> result;
        after.since(before)->iterate([&](const platform::HWReportChannel& channel) {
            result.push_back(std::string(*channel.name) + "=" + std::to_string(channel.value));
            return 0;
        });
        return result;
    }

    ChannelListRef list_ = std::make_shared<ChannelList>();
};

TEST_F(FoundChannelsTest, AreTheSameWhenTheirSourcesAre) {
    EXPECT_THAT(delta(setOf({{"a", 1}, {"b", 2}, {"gone", 3}}), setOf({{"b", 20}, {"a", 10}})),
                ElementsAre("b=18", "a=9"));
}

TEST_F(FoundChannelsTest, HaveBegunAtZeroWhenTheyWereNotThere) {
    EXPECT_THAT(delta(setOf({{"a", 1}}), setOf({{"a", 3}, {"new", 7}})),
                ElementsAre("a=2", "new=7"));
}

TEST_F(FoundChannelsTest, AreUnknownWhenNotAllWereLookedAt) {
    SampleSet before = setOf({{"a", 1}});
    before.setCurtailed();
    EXPECT_THAT(delta(before, setOf({{"a", 3}, {"new", 7}})), ElementsAre("a=2"));
}

TEST_F(FoundChannelsTest, AreUnknownWhenTheyCouldNotBeRead) {
    SampleSet before = setOf({});
    auto facts = std::make_shared<ChannelFacts>();
    facts->names.source = "a";
    before.addFound(facts, Reading());
    EXPECT_THAT(delta(before, setOf({{"a", 3}})), IsEmpty());
}

TEST_F(FoundChannelsTest, StandBehindThoseOfTheList) {
    auto list = std::make_shared<ChannelList>();
    list->channels.push_back(std::make_shared<ChannelFacts>());
    list_ = list;
    const auto setWith = [&](std::uint64_t listed, const Found& found) {
        SampleSet set(list_, platform::SteadyTime(100s));
        Reading reading;
        reading.status = ReadStatus::Read;
        reading.numbers = {listed};
        set.add(reading);
        for (const auto& [source, number] : found) {
            auto facts = std::make_shared<ChannelFacts>();
            facts->names.name = source;
            facts->names.source = source;
            reading.numbers = {number};
            set.addFound(facts, reading);
        }
        return set;
    };
    EXPECT_THAT(delta(setWith(1, {{"a", 10}, {"b", 20}}), setWith(5, {{"b", 21}, {"c", 2}})),
                ElementsAre("=4", "b=1", "c=2"));
}

} // namespace
} // namespace halyard::linux_
