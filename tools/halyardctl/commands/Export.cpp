// What leaves the machine: how far the exporter is, and what would leave now.
#include <filesystem>
#include <fmt/format.h>
#include <unistd.h>

#include "Exporter.h"
#include "Places.h"
#include "Plans.h"
#include "Preview.h"
#include "StoreAccess.h"
#include "commands/Commands.h"
#include "linux/config/SettingsFiles.h"
#include "output/JsonStream.h"
#include "output/Sanitise.h"
#include "output/Table.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

namespace ex = exporting;
using Align = Table::Column::Align;

struct Settled {
    linux_::Settings settings;
    ex::Options options;
    ex::Places places;
    std::string trouble; // why nothing is sent
};

Outcome<Settled> settledIn(const Context& context) {
    const auto directory = context.configurationDirectory();
    const auto places = ex::placesOf(context.stateOption, linux_::processEnvironment, ::geteuid());
    if (!directory.ok() || !places.ok()) {
        return !directory.ok() ? directory.failure()
                               : Trouble(Exit::Failed, places.failure().message());
    }
    auto loaded = linux_::loadSettings(directory.value());
    if (!loaded.ok()) {
        const linux_::SettingsFailure& failure = loaded.failure();
        return Trouble(Exit::Failed,
                       fmt::format("{}:{}:{}: {}; nothing is sent meanwhile", failure.file,
                                   failure.line, failure.column, failure.message()));
    }
    Settled settled{std::move(loaded.value().settings), {}, places.value(), {}};
    auto options = ex::optionsFrom(settled.settings.exporting, linux_::processEnvironment);
    if (options.ok()) {
        settled.options = std::move(options.value());
    } else {
        settled.trouble = options.failure().message();
    }
    return settled;
}

std::string endpointOf(const ex::Options& options) {
    for (const std::string& url : options.urls) {
        if (!url.empty()) {
            return ex::shownAddress(url);
        }
    }
    return "";
}

// How much of a table a signal has before it.
struct Backlog {
    std::string signal;
    std::string table;
    std::int64_t place = 0;
    std::int64_t rows = 0;
    std::optional<double> oldest; // its time
};

Outcome<Backlog> backlogOf(reading::StoreReader& reader, const ex::ExportPlace& place,
                           ex::Signal signal, std::string table, const char* time) {
    Backlog backlog{std::string(nameOf(signal)), std::move(table), 0, 0, {}};
    backlog.place = place.positionOf(signal, backlog.table).id;
    const auto newest = reader.integer("SELECT max(id) FROM " + backlog.table);
    if (!newest.ok()) {
        return newest.failure();
    }
    const auto first = reader.forEach({backlog.table, time, "", backlog.place},
                                      [&backlog](const reading::Row& row) {
                                          backlog.oldest = row.real(1);
                                          backlog.rows = -row.integer(0) + 1;
                                          return false;
                                      });
    if (!first.ok()) {
        return first.failure();
    }
    backlog.rows = backlog.oldest ? backlog.rows + newest.value().value_or(0) : 0;
    return backlog;
}

Outcome<std::vector<Backlog>> backlogs(Context& context, const Settled& settled,
                                       const ex::ExportPlace& place) {
    std::vector<Backlog> all;
    auto reader = context.openStore();
    if (!reader.ok()) {
        return reader.failure().exit == Exit::NothingThere ? Outcome<std::vector<Backlog>>(all)
                                                           : reader.failure();
    }
    const auto add = [&](ex::Signal signal, const std::string& table,
                         const char* time) -> Outcome<void> {
        if (settled.options.isSent(signal)) {
            auto backlog = backlogOf(reader.value(), place, signal, table, time);
            if (!backlog.ok()) {
                return backlog.failure();
            }
            all.push_back(std::move(backlog.value()));
        }
        return {};
    };
    for (std::size_t i = 0; i < ex::kLogTables.size(); ++i) {
        if (i != ex::kAnalyticsEvents || settled.options.analyticsEvents) {
            if (auto added = add(ex::Signal::Logs, std::string(ex::kLogTables[i].name), "time");
                !added.ok()) {
                return added.failure();
            }
        }
    }
    for (const ex::Signal signal : {ex::Signal::Traces, ex::Signal::Metrics}) {
        if (auto added = add(signal, "upload_session", "opened"); !added.ok()) {
            return added.failure();
        }
    }
    return all;
}

