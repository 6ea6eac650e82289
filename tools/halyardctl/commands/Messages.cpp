// Every message that was kept, in the order of delivery.
#include <fmt/format.h>

#include "commands/Commands.h"
#include "commands/Listing.h"
#include "common/HYReportingUtility.h"
#include "output/Words.h"
#include "reading/Sessions.h"

namespace halyard::ctl {
namespace {

using Align = Table::Column::Align;

// Borrows the payload from its row.
struct Message {
    std::int64_t id = 0;
    std::optional<std::int64_t> session;
    reading::SessionNames names;
    std::string category;
    std::string_view type;
    std::optional<double> time;
    std::string_view payload;
};

enum Column : int { kID, kSession, kSessionInfo, kUserInfo, kCategory, kType, kPayload, kTime };

void write(JsonStream& json, const Message& message) {
    json.beginElement();
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

std::vector<Cell> cellsOf(const Message& message) {
    return {std::to_string(message.id),
            dayAndTime(message.time),
            message.session ? std::to_string(*message.session) : "",
            message.names.application.value_or(""),
            message.names.service.value_or(""),
            message.category,
            message.type,
            message.payload};
}

Outcome<void> forEach(Context& context, const std::function<bool(const Message&)>& take) {
    auto opened = context.openStore();
    if (!opened.ok()) {
        return opened.failure();
    }
    reading::StoreReader& reader = opened.value();
    const auto ids = reader.idsIn(context.range, "upload_message", "time");
    if (!ids.ok()) {
        return ids.failure();
    }
    reading::SessionDirectory directory(reader);
    reading::JsonFields fields;
    return reader.forEach(
        {"upload_message", "upload_session, session_info, user_info, category, type, payload, time",
         context.range.condition("time"), ids.value().after, ids.value().upTo},
        [&](const reading::Row& row) {
            Message message;
            message.session = row.maybeInteger(kSession);
            message.names = message.session
                                ? directory.namesOf(*message.session)
                                : namesIn(fields, row.text(kSessionInfo), row.text(kUserInfo));
            if (!context.wantsApplication(message.names.application)) {
                return true;
            }
            message.id = row.integer(kID);
            message.category = HYReportingUtilityCategoryString(
                static_cast<AudioEventCategory>(row.integer(kCategory)));
            message.type =
                HYReportingUtilityTypeString(static_cast<AudioEventType>(row.integer(kType)));
            message.time = row.maybeReal(kTime);
            message.payload = row.text(kPayload);
            return take(message);
        });
}

} // namespace

Exit runMessages(Context& context) {
    if (context.json) {
        return listAsJson<Message>(context, forEach, write);
    }
    const std::vector<Table::Column> columns = {{"ID", Align::Right},
                                                {"TIME"},
                                                {"SESSION", Align::Right},
                                                {"APPLICATION", Align::Left, true},
                                                {"SERVICE", Align::Left, true},
                                                {"CATEGORY"},
                                                {"TYPE"},
                                                {"PAYLOAD", Align::Left, true}};
    return listAsTable<Message>(context, forEach, columns, cellsOf, "No messages.");
}

} // namespace halyard::ctl
