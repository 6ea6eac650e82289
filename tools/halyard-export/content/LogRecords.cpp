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

// Clients make them up.
constexpr std::size_t kMostEvents = 1024;
constexpr int kTimeColumn[] = {kTime, 3, 4, 3};

struct Severity {
    int number;
    std::string_view text;
};
constexpr Severity kSeverities[] = {
    {log_record::kInfo, "INFO"}, {log_record::kWarn, "WARN"}, {log_record::kError, "ERROR"}};

std::uint64_t kindOf(std::uint32_t category, std::uint16_t type) {
    return (std::uint64_t{category} << 16U) | type;
}

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

std::string_view LogRecords::eventOf(std::uint32_t category, std::uint16_t type) {
    const std::uint64_t key = kindOf(category, type);
    auto found = events_.find(key);
    if (found == events_.end()) {
        if (events_.size() >= kMostEvents) {
            events_.clear();
        }
        found = events_.emplace(key, eventName(category, type)).first;
    }
    return found->second;
}

void LogRecords::forget() {
    sessions_.forget();
    forgetSession();
}

void LogRecords::forgetSession() {
    session_.reset();
    opened_.reset();
}

void LogRecords::begin(std::string_view event, int severity) {
    const auto* const level =
        std::find_if(std::begin(kSeverities), std::end(kSeverities),
                     [severity](const Severity& each) { return each.number == severity; });
    event_ = event;
    record_.clear();
    attributes_.clear();
    Writer writer(record_);
    writer.add_string(log_record::kEventName, event.data(), event.size());
    writer.add_enum(log_record::kSeverityNumber, severity);
    writer.add_string(log_record::kSeverityText, level->text.data(), level->text.size());
}

void LogRecords::end(std::size_t table, const reading::Row& row) {
    const double time = timeOf(table, row);
    uid_.clear();
    identity_.appendRecord(uid_, kLogTables[table].name, row.integer(kID), opened_.value_or(time));
    record_ += attributes_.texts;
    appendAttribute(record_, log_record::kAttributes, {}, "log.record.uid", AnyValue::ofText(uid_));
    Writer writer(record_);
    writer.add_fixed64(log_record::kTime, nanoseconds(time));
    record_ += attributes_.numbers;
}

LogRecords::Record LogRecords::recordOf(reading::StoreReader& reader, std::size_t table,
                                        const reading::Row& row) {
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
    end(table, row);
    return {event_, record_};
}

void LogRecords::addMessage(reading::StoreReader& reader, const reading::Row& row) {
    const auto category = static_cast<std::uint32_t>(row.integer(kCategory));
    const auto type = static_cast<std::uint16_t>(row.integer(kType));
    begin(eventOf(category, type), severityOf(category, type));
    const auto session = row.maybeInteger(kSession);
    if (session && session != session_) {
        session_ = session;
        sessionBytes_.clear();
        const BookedSession* const booked = sessions_.find(reader, *session);
        opened_ = booked != nullptr ? std::optional(booked->opened) : std::nullopt;
        booked != nullptr ? addSession(*booked) : payload_.setNames({});
    } else if (!session) {
        forgetSession();
        const auto names = reading::namesIn(fields_, row.text(kSessionInfo), row.text(kUserInfo));
        setNames(names, row.text(kUserInfo));
        addNames(record_, names);
    }
    if (session) {
        record_ += sessionBytes_;
    }
    payload_.addOfKind(attributes_, log_record::kAttributes, kindOf(category, type),
                       row.text(kPayload));
}

void LogRecords::addSession(const BookedSession& session) {
    setNames(session.names, session.userInfo);
    Writer writer(sessionBytes_);
    const auto trace = viewOf(session.trace);
    const auto span = viewOf(session.span);
    writer.add_bytes(log_record::kTraceID, trace.data(), trace.size());
    writer.add_bytes(log_record::kSpanID, span.data(), span.size());
    // A session's names are from when it was opened.
    if (consent_.isGivenAt(session.opened)) {
        addNames(sessionBytes_, session.names);
    }
}

void LogRecords::setNames(const reading::SessionNames& names, std::string_view json) {
    payload_.setNames(omission_.omitsApplication() ? applicationNames(names, json)
                                                   : std::vector<std::string>());
}

void LogRecords::addNames(std::string& bytes, const reading::SessionNames& names) {
    if (names.application) {
        payload_.addText(bytes, log_record::kAttributes, "application", *names.application);
    }
    if (names.service) {
        payload_.addText(bytes, log_record::kAttributes, "service", *names.service);
    }
}

void LogRecords::addIncident(const reading::Row& row) {
    constexpr int kSignature = 1;
    begin("halyard.incident", log_record::kError);
    forgetSession();
    payload_.setNames({});
    payload_.add(attributes_, log_record::kAttributes, row.text(kSignature));
}

void LogRecords::addNamedEvent(std::string_view event, std::size_t table, const reading::Row& row) {
    const bool isEnergy = table == kEnergy;
    const int name = isEnergy ? 2 : 1;
    begin(event, log_record::kInfo);
    forgetSession();
    setNames({}, row.text(name + 1));
    if (isEnergy && !omission_.omits("client")) {
        appendAttribute(attributes_.numbers, log_record::kAttributes, kPrefix, "client",
                        AnyValue::ofInteger(row.integer(1)));
    }
    payload_.addText(attributes_.texts, log_record::kAttributes, "name", row.text(name));
    payload_.add(attributes_, log_record::kAttributes, row.text(name + 1));
}

} // namespace halyard::exporting
