// Event services that record what they are given.
#pragma once

#include <functional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/EventServices.h"

namespace halyard::testing {

// Wants the names in `used`, and all of them with `usesAll`. Builders wait in
// `events` until the test runs them.
class FakeAnalyticsService final : public platform::AnalyticsService {
public:
    struct Event {
        std::string name;
        std::function<Dictionary()> builder;
    };

    bool isEventUsed(std::string_view name) const override {
        asked.emplace_back(name);
        if (onAsked) {
            onAsked(name);
        }
        return usesAll || used.count(std::string(name)) != 0;
    }
    void sendEventLazily(std::string_view name, PayloadBuilder builder) override {
        events.push_back(
            {std::string(name), [builder = std::move(builder)] { return builder().whole(); }});
    }

    std::set<std::string> used;
    bool usesAll = false;
    mutable std::vector<std::string> asked;
    std::function<void(std::string_view name)> onAsked;
    std::vector<Event> events;
};

class FakeEnergyLedger final : public platform::EnergyLedger {
public:
    struct Event {
        std::uint32_t clientIdentifier;
        std::string name;
        Dictionary payload;
    };

    void registerEvent(std::uint32_t clientIdentifier, std::string_view name,
                       const Dictionary& payload) override {
        events.push_back({clientIdentifier, std::string(name), payload});
    }

    std::vector<Event> events;
};

class FakeMetricService final : public platform::MetricService {
public:
    struct Metric {
        std::uint32_t identifier;
        std::string message;
    };

    void postMetric(std::uint32_t metricIdentifier, std::string message) override {
        metrics.push_back({metricIdentifier, std::move(message)});
    }

    std::vector<Metric> metrics;
};

} // namespace halyard::testing
