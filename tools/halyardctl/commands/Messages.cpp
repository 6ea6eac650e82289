// Every message that was kept, in the order of delivery.
#include "commands/Commands.h"
#include "commands/Listing.h"
#include "commands/MessageRows.h"

namespace halyard::ctl {
namespace {

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
    return reader.forEach({"upload_message", kMessageColumns, context.range.condition("time"),
                           ids.value().after, ids.value().upTo},
                          [&](const reading::Row& row) {
                              const Message message = messageIn(row, directory, fields);
                              return !context.wantsApplication(message.names.application) ||
                                     take(message);
                          });
}

void writeElement(JsonStream& json, const Message& message) {
    json.beginElement();
    writeMessage(json, message);
}

} // namespace

Exit runMessages(Context& context) {
    if (context.json) {
        return listAsJson<Message>(context, forEach, writeElement);
    }
    return listAsTable<Message>(context, forEach, messageColumns(), messageCells, "No messages.");
}

} // namespace halyard::ctl
