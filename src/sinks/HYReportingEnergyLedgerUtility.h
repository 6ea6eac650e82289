// Turns haptics messages into events of the energy ledger: how long a haptics
// engine was on, and how long the hardware stayed active for leaked sessions.
//
// Stateless; any thread.
#pragma once

#include <memory>

#include "common/HYReportingUtility.h"
#include "sinks/SessionFacts.h"

namespace halyard {

class HYReportingEnergyLedgerUtility final {
public:
    HYReportingEnergyLedgerUtility() = delete;

    // Takes every message and picks out those that concern it. `message` is null
    // when it is absent. Requires a session.
    static void handleEvent(const Dictionary* message, AudioEventCategory category,
                            AudioEventType type,
                            const std::shared_ptr<const SessionFacts>& session);

    // What the ledger learns of an engine's on-time. A missing name or time
    // stamp is logged and left out. Requires "EngineOnTime" in the message.
    static Dictionary engineOnPayload(const Dictionary& message, const Value& applicationName);
};

} // namespace halyard
