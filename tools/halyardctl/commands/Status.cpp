// What the daemon says of itself.
#include "commands/Commands.h"
#include "commands/MessageSheet.h"

#include "common/Description.h"
#include "daemon/DaemonClient.h"
#include "output/JsonStream.h"
#include "output/Table.h"

namespace halyard::ctl {
namespace {

// It answers within a second, unless it hangs.
constexpr std::chrono::seconds kPatience{20};

using Align = Table::Column::Align;

// A line for each entry, those of a dictionary inside under its name.
void addAll(Table& table, const std::string& prefix, const Dictionary& entries) {
    for (const Dictionary::Entry& entry : entries) {
        const std::string name = prefix + std::string(entry.key.text());
        if (entry.value.isDictionary()) {
            addAll(table, name + ".", entry.value.dictionary());
        } else if (entry.value.kind() == Value::Kind::Bool) {
            table.add({name, entry.value.boolValue() ? "yes" : "no"});
        } else {
            table.add({name, describe(entry.value)});
        }
    }
}

} // namespace

Exit runStatus(Context& context) {
    const auto socket = context.socketPath();
    if (!socket.ok()) {
        return fail(socket.failure());
    }
    auto daemon = DaemonClient::connect(socket.value(), kPatience);
    if (!daemon.ok()) {
        return fail(daemon.failure());
    }
    const auto status = daemon.value().call(protocol::Method::AdminStatus);
    if (!status.ok()) {
        return fail(status.failure());
    }
    if (context.json) {
        JsonStream json(context.terminal.stream());
        json.beginDocument();
        json.value(status.value());
        json.endDocument();
    } else {
        const auto sheet = messageSheet(status.value().dictionary());
        for (const std::string& line : sheet) {
            context.terminal.write(line + "\n");
        }
        context.terminal.write(sheet.empty() ? "" : "\n");
        Table table(context.terminal, {{"KEY"}, {"VALUE", Align::Left, true}});
        addAll(table, "", status.value().dictionary());
        table.finish("The daemon says nothing of itself.");
    }
    return finish(context, {});
}

} // namespace halyard::ctl