void writeJson(Context& context, const Settled& settled, const ex::ExportCounts& counts,
               const std::vector<Backlog>& backlogs) {
    JsonStream json(context.terminal.stream());
    json.beginDocument();
    json.beginObject();
    json.key("consent");
    json.boolean(settled.settings.exporting.consent);
    json.field("endpoint", std::string_view(endpointOf(settled.options)));
    json.field("trouble", std::string_view(settled.trouble));
    json.field("last_success", counts.lastSuccess);
    json.field("last_failure", counts.lastFailure);
    json.field("last_error", std::string_view(counts.lastError));
    json.countField("bytes_today", counts.bytesToday);
    json.countField("max_bytes_per_day", settled.settings.exporting.maxBytesPerDay);
    json.key("sent");
    json.beginObject();
    for (const auto& [signal, count] : counts.sent) {
        json.countField(signal, count);
    }
    json.endObject();
    for (const bool isLost : {true, false}) {
        json.key(isLost ? "lost" : "dropped");
        json.beginObject();
        std::map<std::string_view, std::uint64_t> sums;
        for (const auto& [key, count] : counts.losses) {
            if (ex::isLost(key.second) == isLost) {
                sums[ex::kLossNames[static_cast<std::size_t>(key.second)]] += count;
            }
        }
        for (const auto& [reason, count] : sums) {
            json.countField(reason, count);
        }
        json.endObject();
    }
    json.key("backlog");
    json.beginArray();
    for (const Backlog& backlog : backlogs) {
        json.beginObject();
        json.field("signal", std::string_view(backlog.signal));
        json.field("table", std::string_view(backlog.table));
        json.field("place", std::optional(backlog.place));
        json.field("rows", std::optional(backlog.rows));
        json.field("oldest", backlog.oldest);
        json.endObject();
    }
    json.endArray();
    json.endObject();
    json.endDocument();
}

std::string whenOf(const std::optional<double>& time) {
    return time ? dayAndTime(*time) : "never";
}

void tell(Context& context, const Settled& settled, const ex::ExportCounts& counts,
          const std::vector<Backlog>& backlogs) {
    Terminal& terminal = context.terminal;
    const auto line = [&terminal](std::string_view name, const std::string& text) {
        terminal.write(fmt::format("  {:<12}{}\n", name, sanitised(text)));
    };
    const bool given = settled.settings.exporting.consent;
    const std::string endpoint = endpointOf(settled.options);
    line("Consent", given ? "given" : "not given: nothing leaves");
    line("Goes to", !settled.trouble.empty() ? "nowhere: " + settled.trouble
                    : endpoint.empty()       ? "nowhere: [export] names no endpoint"
                                             : endpoint);
    line("Arrived", whenOf(counts.lastSuccess));
    line("Failed", counts.lastFailure
                       ? fmt::format("{}: {}", whenOf(counts.lastFailure), counts.lastError)
                       : "never");
    line("Today", fmt::format("{} of {}", sizeOf(counts.bytesToday),
                              sizeOf(settled.settings.exporting.maxBytesPerDay)));
    std::string losses;
    for (const auto& [key, count] : counts.losses) {
        losses += fmt::format("{}{} of {} {}", losses.empty() ? "" : ", ", count, key.first,
                              ex::kLossNames[static_cast<std::size_t>(key.second)]);
    }
    line("Lost", losses.empty() ? "nothing" : losses);
    terminal.write("\n");
    Table table(
        terminal,
        {{"SIGNAL"}, {"TABLE"}, {"PLACE", Align::Right}, {"WAITING", Align::Right}, {"OLDEST"}});
    for (const Backlog& backlog : backlogs) {
        table.add({backlog.signal, backlog.table, std::to_string(backlog.place),
                   std::to_string(backlog.rows), backlog.oldest ? whenOf(backlog.oldest) : ""});
    }
    table.finish("There is nothing to send from.");
}

