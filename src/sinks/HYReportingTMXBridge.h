// Posts the audio issues that clients detect to the diagnostics metric service.
//
// Stateless; any thread.
#pragma once

#include <memory>

#include "common/HYReportingUtility.h"
#include "sinks/AudioIssueDetected.h"
#include "sinks/SessionFacts.h"

namespace halyard {

class HYReportingTMXBridge final {
public:
    HYReportingTMXBridge() = delete;

    // Takes every message and picks out those that concern it. `message` is null
    // when it is absent. An issue is posted even when some of its keys are
    // missing; each of those is logged.
    static void handleEvent(const Dictionary* message, AudioEventCategory category,
                            AudioEventType type,
                            const std::shared_ptr<const SessionFacts>& session);

    static tmxmetrics::AudioIssueDetected issueOf(const Dictionary& message);
};

} // namespace halyard
