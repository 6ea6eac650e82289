// How the device's sound is doing today, and where to read on.
#include <fmt/format.h>

#include "commands/Commands.h"
#include "commands/GlitchWords.h"
#include "daemon/DaemonClient.h"
#include "output/JsonStream.h"
#include "output/Sanitise.h"
#include "output/TimeArgument.h"
#include "output/Words.h"
#include "reading/Digest.h"
#include "reading/StoreCheck.h"

namespace halyard::ctl {
namespace {

using reading::Digest;
using reading::StoreReader;

// Somebody waits for five lines.
constexpr std::chrono::seconds kPatience{5};
// As the daemon has it.
constexpr std::uint64_t kCheckedBytes = 64 * 1024 * 1024;
constexpr const char* kMore =
    "\nMore: halyardctl sessions, glitches, messages, events, energy, incidents, metrics, watch,\n"
    "status, check; report and timeline make a page and a file to look at. Each has --help; most\n"
    "take --since and --until, and --json for programs.\n";

struct DaemonFacts {
    bool runs = false;
    std::optional<Dictionary> status; // none for who may not ask
    std::string complaint;            // why nothing more is known; may be empty
};

struct StoreFacts {
    std::optional<Digest> digest;
    std::uint64_t bytes = 0;
    bool isChecked = false; // every page of it
    std::string complaint;  // empty when it reads well
    Exit exit = Exit::Done;
};

DaemonFacts askDaemon(const Context& context) {
    DaemonFacts facts;
    const auto socket = context.socketPath();
    auto daemon = socket.ok() ? DaemonClient::connect(socket.value(), kPatience)
                              : Outcome<DaemonClient>(socket.failure());
    if (!daemon.ok()) {
        facts.complaint = daemon.failure().exit == Exit::NothingThere
                              ? "does not run: start it with systemctl start halyardd.socket"
                              : daemon.failure().text;
        return facts;
    }
    facts.runs = true;
    const auto status = daemon.value().call(protocol::Method::AdminStatus);
    if (status.ok()) {
        facts.status = status.value().dictionary();
    } else if (status.failure().exit != Exit::NotAllowed) {
        facts.complaint = status.failure().text;
    }
    return facts;
}

StoreFacts readStore(const Context& context, const reading::TimeRange& today) {
    StoreFacts facts;
    const auto take = [&facts](const Trouble& trouble) {
        facts.complaint = trouble.text;
        facts.exit = trouble.exit;
        return facts;
    };
    auto reader = context.openStore();
    if (!reader.ok()) {
        return take(reader.failure());
    }
    facts.bytes = reading::bytesOfStore(reader.value().path());
    const auto digest = digestOf(reader.value(), today, context.now);
    if (!digest.ok()) {
        return take(digest.failure());
    }
    facts.digest = digest.value();
    // A larger one would take longer than anybody waits.
    facts.isChecked = facts.bytes <= kCheckedBytes;
    if (facts.isChecked && !isSound(reader.value())) {
        facts.complaint = "it is damaged: \"halyardctl check\" says how badly";
        facts.exit = Exit::Failed;
    }
    return facts;
}

std::string glitchesIn(const Digest& digest) {
    if (digest.glitches.glitches == 0) {
        return "none";
    }
    std::string text = fmt::format("{}, {} without sound", digest.glitches.glitches,
                                   lengthOfTime(digest.glitches.seconds));
    if (digest.worstApplication) {
        text += fmt::format("; worst is {} with {}", digest.worstApplication->name,
                            digest.worstApplication->sum.glitches);
    }
    if (digest.leadingCause) {
        const bool isMost = digest.leadingCause->sum.glitches * 2 > digest.glitches.glitches;
        text += fmt::format("; {} {}", isMost ? "mostly" : "most often",
                            causeInWords(digest.leadingCause->name));
    }
    return text;
}

std::string playedIn(const Digest& digest) {
    std::string text = lengthOfTime(digest.playedSeconds);
    if (digest.capturedSeconds > 0) {
        text += ", and recorded " + lengthOfTime(digest.capturedSeconds);
    }
    return text;
}

std::string sessionsIn(const Digest& digest) {
    std::string text = std::to_string(digest.sessions);
    if (digest.openSessions > 0) {
        text += fmt::format(", {} of them open", digest.openSessions);
    }
    return text;
}

std::string wordsFor(const DaemonFacts& daemon) {
    if (!daemon.runs || !daemon.complaint.empty()) {
        return daemon.runs ? "runs, but: " + daemon.complaint : daemon.complaint;
    }
    if (!daemon.status) {
        return "runs";
    }
    const Dictionary store = (*daemon.status)["store"].dictionary();
    return fmt::format("runs for {}{}", lengthOfTime((*daemon.status)["uptime_sec"].doubleValue()),
                       store["open"].boolValue() && !store["failing"].boolValue()
                           ? ""
                           : ", but cannot write to the store");
}

std::string wordsFor(const StoreFacts& store) {
    if (!store.complaint.empty()) {
        return store.complaint;
    }
    return fmt::format("{}, {}", store.isChecked ? "sound" : "reads well", sizeOf(store.bytes));
}

void tell(Context& context, const StoreFacts& store, const DaemonFacts& daemon) {
    Terminal& terminal = context.terminal;
    const auto line = [&terminal](std::string_view name, const std::string& text, Colour colour) {
        terminal.write(fmt::format("  {}{}\n",
                                   coloured(terminal, Colour::Bold, fmt::format("{:<10}", name)),
                                   coloured(terminal, colour, sanitised(text))));
    };
    terminal.write(fmt::format("Today, {}\n", dayOf(context.now)));
    if (store.digest) {
        const bool any = store.digest->glitches.glitches > 0;
        line("Sessions", sessionsIn(*store.digest), Colour::Plain);
        line("Played", playedIn(*store.digest), Colour::Plain);
        line("Glitches", glitchesIn(*store.digest), any ? Colour::Red : Colour::Green);
    }
    const bool daemonFine = daemon.runs && daemon.complaint.empty();
    line("Daemon", wordsFor(daemon), daemonFine ? Colour::Plain : Colour::Yellow);
    line("Store", wordsFor(store), store.complaint.empty() ? Colour::Plain : Colour::Red);
    terminal.write(kMore);
}

void write(JsonStream& json, const std::optional<Digest::Leader>& leader) {
    if (!leader) {
        return json.null();
    }
    json.beginObject();
    json.field("name", std::string_view(leader->name));
    json.countField("glitches", leader->sum.glitches);
    json.field("seconds", std::optional(leader->sum.seconds));
    json.endObject();
}

void write(JsonStream& json, const reading::TimeRange& today, const StoreFacts& store,
           const DaemonFacts& daemon) {
    const bool known = store.digest.has_value();
    const Digest digest = store.digest.value_or(Digest());
    const auto number = [known](auto value) { return known ? std::optional(value) : std::nullopt; };
    json.beginDocument();
    json.beginObject();
    json.field("since", std::optional(today.since));
    json.field("sessions", number(static_cast<std::int64_t>(digest.sessions)));
    json.field("open_sessions", number(static_cast<std::int64_t>(digest.openSessions)));
    json.field("played_seconds", number(digest.playedSeconds));
    json.field("captured_seconds", number(digest.capturedSeconds));
    json.field("glitches", number(static_cast<std::int64_t>(digest.glitches.glitches)));
    json.field("silent_seconds", number(digest.glitches.seconds));
    json.key("worst_application");
    write(json, digest.worstApplication);
    json.key("leading_cause");
    write(json, digest.leadingCause);
    json.key("daemon_runs");
    json.boolean(daemon.runs);
    json.key("store_ok");
    json.boolean(store.complaint.empty());
    json.countField("store_bytes", store.bytes);
    json.endObject();
    json.endDocument();
}

} // namespace

Exit runOverview(Context& context) {
    const reading::TimeRange today{timeArgument("today", context.now).value_or(context.now)};
    const StoreFacts store = readStore(context, today);
    const DaemonFacts daemon = askDaemon(context);
    if (context.json) {
        JsonStream json(context.terminal.stream());
        write(json, today, store, daemon);
    } else {
        tell(context, store, daemon);
    }
    const Exit ended = finish(context, {});
    return ended == Exit::Done ? store.exit : ended;
}

} // namespace halyard::ctl
