// The services behind the event sinks. Every operation may be called from any
// thread, returns at once and reports nothing back: an implementation queues
// what it cannot do at once, bounds its queue and counts what it drops.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <utility>

#include "common/Value.h"

namespace halyard::platform {

// What an event carries: a message with one entry set on top of it, or a dictionary as it
// is. The two are put together only for who wants them so: most payloads are written out.
struct EventPayload {
    EventPayload() = default;
    EventPayload(Dictionary whole) : message(std::move(whole)) {}
    EventPayload(Dictionary below, Value key, Value value)
        : message(std::move(below)), top{std::move(key), std::move(value)} {}

    Dictionary whole() const {
        Dictionary result = message;
        if (!top.key.isNone()) {
            result.set(top.key, top.value);
        }
        return result;
    }

    Dictionary message;
    Dictionary::Entry top; // No key: there is none. No value: its key is left out.
};

class AnalyticsService {
public:
    using PayloadBuilder = std::function<EventPayload()>;

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
