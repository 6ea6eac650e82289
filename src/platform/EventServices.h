// The services behind the event sinks. Every operation may be called from any
// thread, returns at once and reports nothing back: an implementation queues
// what it cannot do at once, bounds its queue and counts what it drops.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

#include "common/Value.h"

namespace halyard::platform {

class AnalyticsService {
public:
    using PayloadBuilder = std::function<Dictionary()>;

    virtual ~AnalyticsService() = default;
    // Whether anybody wants events of this name now.
    virtual bool isEventUsed(std::string_view name) const = 0;
    // Calls `builder` at most once, on any thread, now or later.
    virtual void sendEventLazily(std::string_view name, PayloadBuilder builder) = 0;
};

class EnergyLedger {
public:
    virtual ~EnergyLedger() = default;
    virtual void registerEvent(std::uint32_t clientIdentifier, std::string_view name,
                               const Dictionary& payload) = 0;
};

class MetricService {
public:
    virtual ~MetricService() = default;
    // `message` is a protocol-buffers encoding.
    virtual void postMetric(std::uint32_t metricIdentifier, std::string message) = 0;
};

} // namespace halyard::platform
