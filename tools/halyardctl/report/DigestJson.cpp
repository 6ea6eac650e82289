#include "report/DigestJson.h"

#include <algorithm>
#include <cmath>

#include "report/Base64.h"

namespace halyard::ctl {
namespace {

using reading::GlitchTally;
using reading::Session;

// Of a tally; what comes after them counts as one.
constexpr std::size_t kMostSums = 100;

std::optional<double> finite(double value) {
    return std::isfinite(value) ? std::optional(value) : std::nullopt;
}

template <class List, class Write>
void writeList(JsonStream& json, const char* name, const List& list, const Write& write) {
    json.key(name);
    json.beginArray();
    for (const auto& one : list) {
        json.beginObject();
        write(one);
        json.endObject();
    }
    json.endArray();
}

template <class T>
void writeNewest(JsonStream& json, const char* name, const Newest<T>& list,
                 const std::function<void(const T&)>& write) {
    writeList(json, name, list.entries(), write);
}

void writeTotals(JsonStream& json, const Digest& digest) {
    const double seconds = digest.playedSeconds + digest.capturedSeconds;
    const auto glitches = digest.glitchSum.glitches;
    json.key("totals");
    json.beginObject();
    json.countField("sessions", digest.sessionCount);
    json.countField("messages", digest.tables.empty() ? 0 : digest.tables.front().rows.taken());
    json.countField("glitches", glitches);
    json.field("played_seconds", std::optional(digest.playedSeconds));
    json.field("captured_seconds", std::optional(digest.capturedSeconds));
    json.field("silent_seconds", std::optional(digest.glitchSum.seconds));
    json.field("longest_seconds", std::optional(digest.glitchSum.longest));
    json.field("glitches_per_hour",
               seconds > 0 ? std::optional(static_cast<double>(glitches) * 3600 / seconds)
                           : std::nullopt);
    json.endObject();
}

void writeApplications(JsonStream& json, const Digest& digest) {
    writeList(json, "applications", digest.applications, [&](const ApplicationTotals& of) {
        json.field("name", of.name);
        json.key("others");
        json.boolean(of.isOthers);
        json.countField("sessions", of.sessions);
        json.field("played_seconds", std::optional(of.playedSeconds));
        json.field("captured_seconds", std::optional(of.capturedSeconds));
    });
}

void writeTally(JsonStream& json, const char* name, const GlitchTally& tally) {
    auto entries = tally.entries();
    if (entries.size() > kMostSums) {
        GlitchTally::Entry others;
        others.isOthers = true;
        for (auto entry = entries.begin() + kMostSums; entry != entries.end(); ++entry) {
            others.sum.glitches += entry->sum.glitches;
            others.sum.seconds += entry->sum.seconds;
            others.sum.longest = std::max(others.sum.longest, entry->sum.longest);
        }
        entries.resize(kMostSums);
        entries.push_back(others);
    }
    writeList(json, name, entries, [&](const GlitchTally::Entry& entry) {
        json.field("name", entry.name);
        json.key("others");
        json.boolean(entry.isOthers);
        json.countField("glitches", entry.sum.glitches);
        json.field("seconds", std::optional(entry.sum.seconds));
        json.field("longest", std::optional(entry.sum.longest));
    });
}

void writeTexts(JsonStream& json, const char* name, const std::vector<std::string>& texts) {
    json.key(name);
    json.beginArray();
    for (const std::string& text : texts) {
        json.text(text);
    }
    json.endArray();
}

void writeSession(JsonStream& json, const Session& session) {
    json.field("id", std::optional(session.id));
    // A text: the numbers are larger than what JavaScript keeps exact.
    json.field("session_id", session.sessionID ? std::optional(std::to_string(*session.sessionID))
                                               : std::nullopt);
    json.field("application", session.application);
    json.field("service", session.service);
    json.field("direction", nameOf(session.direction));
    json.field("opened", session.opened);
    json.field("closed", session.closed);
    json.field("ended", session.ended);
    json.countField("messages", session.messages);
    json.countField("glitches", session.glitches);
    json.field("played_seconds", std::optional(session.playedSeconds));
    json.field("last_heard",
               session.lastHeard > 0 ? std::optional(session.lastHeard) : std::nullopt);
    writeTexts(json, "devices", session.devices);
}

void writeStretches(JsonStream& json, const Digest& digest) {
    writeNewest<Stretch>(json, "stretches", digest.stretches, [&](const Stretch& stretch) {
        json.field("session", std::optional(stretch.session));
        json.field("from", std::optional(stretch.from));
        json.field("to", std::optional(stretch.to));
        json.field("volume", stretch.volume);
    });
    writeNewest<RouteChange>(json, "routes", digest.routes, [&](const RouteChange& route) {
        json.field("session", std::optional(route.session));
        json.field("time", std::optional(route.time));
        writeTexts(json, "devices", route.devices);
    });
}

template <class T> void writeName(JsonStream& json, const Statistic<T>& of) {
    json.field("session", std::optional(of.session));
    json.field("driver", std::string_view(of.name.driver));
    json.field("group", std::string_view(of.name.group));
    json.field("channel", std::string_view(of.name.channel));
}

void writeHistogram(JsonStream& json, const HistogramText& of) {
    json.field("unit", std::string_view(of.unit));
    json.field("min", std::optional(of.min));
    json.field("max", std::optional(of.max));
    json.key("buckets");
    json.beginArray();
    for (const auto& bucket : of.buckets) {
        json.beginArray();
        json.integer(bucket.lower);
        json.integer(bucket.upper);
        json.integer(bucket.hits);
        json.endArray();
    }
    json.endArray();
}

void writeStatistics(JsonStream& json, const Digest& digest) {
    using Counter = Statistic<std::int64_t>;
    using Residency = Statistic<std::vector<StateText>>;
    writeNewest<Counter>(json, "counters", digest.counters, [&](const Counter& of) {
        writeName(json, of);
        json.field("value", std::optional(of.value));
    });
    writeNewest<Statistic<HistogramText>>(json, "histograms", digest.histograms,
                                          [&](const Statistic<HistogramText>& of) {
                                              writeName(json, of);
                                              writeHistogram(json, of.value);
                                          });
    writeNewest<Residency>(json, "residencies", digest.residencies, [&](const Residency& of) {
        writeName(json, of);
        writeList(json, "states", of.value, [&](const StateText& state) {
            json.field("name", std::string_view(state.name));
            json.countField("transitions", state.transitions);
            json.countField("residency", state.residency);
            json.field("duty_cycle", std::optional(state.dutyCycle));
        });
    });
}

void writeTrace(JsonStream& json, const Digest& digest) {
    if (!digest.trace) {
        json.key("trace");
        return json.null();
    }
    writeList(json, "trace", *digest.trace, [&](const reading::TraceDurations& of) {
        json.field("name", std::string_view(shortName(of.name)));
        json.countField("count", of.count);
        const auto field = [&](const char* name, double value) {
            json.field(name, of.count > 0 ? std::optional(value) : std::nullopt);
        };
        field("min", of.min);
        field("median", of.median);
        field("p90", of.p90);
        field("p99", of.p99);
        field("max", of.max);
        field("total", of.total);
    });
}

// The lines of a chunk.
void writePlainRows(JsonStream& json, const RowChunks& rows) {
    for (const RowChunks::Chunk& chunk : rows.chunks()) {
        const std::string text = RowChunks::unpacked(chunk);
        for (std::size_t at = 0; at < text.size();) {
            const std::size_t end = std::min(text.find('\n', at), text.size());
            json.json(std::string_view(text).substr(at, end - at));
            at = end + 1;
        }
    }
}

void writeTables(JsonStream& json, const Digest& digest, RowForm form) {
    json.key("tables");
    json.beginObject();
    for (const TableRows& table : digest.tables) {
        json.key(table.name);
        json.beginObject();
        json.countField("total", table.rows.taken());
        json.key(form == RowForm::Plain ? "rows" : "chunks");
        json.beginArray();
        if (form == RowForm::Plain) {
            writePlainRows(json, table.rows);
        } else {
            for (const RowChunks::Chunk& chunk : table.rows.chunks()) {
                json.beginArray();
                json.count(chunk.rows);
                json.text(base64(chunk.packed));
                json.endArray();
            }
        }
        json.endArray();
        json.endObject();
    }
    json.endObject();
}

void writeLeftOut(JsonStream& json, const Digest& digest) {
    json.key("left_out");
    json.beginObject();
    json.countField("sessions", digest.sessions.gone());
    json.countField("glitches", digest.glitches.gone());
    json.countField("stretches", digest.stretches.gone() + digest.routes.gone());
    json.countField("statistics",
                    digest.histograms.gone() + digest.residencies.gone() + digest.counters.gone());
    json.endObject();
}

} // namespace

void writeDigest(JsonStream& json, const Digest& digest, RowForm rows) {
    json.beginObject();
    json.field("version", std::string_view(HALYARD_VERSION));
    json.field("made", std::optional(digest.scope.now));
    json.field("since", finite(digest.scope.range.since));
    json.field("until", finite(digest.scope.range.until));
    const std::string& pattern = digest.scope.applicationPattern;
    json.field("application", pattern.empty() ? std::nullopt : std::optional(pattern));
    json.key("live");
    json.boolean(digest.isLive);
    writeTotals(json, digest);
    writeApplications(json, digest);
    writeTally(json, "by_application", digest.byApplication);
    writeTally(json, "by_device", digest.byDevice);
    writeTally(json, "by_cause", digest.byCause);
    writeNewest<Session>(json, "sessions", digest.sessions,
                         [&](const Session& session) { writeSession(json, session); });
    json.key("glitches");
    json.beginArray();
    for (const std::string& glitch : digest.glitches.entries()) {
        json.json(glitch);
    }
    json.endArray();
    writeStretches(json, digest);
    writeStatistics(json, digest);
    writeTrace(json, digest);
    writeTables(json, digest, rows);
    writeLeftOut(json, digest);
    json.endObject();
}

} // namespace halyard::ctl
