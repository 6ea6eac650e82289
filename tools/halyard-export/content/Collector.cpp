#include "content/Collector.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

#include "common/HYReportingUtility.h"
#include "content/SessionSpans.h"

namespace halyard::exporting {
namespace {

using reading::Outcome;
using reading::Row;
using reading::StoreReader;

constexpr const char* kSessions = "upload_session";
constexpr const char* kMessages = "upload_message";
// Of one batch.
constexpr std::size_t kMostSessions = 64;
// Open sessions that are looked at again for one batch.
constexpr std::size_t kMostOpen = 8192;
constexpr std::size_t kMostSingles = 1024;
// More rows than any store had: ids leap where the daemon makes room for rows that it may
// still save from a damaged file.
constexpr std::int64_t kLeap = std::int64_t{1} << 32;

// A place in a table whose rows began anew, because a store was emptied or replaced, is
// none. `time` is the table's column.
Outcome<Position> startIn(StoreReader& reader, const std::string& table, const char* time,
                          Position position) {
    if (position.id == 0) {
        return position;
    }
    bool isThere = false;
    bool isOther = false;
    const auto looked =
        reader.forEach({table, time, "", position.id - 1, position.id}, [&](const Row& row) {
            isThere = true;
            isOther = row.real(1) != position.time;
            return false;
        });
    if (!looked.ok()) {
        return looked.failure();
    }
    if (!isThere) {
        const auto newest = reader.integer(fmt::format("SELECT max(id) FROM {}", table));
        if (!newest.ok()) {
            return newest.failure();
        }
        // An empty table may be about to go on where it was.
        isOther = newest.value().value_or(position.id) < position.id;
    }
    return isOther ? Position{} : position;
}

// Counts the rows between where it was and `row` as lost, unless they were never to leave.
void passTo(Position& position, std::int64_t id, double time, const ConsentHistory& consent,
            PlaceChange& change) {
    const std::int64_t missing = id - position.id - 1;
    if (position.id > 0 && missing > 0 && missing < kLeap &&
        (consent.isGivenAt(position.time) || consent.isGivenAt(time))) {
        change.losses[Loss::Removed] += static_cast<std::uint64_t>(missing);
    }
    position = {id, time};
}

} // namespace

Outcome<Batch> Collector::collect(Signal signal, StoreReader& reader, const ExportPlace& place,
                                  double now) {
    switch (signal) {
    case Signal::Logs:
        return collectLogs(reader, place);
    case Signal::Traces:
        return collectTraces(reader, place);
    default:
        return collectMetrics(reader, place, now);
    }
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
    Batch batch;
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

Outcome<void> Collector::collectTable(std::size_t table, StoreReader& reader,
                                      const ExportPlace& place, Batch& batch) {
    const std::string name(kLogTables[table].name);
    const Position before = place.positionOf(Signal::Logs, name);
    const auto start = startIn(reader, name, "time", before);
    if (!start.ok()) {
        return start.failure();
    }
    Position position = start.value();
    const auto done =
        reader.forEach({name, kLogTables[table].columns, "", position.id}, [&](const Row& row) {
            const double time = timeOf(table, row);
            const bool leaves = scope_.consent.isGivenAt(time);
            const std::string* const record =
                leaves ? &records_.recordOf(reader, table, row) : nullptr;
            if (record != nullptr && batch.body.count() > 0 &&
                batch.body.bytes() + record->size() > scope_.limits.bytes) {
                batch.hasMore = true;
                return false;
            }
            passTo(position, row.integer(0), time, scope_.consent, batch.change);
            if (record != nullptr && record->size() > scope_.limits.bytes) {
                ++batch.change.losses[Loss::TooLarge];
            } else if (record != nullptr) {
                batch.body.add(*record);
            }
            // Full: asking for another row would read as many again, only to leave them.
            batch.hasMore = batch.body.count() >= scope_.limits.records;
            return !batch.hasMore;
        });
    if (position != before) {
        batch.change.positions[name] = position;
    }
    return done;
}

Outcome<void> Collector::walkOpenSessions(Signal signal, StoreReader& reader,
                                          const ExportPlace& place, SessionWalk& walk) {
    for (const std::int64_t id : place.openSessions(signal, kMostOpen)) {
        if (walk.closed.size() >= kMostSessions) {
            walk.hasMore = true;
            break;
        }
        std::optional<BookedSession> session;
        const auto looked = reader.forEach({kSessions, sessionColumns(reader), "", id - 1, id},
                                           [&](const Row& row) {
                                               session = sessions_.read(row);
                                               return false;
                                           });
        if (!looked.ok()) {
            return looked.failure();
        }
        if (!session) {
            ++walk.change.losses[Loss::Removed];
            walk.change.done.push_back(id);
        } else if (session->closed) {
            walk.change.done.push_back(id);
            walk.closed.push_back(*std::move(session));
        }
    }
    return {};
}

Outcome<Collector::SessionWalk> Collector::walkSessions(Signal signal, StoreReader& reader,
                                                        const ExportPlace& place) {
    SessionWalk walk;
    const Position before = place.positionOf(signal, kSessions);
    const auto start = startIn(reader, kSessions, "opened", before);
    if (!start.ok()) {
        return start.failure();
    }
    if (auto opened = walkOpenSessions(signal, reader, place, walk); !opened.ok()) {
        return opened.failure();
    }
    Position position = start.value();
    const auto done =
        reader.forEach({kSessions, sessionColumns(reader), "", position.id}, [&](const Row& row) {
            if (walk.closed.size() >= kMostSessions) {
                walk.hasMore = true;
                return false;
            }
            BookedSession session = sessions_.read(row);
            passTo(position, session.row, session.opened, scope_.consent, walk.change);
            if (!session.closed) {
                walk.change.opened.push_back(session.row);
            } else {
                walk.closed.push_back(std::move(session));
            }
            return walk.change.opened.size() < kMostOpen;
        });
    if (position != before) {
        walk.change.positions[kSessions] = position;
    }
    // Those from a time without consent are passed, and leave nothing.
    std::erase_if(walk.closed, [this](const BookedSession& session) {
        return !scope_.consent.isGivenAt(session.opened) ||
               !scope_.consent.isGivenAt(session.closed.value_or(session.opened));
    });
    return done.ok() ? Outcome<SessionWalk>(std::move(walk)) : done.failure();
}

Outcome<Batch> Collector::collectTraces(StoreReader& reader, const ExportPlace& place) {
    auto walk = walkSessions(Signal::Traces, reader, place);
    if (!walk.ok()) {
        return walk.failure();
    }
    auto contents = gatherContents(reader, walk.value().closed, scope_.consent, Wanted::Events);
    if (!contents.ok()) {
        return contents.failure();
    }
    Batch batch;
    batch.change = std::move(walk.value().change);
    batch.hasMore = walk.value().hasMore;
    SessionSpans spans(scope_.identity, scope_.omission);
    for (const BookedSession& session : walk.value().closed) {
        const SessionContents& of = contents.value()[session.row];
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
    enum Column : int { kID, kCategory, kTime, kPayload };
    std::map<std::pair<double, std::string>, GlitchFacts> glitches;
    reading::JsonFields fields;
    const auto done = reader.forEach(
        {kMessages, "category, time, payload",
         fmt::format("upload_session IS NULL AND type = {}", kAudioEventTypeIssueDetector),
         start.value().id, newest.id},
        [&](const Row& row) {
            auto glitch =
                glitchFactsIn(fields, row.text(kPayload),
                              static_cast<std::uint32_t>(row.integer(kCategory)), row.real(kTime));
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
    auto walk = walkSessions(Signal::Metrics, reader, place);
    if (!walk.ok()) {
        return walk.failure();
    }
    auto contents = gatherContents(reader, walk.value().closed, scope_.consent, Wanted::Statistics);
    if (!contents.ok()) {
        return contents.failure();
    }
    Batch batch;
    batch.change = std::move(walk.value().change);
    batch.hasMore = walk.value().hasMore;
    Metrics metrics(scope_.omission, scope_.drivers);
    for (const BookedSession& session : walk.value().closed) {
        addSession(metrics, session, contents.value()[session.row]);
    }
    if (auto singles = addSingles(reader, place, metrics, batch.change); !singles.ok()) {
        return singles.failure();
    }
    addTotals(place, metrics, now);
    batch.totals = metrics.finish(batch.body);
    return batch;
}

} // namespace halyard::exporting
