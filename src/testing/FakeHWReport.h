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
        std::vector<platform::HWReportChannel> delta = {};
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
        std::vector<platform::HWReportChannel> channels;
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
