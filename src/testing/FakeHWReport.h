// Driver statistics as a test scripts them, group by group.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/HWReport.h"

namespace halyard::testing {

struct FakeHWReportChannel final : platform::HWReportChannel {
    using OptionalText = std::optional<std::string>;
    struct Bucket {
        std::int64_t lower = 0;
        std::int64_t upper = 0;
        std::int64_t hits = 0;
        int boundsError = 0;
    };
    struct State {
        OptionalText name;
        std::uint64_t transitions = 0;
        std::uint64_t residency = 0;
        double dutyCycle = 0;
    };

    std::uint8_t format = 0;
    OptionalText driver, group, subGroup, name, unit;
    std::int64_t value = 0;
    std::vector<Bucket> buckets;
    std::int64_t min = 0;
    std::int64_t max = 0;
    std::vector<State> states;

    std::uint8_t getFormat() const override { return format; }
    Text getDriverName() const override { return driver; }
    Text getGroup() const override { return group; }
    Text getSubGroup() const override { return subGroup; }
    Text getChannelName() const override { return name; }
    Text getUnitLabel() const override { return unit; }
    std::int64_t simpleGetIntegerValue() const override { return value; }
    std::int32_t histogramGetBucketCount() const override {
        return static_cast<std::int32_t>(buckets.size());
    }
    int histogramGetBucketBounds(std::int32_t index, std::int64_t& lower,
                                 std::int64_t& upper) const override {
        const Bucket& bucket = buckets.at(static_cast<std::size_t>(index));
        if (bucket.boundsError == 0) {
            lower = bucket.lower;
            upper = bucket.upper;
        }
        return bucket.boundsError;
    }
    std::int64_t histogramGetBucketHits(std::int32_t index) const override {
        return buckets.at(static_cast<std::size_t>(index)).hits;
    }
    std::int64_t histogramGetMinValue() const override { return min; }
    std::int64_t histogramGetMaxValue() const override { return max; }
    std::int32_t stateGetCount() const override { return static_cast<std::int32_t>(states.size()); }
    Text stateGetNameForIndex(std::int32_t index) const override { return state(index).name; }
    std::uint64_t stateGetInTransitions(std::int32_t index) const override {
        return state(index).transitions;
    }
    std::uint64_t stateGetResidency(std::int32_t index) const override {
        return state(index).residency;
    }
    double stateGetDutyCycle(std::int32_t index) const override { return state(index).dutyCycle; }

private:
    const State& state(std::int32_t index) const {
        return states.at(static_cast<std::size_t>(index));
    }
};

class FakeHWReport final : public platform::HWReport {
public:
    // How one group behaves; groups that are not in `groups` list nothing, and
    // without an error.
    struct Group {
        bool listed = true;
        std::optional<std::int64_t> listingError = {};
        std::int64_t channelCount = 1;
        bool handle = true;    // createSubscription returns one,
        bool describes = true; // and what was subscribed to
        bool sampled = true;
        std::optional<std::int64_t> samplingError = {};
        bool differs = true; // a delta comes back
        std::optional<std::int64_t> deltaError = {};
        std::vector<FakeHWReportChannel> delta = {};
    };

    struct Channels final : platform::HWReportChannels {
        explicit Channels(std::string theGroup) : group(std::move(theGroup)) {}
        std::string group;
    };
    struct Subscription final : platform::HWReportSubscription {
        std::string group;
    };
    // `number` counts the samplings of all groups.
    struct Samples final : platform::HWReportSamples {
        std::string group;
        int number = 0;
        std::vector<FakeHWReportChannel> channels;
    };

    platform::HWReportResult<platform::HWReportChannelsRef>
    copyChannelsInGroup(const std::optional<std::string>& group,
                        const std::optional<std::string>& subGroup) override {
        const std::string key = group.value_or("(null)") + "-" + subGroup.value_or("(null)");
        calls.push_back("list " + key);
        const auto at = groups.find(key);
        if (at == groups.end()) {
            return {};
        }
        return {at->second.listed ? std::make_shared<Channels>(key) : nullptr,
                error(at->second.listingError)};
    }
    std::int64_t getChannelCount(const platform::HWReportChannels& channels) const override {
        return groups.at(dynamic_cast<const Channels&>(channels).group).channelCount;
    }
    platform::HWReportSubscribed
    createSubscription(const platform::HWReportChannels& channels) override {
        const std::string key = dynamic_cast<const Channels&>(channels).group;
        calls.push_back("subscribe " + key);
        Subscription& subscription = subscriptions[key];
        subscription.group = key;
        const Group& group = groups.at(key);
        return {group.handle ? &subscription : nullptr,
                group.describes ? std::make_shared<Channels>(key + " subscribed") : nullptr};
    }
    platform::HWReportResult<platform::HWReportSamplesRef>
    createSamples(platform::HWReportSubscription* subscription,
                  const platform::HWReportChannels* channels) override {
        if (subscription == nullptr || channels == nullptr) {
            return {nullptr, platform::HWReportError{22}};
        }
        const std::string key = dynamic_cast<Subscription&>(*subscription).group;
        calls.push_back("sample " + key);
        const Group& group = groups.at(key);
        auto samples = std::make_shared<Samples>();
        samples->group = key;
        samples->number = ++samplings;
        alive.push_back(samples);
        return {group.sampled ? samples : nullptr, error(group.samplingError)};
    }
    platform::HWReportResult<platform::HWReportSamplesRef>
    createSamplesDelta(const platform::HWReportSamples* previous,
                       const platform::HWReportSamples& current) override {
        const auto& now = dynamic_cast<const Samples&>(current);
        const auto* before = dynamic_cast<const Samples*>(previous);
        calls.push_back("delta " + now.group + " " +
                        (before != nullptr ? std::to_string(before->number) : "none") + " " +
                        std::to_string(now.number));
        const Group& group = groups.at(now.group);
        auto delta = std::make_shared<Samples>();
        delta->channels = group.delta;
        return {group.differs ? delta : nullptr, error(group.deltaError)};
    }
    void
    iterate(const platform::HWReportSamples& samples,
            const std::function<int(const platform::HWReportChannel&)>& callback) const override {
        for (const auto& channel : dynamic_cast<const Samples&>(samples).channels) {
            if (callback(channel) != 0) {
                return;
            }
        }
    }
    // Of the sets that were taken.
    std::size_t setsAlive() const {
        std::size_t count = 0;
        for (const auto& samples : alive) {
            count += samples.expired() ? 0 : 1;
        }
        return count;
    }

    std::map<std::string, Group> groups; // by "group-subgroup"
    std::map<std::string, Subscription> subscriptions;
    std::vector<std::string> calls;
    std::vector<std::weak_ptr<const Samples>> alive;
    int samplings = 0;

private:
    static std::optional<platform::HWReportError> error(std::optional<std::int64_t> code) {
        return code ? std::optional(platform::HWReportError{*code}) : std::nullopt;
    }
};

} // namespace halyard::testing
