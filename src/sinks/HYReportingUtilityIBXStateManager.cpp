#include "sinks/HYReportingUtilityIBXStateManager.h"

#include "platform/IncidentReporter.h"
#include "platform/Log.h"
#include "platform/Platform.h"

namespace halyard {

void HYReportingUtilityIBXStateManager::handleEvent(
    const Dictionary* message, AudioEventCategory category, AudioEventType type,
    const std::shared_ptr<const SessionFacts>& session,
    const std::optional<std::string>& processName) {
    if (message == nullptr || type != kAudioEventTypeEnergyLedger ||
        !message->contains("Haptic_Active_Hardware_Time_Seconds") || *message == messageCache_) {
        return;
    }
    const Value process = processName ? Value(*processName) : Value();
    if (leakedHapticsSessionCounter_ != 1) {
        messageCache_ = *message;
        HY_LOG_INFO(HYReportingIBXLogCategory, "Incrementing IBX counter. {}", process);
        ++leakedHapticsSessionCounter_;
        return;
    }
    requestSnapshot(category, session->serviceType(), process);
    // Kept: this report is not cached, so the next one begins a new pair.
    leakedHapticsSessionCounter_ = 0;
    messageCache_ = Dictionary();
}

void HYReportingUtilityIBXStateManager::requestSnapshot(AudioEventCategory category,
                                                        AudioServiceType serviceType,
                                                        const Value& processName) {
    HY_LOG_INFO(HYReportingIBXLogCategory, "Getting snapshot with Incident Reporter");
    const Dictionary signature{
        {platform::kIncidentSignatureDomain, "AudioAnalytics"},
        {platform::kIncidentSignatureType,
         HYReportingUtilityGenerateServiceNameFromServiceType(serviceType)},
        {platform::kIncidentSignatureSubType, HYReportingUtilityCategoryString(category)},
        {platform::kIncidentSignatureSubtypeContext,
         HYReportingUtilityTypeString(kAudioEventTypeEnergyLedger)},
        {platform::kIncidentSignatureDetectedProcess, processName}};
    platform::current().incidentReporter->snapshotWithSignature(
        signature, 0, Value(), Value(), [](const Dictionary& response) {
            HY_LOG_INFO(HYReportingIBXLogCategory, "Response from incidentReporter : {}",
                        Value(response));
        });
}

} // namespace halyard
