// Whether the store is sound, and what saves the rest when it is not.
#include "reading/StoreCheck.h"

#include <fmt/format.h>

#include "commands/Commands.h"
#include "output/JsonStream.h"
#include "output/Progress.h"
#include "output/Sanitise.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

using reading::StoreCheck;
using reading::StoreRepair;

void write(JsonStream& json, const StoreCheck& check, const std::optional<StoreRepair>& repair) {
    json.beginDocument();
    json.beginObject();
    json.key("ok");
    json.boolean(check.ok);
    json.field("schema", check.schema);
    json.key("integrity");
    json.beginArray();
    for (const std::string& text : check.integrity) {
        json.text(text);
    }
    json.endArray();
    json.key("rows");
    json.beginObject();
    for (const auto& [table, rows] : check.rows) {
        json.field(table, rows);
    }
    json.endObject();
    json.field("unclosed_sessions", check.unclosedSessions);
    json.countField("bytes", check.bytes);
    if (repair) {
        json.field("set_aside", std::string_view(repair->aside.filename().native()));
        json.countField("rows_saved", repair->rows);
        json.countField("places_lost", repair->places);
    }
    json.endObject();
    json.endDocument();
}

std::string rowsIn(const StoreCheck& check) {
    std::string text;
    for (const auto& [table, rows] : check.rows) {
        text += fmt::format("  {:<16} {:>10}\n", table, rows ? std::to_string(*rows) : "?");
    }
    return text;
}

void tell(Terminal& terminal, const StoreCheck& check, const std::filesystem::path& path) {
    const std::string name = sanitised(path.native());
    terminal.write(check.ok ? coloured(terminal, Colour::Green, name + " is sound.") + "\n"
                            : coloured(terminal, Colour::Red, name + " is damaged:") + "\n");
    for (const std::string& text : check.integrity) {
        terminal.write("  " + sanitised(text) + "\n");
    }
    if (check.schema) {
        terminal.write(
            fmt::format("Schema {}, {}, {}.\n", *check.schema, sizeOf(check.bytes),
                        counted(static_cast<std::uint64_t>(check.unclosedSessions.value_or(0)),
                                "session not closed", "sessions not closed")));
    }
    terminal.write(rowsIn(check));
    if (!check.ok) {
        terminal.write("Stop the daemon and run \"halyardctl check --repair\" to save what can be "
                       "read.\n");
    }
}

Outcome<StoreCheck> look(const std::filesystem::path& path) {
    Progress progress("Checking");
    return reading::checkStore(path, [&progress](double share) { progress.update(share); });
}

Exit show(Context& context, const std::filesystem::path& path, const StoreCheck& check,
          const std::optional<StoreRepair>& repair) {
    if (context.json) {
        JsonStream json(context.terminal.stream());
        write(json, check, repair);
    } else {
        if (repair) {
            context.terminal.write(fmt::format("Set aside as {}; saved {}, could not read in {}.\n",
                                               sanitised(repair->aside.filename().native()),
                                               counted(repair->rows, "row", "rows"),
                                               counted(repair->places, "place", "places")));
        }
        tell(context.terminal, check, path);
    }
    const Exit ended = finish(context, {});
    return ended == Exit::Done && !check.ok ? Exit::Failed : ended;
}

} // namespace

Exit runCheck(Context& context, bool repair) {
    const auto path = context.storePath();
    if (!path.ok()) {
        return fail(path.failure());
    }
    auto check = look(path.value());
    if (!check.ok()) {
        return fail(check.failure());
    }
    std::optional<StoreRepair> repaired;
    if (repair && !check.value().ok) {
        const auto done = reading::repairStore(path.value());
        if (!done.ok()) {
            return fail(done.failure());
        }
        repaired = done.value();
        check = look(path.value());
        if (!check.ok()) {
            return fail(check.failure());
        }
    }
    return show(context, path.value(), check.value(), repaired);
}

} // namespace halyard::ctl
