#include "sinks/HYReportingEnergyLedgerUtility.h"

#include <string_view>

#include "platform/EventServices.h"
#include "platform/Log.h"
#include "platform/Platform.h"

namespace halyard {
namespace {

constexpr std::uint32_t kLedgerClient = 28;

constexpr std::string_view kEngineOnTime = "EngineOnTime";
constexpr std::string_view kActiveHardwareTime = "Haptic_Active_Hardware_Time_Seconds";
constexpr std::string_view kActiveClients = "Active_Clients";

void registerEvent(std::string_view name, const Dictionary& payload) {
    platform::current().energyLedger->registerEvent(kLedgerClient, name, payload);
}

Dictionary leakedSessionPayload(const Dictionary& message) {
    return {{kActiveHardwareTime, message[kActiveHardwareTime]},
            {kActiveClients, message[kActiveClients]}};
}

} // namespace

void HYReportingEnergyLedgerUtility::handleEvent(
    const Dictionary* message, AudioEventCategory, AudioEventType type,
    const std::shared_ptr<const SessionFacts>& session) {
    if (message == nullptr || type != kAudioEventTypeEnergyLedger) {
        return;
    }
    // Kept: a message that has both is about the engine only.
    if (message->contains(kEngineOnTime)) {
        const Value name = HYReportingUtilityRetrieveAppName(session->configuration());
        registerEvent("Flexmedia_Haptics", engineOnPayload(*message, name));
    } else if (message->contains(kActiveHardwareTime)) {
        registerEvent("LeakedHapticsSessionInfo", leakedSessionPayload(*message));
    }
}

Dictionary HYReportingEnergyLedgerUtility::engineOnPayload(const Dictionary& message,
                                                           const Value& applicationName) {
    const Value& timestamp = message["hyreporting_timestamp"];
    if (applicationName.isNone()) {
        HY_LOG_ERROR(HYReportingEnergyLedgerCategory, "failed to get app name for energyledger");
    }
    if (timestamp.isNone()) {
        HY_LOG_ERROR(HYReportingEnergyLedgerCategory,
                     "failed to get HYReporting timestamp for energyledger");
    }
    return {{"EngineOnDuration", message[kEngineOnTime]},
            {"ApplicationName", applicationName},
            {"TimestampEnd", timestamp}};
}

} // namespace halyard
