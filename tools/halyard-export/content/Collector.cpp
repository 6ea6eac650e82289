#include "content/Collector.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

#include "common/HYReportingUtility.h"
#include "content/SessionSpans.h"
#include "content/TablePlace.h"

namespace halyard::exporting {
namespace {

using reading::Outcome;
using reading::Row;
using reading::StoreReader;

constexpr const char* kMessages = "upload_message";
constexpr std::size_t kMostSingles = 1024;
// For how long what was read of sessions is good for another signal: their last messages may
// still be on their way. Seconds.
constexpr double kFresh = 2;
} // namespace

Outcome<Batch> Collector::collect(Signal signal, StoreReader& reader, const ExportPlace& place,
                                  double now) {
    switch (signal) {
    case Signal::Logs:
        return collectLogs(reader, place);
    case Signal::Traces:
        return collectTraces(reader, place, now);
    default:
        return collectMetrics(reader, place, now);
    }
}

Batch Collector::emptyBatch() {
    Batch batch;
    batch.body = std::exchange(spare_, {});
    batch.body.clear();
    return batch;
}

void Collector::arrived(Signal signal) {
    if (signal == Signal::Metrics) {
        told_ = telling_;
        if (singles_.size() + newSingles_.size() > kMostSingles) {
            singles_.clear();
        }
        singles_.insert(newSingles_.begin(), newSingles_.end());
        newSingles_.clear();
    }
}

Outcome<Batch> Collector::collectLogs(StoreReader& reader, const ExportPlace& place) {
    Batch batch = emptyBatch();
    // A session may have got its row, or been closed, since the last look.
    records_.forget();
    for (std::size_t table = 0; table < kLogTables.size() && !batch.hasMore; ++table) {
        if (table == kAnalyticsEvents && !scope_.analyticsEvents) {
            continue;
        }
        if (auto done = collectTable(table, reader, place, batch); !done.ok()) {
            return done.failure();
        }
    }
    return batch;
}

// One pass over rows of a table. `pass` is told of each that the batch holds then, or that is
// not to leave.
Outcome<void> Collector::collectRows(std::size_t table, StoreReader& reader, Rows rows,
                                     Batch& batch, const std::function<void(Position)>& pass) {
    return reader.forEach(
        {std::string(kLogTables[table].name), kLogTables[table].columns, "", rows.after, rows.upTo},
        [&](const Row& row) {
            const double time = timeOf(table, row);
            const bool leaves = scope_.consent.isGivenAt(time);
            const LogRecords::Record record =
                leaves ? records_.recordOf(reader, table, row) : LogRecords::Record();
            if (leaves && batch.body.count() > 0 &&
                batch.body.bytes() + record.bytes.size() > scope_.limits.bytes) {
                batch.hasMore = true;
                return false;
            }
            pass({row.integer(0), time});
            if (leaves && record.bytes.size() > scope_.limits.bytes) {
                ++batch.change.losses[Loss::TooLarge];
            } else if (leaves) {
                batch.body.add(record.bytes, record.event);
            }
            // Full: asking for another row would read as many again, only to leave them.
            batch.hasMore = batch.body.count() >= scope_.limits.records;
            return !batch.hasMore;
        });
}

Outcome<void> Collector::collectTable(std::size_t table, StoreReader& reader,
                                      const ExportPlace& place, Batch& batch) {
    const std::string name(kLogTables[table].name);
    for (const LateRows& late : place.lateRows(Signal::Logs, name)) {
        const auto done =
            collectRows(table, reader, {late.after.id, late.before - 1}, batch, [&](Position row) {
                batch.change.late[{name, late.before}] = row;
            });
        if (!done.ok() || batch.hasMore) {
            return done;
        }
    }
    const Position before = place.positionOf(Signal::Logs, name);
    const auto start = startIn(reader, name, "time", before);
    if (!start.ok()) {
        return start.failure();
    }
    Position position = start.value();
    const auto done =
        collectRows(table, reader, {position.id, INT64_MAX}, batch, [&](Position row) {
            passTo(position, name, row, scope_.consent, batch.change);
        });
    if (position != before) {
        batch.change.positions[name] = position;
    }
    return done;
}

// To pass over the messages is most of the work, and traces and metrics mostly have got to the
// same sessions.
Outcome<Collector::Contents> Collector::contentsOf(const SessionGroup& walk, Wanted wanted,
                                                   StoreReader& reader, double now) {
    Gathered gathered{{}, scope_.consent, now, {}};
    for (const BookedSession& session : walk.closed) {
        gathered.sessions.emplace_back(session.row, session.opened);
    }
    const auto known = std::exchange(gathered_, std::nullopt);
    if (known && known->sessions == gathered.sessions && known->consent == gathered.consent &&
        now >= known->at && now - known->at < kFresh) {
        return known->contents;
    }
    const bool isKept = scope_.sharesSessions && wanted == Wanted::Events;
    auto contents =
        gatherContents(reader, walk.closed, scope_.consent, isKept ? Wanted::Both : wanted);
    if (!contents.ok()) {
        return contents.failure();
    }
    gathered.contents = std::make_shared<ContentsOf>(std::move(contents.value()));
    auto shared = gathered.contents;
    if (isKept) {
        gathered_ = std::move(gathered);
    }
    return shared;
}

Outcome<Batch> Collector::collectTraces(StoreReader& reader, const ExportPlace& place, double now) {
    auto walk = walk_.next(Signal::Traces, reader, place);
    if (!walk.ok()) {
        return walk.failure();
    }
    auto contents = contentsOf(walk.value(), Wanted::Events, reader, now);
    if (!contents.ok()) {
        return contents.failure();
    }
    Batch batch = emptyBatch();
    batch.change = std::move(walk.value().change);
    batch.hasMore = walk.value().hasMore;
    SessionSpans spans(scope_.identity, scope_.omission);
    for (const BookedSession& session : walk.value().closed) {
        const SessionContents& of = (*contents.value())[session.row];
        if (of.glitchesLeftOut > 0) {
            batch.change.losses[Loss::TooLarge] += of.glitchesLeftOut;
        }
        spans.add(batch.body, session, of);
    }
    return batch;
}

void Collector::addSession(Metrics& metrics, const BookedSession& session,
                           const SessionContents& contents) {
    const Metrics::Stretch stretch{session.opened, session.closed.value_or(session.opened)};
    for (const auto& [key, glitch] : contents.glitches) {
        if (glitch.seconds) {
            metrics.addGlitch(glitch.cause, *glitch.seconds);
        }
    }
    metrics.endGlitches(stretch);
    if (scope_.consent.isGivenThroughout(stretch.from, stretch.to)) {
        for (const TimedPayload& message : contents.statistics) {
            metrics.addStatistics(message, stretch);
        }
    }
}

// Glitches that were told by single messages, which no session ends.
Outcome<void> Collector::addSingles(StoreReader& reader, const ExportPlace& place, Metrics& metrics,
                                    PlaceChange& change) {
    const Position before = place.positionOf(Signal::Metrics, kMessages);
    const auto start = startIn(reader, kMessages, "time", before);
    if (!start.ok()) {
        return start.failure();
    }
    Position newest = start.value();
    const auto found = reader.forEach(
        {kMessages, "time", "id = (SELECT max(id) FROM upload_message)", start.value().id},
        [&newest](const Row& row) {
            newest = {row.integer(0), row.real(1)};
            return false;
        });
    if (!found.ok() || newest == before) {
        return found;
    }
    enum Column : int { kID, kTime, kPayload };
    std::map<std::pair<double, std::string>, GlitchFacts> glitches;
    reading::JsonFields fields;
    const auto done = reader.forEach(
        {kMessages, "time, payload",
         fmt::format("upload_session IS NULL AND type = {}", kAudioEventTypeIssueDetector),
         start.value().id, newest.id},
        [&](const Row& row) {
            auto glitch = glitchFactsIn(fields, row.text(kPayload), row.real(kTime));
            if (glitch && scope_.consent.isGivenAt(row.real(kTime))) {
                auto key = std::pair(glitch->start, glitch->node);
                glitches.insert_or_assign(std::move(key), *std::move(glitch));
            }
            if (glitches.size() < kMostSingles) {
                return true;
            }
            newest = {row.integer(kID), row.real(kTime)};
            return false;
        });
    Metrics::Stretch stretch{newest.time, newest.time};
    newSingles_.clear();
    for (const auto& [key, glitch] : glitches) {
        if (glitch.seconds && !singles_.contains(key)) {
            metrics.addGlitch(glitch.cause, *glitch.seconds);
            stretch.from = std::min(stretch.from, glitch.start);
            newSingles_.push_back(key);
        }
    }
    metrics.endGlitches(stretch);
    change.positions[kMessages] = newest;
    return done;
}

void Collector::addTotals(const ExportPlace& place, Metrics& metrics, double now) {
    const ExportCounts counts = place.counts(now);
    telling_.clear();
    for (const auto& [key, count] : counts.losses) {
        telling_[key.second] += count;
    }
    if (telling_ == told_) {
        return;
    }
    for (const auto& [loss, count] : telling_) {
        metrics.addTotal(isLost(loss) ? "halyard.export.lost" : "halyard.export.dropped",
                         isLost(loss) ? "Records that were removed before they could be sent"
                                      : "Records that were given up",
                         kLossNames[static_cast<std::size_t>(loss)], count, {counts.since, now});
    }
}

Outcome<Batch> Collector::collectMetrics(StoreReader& reader, const ExportPlace& place,
                                         double now) {
    auto walk = walk_.next(Signal::Metrics, reader, place);
    if (!walk.ok()) {
        return walk.failure();
    }
    auto contents = contentsOf(walk.value(), Wanted::Statistics, reader, now);
    if (!contents.ok()) {
        return contents.failure();
    }
    Batch batch = emptyBatch();
    batch.change = std::move(walk.value().change);
    batch.hasMore = walk.value().hasMore;
    Metrics metrics(scope_.omission, scope_.drivers);
    for (const BookedSession& session : walk.value().closed) {
        const SessionContents& of = (*contents.value())[session.row];
        if (of.statisticsLeftOut > 0) {
            batch.change.losses[Loss::TooLarge] += of.statisticsLeftOut;
        }
        addSession(metrics, session, of);
    }
    if (auto singles = addSingles(reader, place, metrics, batch.change); !singles.ok()) {
        return singles.failure();
    }
    addTotals(place, metrics, now);
    batch.totals = metrics.finish(batch.body);
    return batch;
}

} // namespace halyard::exporting
