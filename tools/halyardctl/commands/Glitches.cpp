// The glitches, a sentence each, or summed up.
#include "reading/Glitches.h"

#include <fmt/format.h>

#include "commands/Commands.h"
#include "commands/GlitchWords.h"
#include "commands/Listing.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

using Align = Table::Column::Align;
using reading::Glitch;
using reading::GlitchKey;
using reading::GlitchTally;

Outcome<void> forEach(Context& context, const std::function<bool(const Glitch&)>& take) {
    auto reader = context.openStore();
    if (!reader.ok()) {
        return reader.failure();
    }
    return forEachGlitch(reader.value(), context.range, [&](const Glitch& glitch) {
        return !context.wantsApplication(glitch.application) || take(glitch);
    });
}

void writeElement(JsonStream& json, const Glitch& glitch) {
    json.beginElement();
    writeGlitch(json, glitch);
}

Exit tellEach(Context& context) {
    context.terminal.page();
    bool any = false;
    const Outcome<void> read = forEach(context, [&](const Glitch& glitch) {
        any = true;
        context.terminal.write(sentenceOf(context.terminal, glitch, context.now) + "\n");
        return !context.terminal.isBroken();
    });
    if (read.ok() && !any) {
        context.terminal.write("No glitches.\n");
    }
    return finish(context, read);
}

std::string_view titleOf(GlitchKey by) {
    switch (by) {
    case GlitchKey::Application:
        return "APPLICATION";
    case GlitchKey::Device:
        return "DEVICE";
    case GlitchKey::Cause:
        return "CAUSE";
    case GlitchKey::Hour:
        break;
    }
    return "HOUR";
}

std::string nameOf(const GlitchTally::Entry& entry, GlitchKey by) {
    if (entry.isOthers) {
        return "(others)";
    }
    return by == GlitchKey::Hour ? dayAndTime(entry.hour) : entry.name.value_or("");
}

void write(JsonStream& json, const GlitchTally::Entry& entry, GlitchKey by) {
    json.beginElement();
    json.beginObject();
    if (by == GlitchKey::Hour && !entry.isOthers) {
        json.field("hour", std::optional(entry.hour));
    } else {
        const char* const key = by == GlitchKey::Application ? "application"
                                : by == GlitchKey::Device    ? "device"
                                : by == GlitchKey::Cause     ? "cause"
                                                             : "hour";
        json.field(key, entry.name);
    }
    json.countField("glitches", entry.sum.glitches);
    json.field("seconds", std::optional(entry.sum.seconds));
    json.field("longest", std::optional(entry.sum.longest));
    json.endObject();
}

Exit sumUp(Context& context, GlitchKey by) {
    GlitchTally tally(by);
    const Outcome<void> read = forEach(context, [&](const Glitch& glitch) {
        tally.add(glitch);
        return true;
    });
    const auto tell = [&](Context&, const std::function<bool(const GlitchTally::Entry&)>& take) {
        const auto entries = tally.entries();
        for (auto entry = entries.begin(); entry != entries.end() && take(*entry); ++entry) {
        }
        return read;
    };
    if (context.json) {
        return listAsJson<GlitchTally::Entry>(
            context, tell,
            [by](JsonStream& json, const GlitchTally::Entry& entry) { write(json, entry, by); });
    }
    const std::vector<Table::Column> columns = {{std::string(titleOf(by)), Align::Left, true},
                                                {"GLITCHES", Align::Right},
                                                {"SILENT", Align::Right},
                                                {"LONGEST", Align::Right}};
    return listAsTable<GlitchTally::Entry>(
        context, tell, columns,
        [by](const GlitchTally::Entry& entry) {
            return std::vector<Cell>{nameOf(entry, by), std::to_string(entry.sum.glitches),
                                     lengthOfTime(entry.sum.seconds),
                                     lengthOfTime(entry.sum.longest)};
        },
        "No glitches.");
}

} // namespace

Exit runGlitches(Context& context, std::optional<GlitchKey> by) {
    if (by) {
        return sumUp(context, *by);
    }
    return context.json ? listAsJson<Glitch>(context, forEach, writeElement) : tellEach(context);
}

void writeGlitch(JsonStream& json, const Glitch& glitch) {
    json.beginObject();
    json.field("session", glitch.session);
    json.field("application", glitch.application);
    json.field("direction", nameOf(glitch.direction));
    json.field("node", glitch.node);
    json.field("device", glitch.device);
    json.field("start", glitch.start);
    json.field("seconds", glitch.seconds);
    json.field("cycles", glitch.cycles);
    json.field("cause", glitch.cause);
    json.key("evidence");
    glitch.evidence == nullptr ? json.null() : json.value(*glitch.evidence);
    json.key("inferred");
    json.boolean(glitch.inferred);
    json.endObject();
}

} // namespace halyard::ctl