void tell(Context& context, const Settled& settled, const ex::Preview& preview) {
    Terminal& terminal = context.terminal;
    const std::string endpoint = endpointOf(settled.options);
    terminal.write(settled.settings.exporting.consent
                       ? fmt::format("This would leave now, to {}:\n",
                                     endpoint.empty() ? "nobody, as no endpoint is named"
                                                      : sanitised(endpoint))
                       : "There is no consent: nothing leaves. With it, this would:\n");
    terminal.write(fmt::format(
        "{} log records, {} spans and {} metrics, in {} requests of {} in "
        "all.\n",
        preview.records(ex::Signal::Logs), preview.records(ex::Signal::Traces),
        preview.records(ex::Signal::Metrics), preview.requests(), sizeOf(preview.bytes())));
    std::string omitted;
    for (const std::string& key : settled.settings.exporting.omit) {
        omitted += (omitted.empty() ? "" : ", ") + key;
    }
    terminal.write(fmt::format("Never leaves: {}.\n\n",
                               omitted.empty() ? "(nothing is held back)" : sanitised(omitted)));
    Table table(
        terminal,
        {{"IN"}, {"RECORD"}, {"KEY"}, {"TIMES", Align::Right}, {"FOR EXAMPLE", Align::Left, true}});
    for (const auto& [place, key] : preview.keys()) {
        const auto& [where, name, text] = place;
        table.add({where, name, text, std::to_string(key.count), key.example});
    }
    table.finish("There is nothing to send.");
    if (preview.leftOut() > 0) {
        terminal.write(fmt::format("{} more keys are not listed.\n", preview.leftOut()));
    }
}

void writeJson(Context& context, const Settled& settled, const ex::Preview& preview) {
    JsonStream json(context.terminal.stream());
    json.beginDocument();
    json.beginObject();
    json.key("consent");
    json.boolean(settled.settings.exporting.consent);
    json.field("endpoint", std::string_view(endpointOf(settled.options)));
    json.key("records");
    json.beginObject();
    for (std::size_t i = 0; i < ex::kSignals; ++i) {
        json.countField(ex::kSignalNames[i], preview.records(static_cast<ex::Signal>(i)));
    }
    json.endObject();
    json.countField("requests", preview.requests());
    json.countField("bytes", preview.bytes());
    json.key("omitted");
    json.beginArray();
    for (const std::string& key : settled.settings.exporting.omit) {
        json.text(key);
    }
    json.endArray();
    json.key("keys");
    json.beginArray();
    for (const auto& [place, key] : preview.keys()) {
        const auto& [where, name, text] = place;
        json.beginObject();
        json.field("in", std::string_view(where));
        json.field("record", std::string_view(name));
        json.field("key", std::string_view(text));
        json.countField("count", key.count);
        json.field("example", std::string_view(key.example));
        json.endObject();
    }
    json.endArray();
    json.countField("keys_left_out", preview.leftOut());
    json.endObject();
    json.endDocument();
}

} // namespace

Exit runExportStatus(Context& context) {
    const auto settled = settledIn(context);
    if (!settled.ok()) {
        return fail(settled.failure());
    }
    const auto path = settled.value().places.own / ex::ExportPlace::kFileName;
    const auto place = ex::ExportPlace::inMemory(path, context.now);
    if (!place.ok()) {
        return fail(place.failure());
    }
    const auto waiting = backlogs(context, settled.value(), place.value());
    if (!waiting.ok()) {
        return fail(waiting.failure());
    }
    const ex::ExportCounts counts = place.value().counts(context.now);
    if (context.json) {
        writeJson(context, settled.value(), counts, waiting.value());
    } else {
        tell(context, settled.value(), counts, waiting.value());
    }
    return finish(context, {});
}

Exit runExportPreview(Context& context) {
    auto settled = settledIn(context);
    const auto store = context.storePath();
    if (!settled.ok() || !store.ok()) {
        return fail(settled.ok() ? store.failure() : settled.failure());
    }
    auto place = ex::ExportPlace::inMemory(settled.value().places.own / ex::ExportPlace::kFileName,
                                           context.now);
    if (!place.ok()) {
        return fail(place.failure());
    }
    ex::Preview preview;
    auto plan = ex::planToShow(settled.value().settings, linux_::processEnvironment);
    if (!plan.ok()) {
        return fail(plan.failure());
    }
    plan.value().receiver = &preview;
    ex::Exporter exporter(
        store.value(), std::move(place.value()),
        {[&context] { return context.now; }, [] { return 0.0; }, [] { return true; }});
    exporter.follow(std::move(plan.value()));
    ex::Exporter::Step step;
    do {
        step = exporter.step();
    } while (step.hasMore);
    if (context.json) {
        writeJson(context, settled.value(), preview);
    } else {
        tell(context, settled.value(), preview);
    }
    return finish(context, {});
}

} // namespace halyard::ctl
