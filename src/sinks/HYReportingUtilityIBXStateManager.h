// Watches for reports of leaked haptics sessions and asks for a diagnostic
// snapshot on every second distinct one: a leak that repeats is worth the cost,
// a single report is not. Exists on internal builds only.
//
// Not thread-safe: runs on the service work queue.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "common/HYReportingUtility.h"
#include "sinks/SessionFacts.h"

namespace halyard {

class HYReportingUtilityIBXStateManager final {
public:
    // Takes every message and picks out those that concern it. `message` is null
    // when it is absent; `processName` is the sender's, if known. Requires a
    // session. The snapshot is not awaited.
    void handleEvent(const Dictionary* message, AudioEventCategory category, AudioEventType type,
                     const std::shared_ptr<const SessionFacts>& session,
                     const std::optional<std::string>& processName);

    // Distinct reports since the last snapshot.
    std::uint64_t leakedHapticsSessionCounter() const { return leakedHapticsSessionCounter_; }
    // The last report that was counted; empty after a snapshot.
    const Dictionary& messageCache() const { return messageCache_; }

private:
    static void requestSnapshot(AudioEventCategory category, AudioServiceType serviceType,
                                const Value& processName);

    std::uint64_t leakedHapticsSessionCounter_ = 0;
    Dictionary messageCache_;
};

} // namespace halyard
