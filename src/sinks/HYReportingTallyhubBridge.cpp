#include "sinks/HYReportingTallyhubBridge.h"

#include <fmt/format.h>
#include <string_view>
#include <utility>

#include "common/KeyTable.h"
#include "platform/Platform.h"

namespace halyard {
namespace {

// Holds the longest name without an allocation.
using NameBuffer = fmt::basic_memory_buffer<char, 128>;

std::string_view eventName(NameBuffer& buffer, std::string_view subject,
                           AudioEventCategory category, AudioEventType type) {
    const CategoryName parts = categoryName(category);
    for (const std::string_view part :
         {std::string_view("com.kestrel."), subject, std::string_view("."), parts.group,
          parts.separator, parts.name, std::string_view("."), HYReportingUtilityTypeString(type)}) {
        buffer.append(part);
    }
    return {buffer.data(), buffer.size()};
}

void offer(std::string_view name, const Dictionary& message,
           const std::shared_ptr<const SessionFacts>& session) {
    platform::AnalyticsService& analytics = *platform::current().analytics;
    if (!analytics.isEventUsed(name)) {
        return;
    }
    analytics.sendEventLazily(name, [message, session] {
        return HYReportingTallyhubBridge::payload(
            message, HYReportingUtilityRetrieveAppName(session->configuration()));
    });
}

} // namespace

void HYReportingTallyhubBridge::handleEvent(const Dictionary* message, AudioEventCategory category,
                                            AudioEventType type,
                                            const std::shared_ptr<const SessionFacts>& session) {
    if (message == nullptr) {
        return;
    }
    const std::string_view service =
        HYReportingUtilityGenerateServiceNameFromServiceType(session->serviceType());
    for (const std::string_view subject : {std::string_view("halyard"), service}) {
        NameBuffer buffer;
        offer(eventName(buffer, subject, category, type), *message, session);
    }
}

platform::EventPayload HYReportingTallyhubBridge::payload(Dictionary message,
                                                          Value applicationName) {
    static const Value key = KeyTable().intern("HostApplicationDisplayID");
    return {std::move(message), key, std::move(applicationName)};
}

} // namespace halyard
