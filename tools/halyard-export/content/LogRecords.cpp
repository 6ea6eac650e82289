#include "content/LogRecords.h"

#include <algorithm>
#include <cctype>
#include <fmt/format.h>

#include "common/HYReportingUtility.h"

namespace halyard::exporting {
namespace {

using namespace otlp;

enum Table : std::size_t { kMessages, kIncidents, kEnergy, kEvents };

// Of upload_message.
enum Column : int { kID, kSession, kSessionInfo, kUserInfo, kCategory, kType, kPayload, kTime };

constexpr int kTimeColumn[] = {kTime, 3, 4, 3};

struct Severity {
    int number;
    std::string_view text;
};
constexpr Severity kSeverities[] = {
    {log_record::kInfo, "INFO"}, {log_record::kWarn, "WARN"}, {log_record::kError, "ERROR"}};

int severityOf(std::uint32_t category, std::uint16_t type) {
    if (category == kAudioEventCategoryError) {
        return log_record::kError;
    }
    return type == kAudioEventTypeIssueDetector ? log_record::kWarn : log_record::kInfo;
}

} // namespace

double timeOf(std::size_t table, const reading::Row& row) {
    return row.real(kTimeColumn[table]);
}

std::string eventName(std::uint32_t category, std::uint16_t type) {
    std::string name = fmt::format("halyard.{}.{}", HYReportingUtilityCategoryString(category),
                                   HYReportingUtilityTypeString(type));
    std::transform(name.begin(), name.end(), name.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return name;
}

void LogRecords::begin(std::string_view event, int severity, std::size_t table,
                       const reading::Row& row) {
    const double time = timeOf(table, row);
    const auto* const level =
        std::find_if(std::begin(kSeverities), std::end(kSeverities),
                     [severity](const Severity& each) { return each.number == severity; });
    Writer writer(record_);
    writer.add_fixed64(log_record::kTime, nanoseconds(time));
    writer.add_enum(log_record::kSeverityNumber, severity);
    writer.add_string(log_record::kSeverityText, level->text.data(), level->text.size());
    writer.add_fixed64(log_record::kObservedTime, nanoseconds(time));
    writer.add_string(log_record::kEventName, event.data(), event.size());
    otlp::addText(writer, log_record::kAttributes, "log.record.uid",
                  identity_.recordOf(kLogTables[table].name, row.integer(kID), time));
}

const std::string& LogRecords::recordOf(reading::StoreReader& reader, std::size_t table,
                                        const reading::Row& row) {
    record_.clear();
    payload_.setNames({});
    switch (table) {
    case kMessages:
        addMessage(reader, row);
        break;
    case kIncidents:
        addIncident(row);
        break;
    case kEnergy:
        addNamedEvent("halyard.energy", table, row);
        break;
    default:
        addNamedEvent("halyard.event", table, row);
        break;
    }
    return record_;
}

void LogRecords::addMessage(reading::StoreReader& reader, const reading::Row& row) {
    const auto category = static_cast<std::uint32_t>(row.integer(kCategory));
    const auto type = static_cast<std::uint16_t>(row.integer(kType));
    begin(eventName(category, type), severityOf(category, type), kMessages, row);
    const auto session = row.maybeInteger(kSession);
    const BookedSession* const booked = session ? sessions_.find(reader, *session) : nullptr;
    if (booked != nullptr) {
        Writer writer(record_);
        const auto trace = viewOf(booked->trace);
        const auto span = viewOf(booked->span);
        writer.add_bytes(log_record::kTraceID, trace.data(), trace.size());
        writer.add_bytes(log_record::kSpanID, span.data(), span.size());
        // A session's names are from when it was opened.
        addNames(booked->names, booked->userInfo, consent_.isGivenAt(booked->opened));
    } else if (!session) {
        addNames(reading::namesIn(fields_, row.text(kSessionInfo), row.text(kUserInfo)),
                 row.text(kUserInfo), true);
    }
    Writer writer(record_);
    payload_.addAll(writer, log_record::kAttributes, row.text(kPayload));
}

void LogRecords::addNames(const reading::SessionNames& names, std::string_view userInfo,
                          bool leave) {
    payload_.setNames(omission_.omitsApplication() ? applicationNames(names, userInfo)
                                                   : std::vector<std::string>());
    if (!leave) {
        return;
    }
    Writer writer(record_);
    if (names.application) {
        payload_.addText(writer, log_record::kAttributes, "application", *names.application);
    }
    if (names.service) {
        payload_.addText(writer, log_record::kAttributes, "service", *names.service);
    }
}

void LogRecords::addIncident(const reading::Row& row) {
    constexpr int kSignature = 1;
    begin("halyard.incident", log_record::kError, kIncidents, row);
    Writer writer(record_);
    payload_.addAll(writer, log_record::kAttributes, row.text(kSignature));
}

void LogRecords::addNamedEvent(std::string_view event, std::size_t table, const reading::Row& row) {
    const bool isEnergy = table == kEnergy;
    const int name = isEnergy ? 2 : 1;
    begin(event, log_record::kInfo, table, row);
    if (omission_.omitsApplication()) {
        payload_.setNames(applicationNames({}, row.text(name + 1)));
    }
    Writer writer(record_);
    if (isEnergy && !omission_.omits("client")) {
        otlp::addInteger(writer, log_record::kAttributes, "halyard.client", row.integer(1));
    }
    payload_.addText(writer, log_record::kAttributes, "name", row.text(name));
    payload_.addAll(writer, log_record::kAttributes, row.text(name + 1));
}

} // namespace halyard::exporting
