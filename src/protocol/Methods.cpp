#include "protocol/Methods.h"

#include "protocol/Wire.h"

namespace halyard::protocol {
namespace {

struct ArgumentEntry {
    std::string_view name;
    std::string_view type;
};

constexpr std::string_view kInt64 = "an integer from -9223372036854775808 to 9223372036854775807";
constexpr std::string_view kUInt16 = "an integer from 0 to 65535";

// In the order of Argument.
constexpr ArgumentEntry kArguments[] = {
    {"reporterID", kInt64},
    {"serviceType", kUInt16},
    {"dictionary", "a dictionary"},
    {"category", "an integer from 0 to 4294967295"},
    {"type", kUInt16},
    {"reporterIDs", "nil or a list of integers"},
    {"name", "a string"},
};

// In the order of Method.
constexpr MethodEntry kMethods[] = {
    {Method::CreateReportingSession, "createReportingSession", 1, {Argument::ReporterID}},
    {Method::SetServiceType, "setServiceType", 2, {Argument::ServiceType, Argument::ReporterID}},
    {Method::GetServiceNameForReporterID, "getServiceNameForReporterID", 1, {Argument::ReporterID}},
    {Method::SetConfiguration, "setConfiguration", 2, {Argument::Dictionary, Argument::ReporterID}},
    {Method::StartReportingSessionForID, "startReportingSessionForID", 1, {Argument::ReporterID}},
    {Method::SendMessage,
     "sendMessage",
     4,
     {Argument::Dictionary, Argument::Category, Argument::Type, Argument::ReporterIDList}},
    {Method::StopReportingSessionForID, "stopReportingSessionForID", 1, {Argument::ReporterID}},
    {Method::DestroyReportingSession, "destroyReportingSession", 1, {Argument::ReporterID}},
    {Method::ReporterIDValid, "reporterIDValid", 1, {Argument::ReporterID}},
    {Method::GetAllReporters, "getAllReporters"},
    {Method::KillService, "killService"},
    {Method::ClientDropped, "client.dropped", 1, {Argument::Dictionary}},
    {Method::AdminPostNotification, "admin.postNotification", 1, {Argument::Name}},
    {Method::AdminFlush, "admin.flush"},
    {Method::AdminStatus, "admin.status"},
    {Method::AdminPurge, "admin.purge"},
};

constexpr bool inOrder() {
    std::size_t index = 0;
    for (const MethodEntry& entry : kMethods) {
        if (static_cast<std::size_t>(entry.method) != index++) {
            return false;
        }
    }
    return true;
}
static_assert(inOrder());

} // namespace

const MethodEntry& methodEntry(Method method) {
    return kMethods[static_cast<std::size_t>(method)];
}

const MethodEntry* findMethod(std::string_view name) {
    for (const MethodEntry& entry : kMethods) {
        if (entry.name == name) {
            return &entry;
        }
    }
    return nullptr;
}

std::string_view argumentName(Argument argument) {
    return kArguments[static_cast<std::size_t>(argument)].name;
}

std::string_view argumentType(Argument argument) {
    return kArguments[static_cast<std::size_t>(argument)].type;
}

std::string_view methodName(Method method) {
    return methodEntry(method).name;
}

} // namespace halyard::protocol
