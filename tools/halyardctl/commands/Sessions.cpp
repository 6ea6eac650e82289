// The sessions, with what their messages come to.
#include "reading/Sessions.h"

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "commands/Commands.h"
#include "commands/Listing.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

using Align = Table::Column::Align;
using reading::Session;

void write(JsonStream& json, const Session& session) {
    json.beginElement();
    json.beginObject();
    json.field("id", std::optional(session.id));
    json.field("session_id", session.sessionID);
    json.field("application", session.application);
    json.field("service", session.service);
    json.field("direction", nameOf(session.direction));
    json.field("opened", session.opened);
    json.field("closed", session.closed);
    json.field("ended", session.ended);
    json.countField("messages", session.messages);
    json.countField("glitches", session.glitches);
    json.field("played_seconds", std::optional(session.playedSeconds));
    json.key("devices");
    json.beginArray();
    for (const std::string& device : session.devices) {
        json.text(device);
    }
    json.endArray();
    json.endObject();
}

// How long a session was, or that it goes on.
std::string lengthOf(const Session& session) {
    if (!session.closed) {
        return "open";
    }
    return session.opened ? lengthOfTime(*session.closed - *session.opened) : std::string();
}

std::vector<Cell> cellsOf(const Session& session) {
    const char* const direction = nameOf(session.direction);
    return {std::to_string(session.id),
            dayAndTime(session.opened),
            lengthOf(session),
            session.ended.value_or(""),
            session.application.value_or(""),
            session.service.value_or(""),
            direction == nullptr ? "" : direction,
            std::to_string(session.messages),
            {std::to_string(session.glitches), session.glitches > 0 ? Colour::Red : Colour::Plain},
            lengthOfTime(session.playedSeconds),
            fmt::format("{}", fmt::join(session.devices, ", "))};
}

Outcome<void> forEach(Context& context, const std::function<bool(const Session&)>& take) {
    auto reader = context.openStore();
    if (!reader.ok()) {
        return reader.failure();
    }
    return forEachSession(
        reader.value(), context.range, context.now,
        [&](const reading::SessionRow& session) {
            return context.wantsApplication(session.application);
        },
        take);
}

} // namespace

Exit runSessions(Context& context) {
    if (context.json) {
        return listAsJson<Session>(context, forEach, write);
    }
    const std::vector<Table::Column> columns = {{"ID", Align::Right},
                                                {"OPENED"},
                                                {"LENGTH", Align::Right, false, 5},
                                                {"ENDED", Align::Left, false, 2},
                                                {"APPLICATION", Align::Left, true},
                                                {"SERVICE", Align::Left, true, 1},
                                                {"DIRECTION", Align::Left, false, 4},
                                                {"MESSAGES", Align::Right, false, 3},
                                                {"GLITCHES", Align::Right},
                                                {"PLAYED", Align::Right},
                                                {"DEVICES", Align::Left, true, 6}};
    return listAsTable<Session>(context, forEach, columns, cellsOf, "No sessions.");
}

} // namespace halyard::ctl
