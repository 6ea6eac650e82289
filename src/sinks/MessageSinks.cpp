#include "sinks/MessageSinks.h"

#include "platform/HYReportingUtilityDevice.h"
#include "sinks/HYReportingEnergyLedgerUtility.h"
#include "sinks/HYReportingTMXBridge.h"
#include "sinks/HYReportingTallyhubBridge.h"

namespace halyard {

MessageSinks::MessageSinks()
    : issueCapture_(HYReportingUtilityIsInternalBuild()
                        ? std::make_unique<HYReportingUtilityIBXStateManager>()
                        : nullptr) {}

void MessageSinks::handleEvent(const Message& message,
                               const std::shared_ptr<const SessionFacts>& session,
                               const std::optional<std::string>& processName) {
    const auto& [payload, category, type] = message;
    HYReportingTallyhubBridge::handleEvent(&payload, category, type, session);
    HYReportingEnergyLedgerUtility::handleEvent(&payload, category, type, session);
    HYReportingTMXBridge::handleEvent(&payload, category, type, session);
    captureIssue(message, session, processName);
}

void MessageSinks::captureIssue(const Message& message,
                                const std::shared_ptr<const SessionFacts>& session,
                                const std::optional<std::string>& processName) {
    if (issueCapture_ != nullptr && HYReportingUtilityIsInternalBuild()) {
        issueCapture_->handleEvent(&message.payload, message.category, message.type, session,
                                   processName);
    }
}

} // namespace halyard
