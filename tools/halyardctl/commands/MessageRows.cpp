#include "commands/MessageRows.h"

#include "common/HYReportingUtility.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

using Align = Table::Column::Align;

enum Column : int { kID, kSession, kSessionInfo, kUserInfo, kCategory, kType, kPayload, kTime };

} // namespace

Message messageIn(const reading::Row& row, reading::SessionDirectory& directory,
                  reading::JsonFields& fields) {
    Message message;
    message.id = row.integer(kID);
    message.session = row.maybeInteger(kSession);
    message.names = message.session ? directory.namesOf(*message.session)
                                    : namesIn(fields, row.text(kSessionInfo), row.text(kUserInfo));
    message.category =
        HYReportingUtilityCategoryString(static_cast<AudioEventCategory>(row.integer(kCategory)));
    message.type = HYReportingUtilityTypeString(static_cast<AudioEventType>(row.integer(kType)));
    message.time = row.maybeReal(kTime);
    message.payload = row.text(kPayload);
    return message;
}

void writeMessage(JsonStream& json, const Message& message) {
    json.beginObject();
    json.field("id", std::optional(message.id));
    json.field("session", message.session);
    json.field("application", message.names.application);
    json.field("service", message.names.service);
    json.field("category", std::string_view(message.category));
    json.field("type", message.type);
    json.field("time", message.time);
    json.jsonField("payload", message.payload);
    json.endObject();
}

std::vector<Table::Column> messageColumns() {
    return {{"ID", Align::Right, false, 3},
            {"TIME"},
            {"SESSION", Align::Right, false, 2},
            {"APPLICATION", Align::Left, true},
            {"SERVICE", Align::Left, true, 1},
            {"CATEGORY"},
            {"TYPE"},
            {"PAYLOAD", Align::Left, true}};
}

std::vector<Cell> messageCells(const Message& message) {
    return {std::to_string(message.id),
            dayAndTime(message.time),
            message.session ? std::to_string(*message.session) : "",
            message.names.application.value_or(""),
            message.names.service.value_or(""),
            message.category,
            message.type,
            message.payload};
}

} // namespace halyard::ctl
