// The analytics service, the energy ledger and the metric service over the store.
//
// Any thread.
#pragma once

#include <string>
#include <unordered_map>
#include <vector>

#include "common/Mutex.h"
#include "linux/store/Store.h"
#include "platform/EventServices.h"

namespace halyard::linux_ {

// Wants the events whose names match one of its shell patterns. Names recur all
// the time, so the answer is kept for each of them.
class StoreAnalyticsService final : public platform::AnalyticsService {
public:
    static constexpr std::size_t kMaxKnownNames = 4096;

    // Borrows `store`.
    StoreAnalyticsService(Store& store,
                          std::vector<std::string> wanted = {"com.kestrel.halyard.*"});

    void setWanted(std::vector<std::string> wanted) HY_EXCLUDES(mutex_);

    // False for every name when there is no store.
    bool isEventUsed(std::string_view name) const override HY_EXCLUDES(mutex_);
    void sendEventLazily(std::string_view name, PayloadBuilder builder) override
        HY_EXCLUDES(mutex_);

private:
    struct Known {
        Value name; // shared by the name's rows
        bool wanted;
    };
    struct Hash {
        using is_transparent = void;
        std::size_t operator()(std::string_view text) const {
            return std::hash<std::string_view>()(text);
        }
    };
    using KnownNames = std::unordered_map<std::string, Known, Hash, std::equal_to<>>;

    const Known& knownLocked(std::string_view name) const HY_REQUIRES(mutex_);

    Store& store_;
    mutable Mutex mutex_;
    std::vector<std::string> wanted_ HY_GUARDED_BY(mutex_);
    mutable KnownNames known_ HY_GUARDED_BY(mutex_);
};

class StoreEnergyLedger final : public platform::EnergyLedger {
public:
    // Borrows `store`.
    explicit StoreEnergyLedger(Store& store) : store_(store) {}

    void registerEvent(std::uint32_t clientIdentifier, std::string_view name,
                       const Dictionary& payload) override {
        store_.addEnergyEvent(clientIdentifier, name, payload);
    }

private:
    Store& store_;
};

class StoreMetricService final : public platform::MetricService {
public:
    // Borrows `store`.
    explicit StoreMetricService(Store& store) : store_(store) {}

    void postMetric(std::uint32_t metricIdentifier, std::string message) override {
        store_.addMetric(metricIdentifier, std::move(message));
    }

private:
    Store& store_;
};

} // namespace halyard::linux_
