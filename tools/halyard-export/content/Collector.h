// What is new in the store for each signal, as the body of the next request.
//
// A batch says what changes about the place once it has arrived; taking the next one
// without committing the first gives the same again. Not thread-safe.
#pragma once

#include <cstddef>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "content/ConsentHistory.h"
#include "content/DriverFacts.h"
#include "content/Identity.h"
#include "content/LogRecords.h"
#include "content/Metrics.h"
#include "content/Omission.h"
#include "content/SessionBook.h"
#include "content/SessionContents.h"
#include "otlp/RequestBody.h"
#include "place/ExportPlace.h"
#include "reading/StoreReader.h"

namespace halyard::exporting {

struct BatchLimits {
    std::size_t records = 512;
    // Of a body before compression: below what receivers take.
    std::size_t bytes = 4 * 1024 * 1024;
};

struct Batch {
    otlp::RequestBody body;
    PlaceChange change;
    bool hasMore = false; // there is more to take now
    // Of its items, those that only tell of losses. To count their loss as well would make
    // another to tell of, and so on.
    std::size_t totals = 0;

    std::size_t countable() const { return body.count() - totals; }
};

// What decides over what leaves, and as what.
struct ExportScope {
    Identity identity;
    Omission omission;
    ConsentHistory consent;
    DriverNames drivers;
    bool analyticsEvents = false;
    BatchLimits limits;
};

class Collector {
public:
    // Borrows `scope`; one collector for one store and one scope.
    explicit Collector(const ExportScope& scope)
        : scope_(scope), sessions_(scope.identity),
          records_(scope.identity, scope.omission, scope.consent, sessions_) {}

    reading::Outcome<Batch> collect(Signal signal, reading::StoreReader& reader,
                                    const ExportPlace& place, double now);
    // The batch of this signal that was taken last has arrived, or was given up.
    void arrived(Signal signal);

private:
    struct SessionWalk {
        std::vector<BookedSession> closed;
        PlaceChange change;
        bool hasMore = false;
    };
    using Totals = std::map<Loss, std::uint64_t>;

    reading::Outcome<Batch> collectLogs(reading::StoreReader& reader, const ExportPlace& place);
    reading::Outcome<Batch> collectTraces(reading::StoreReader& reader, const ExportPlace& place);
    reading::Outcome<Batch> collectMetrics(reading::StoreReader& reader, const ExportPlace& place,
                                           double now);
    reading::Outcome<void> collectTable(std::size_t table, reading::StoreReader& reader,
                                        const ExportPlace& place, Batch& batch);
    reading::Outcome<SessionWalk> walkSessions(Signal signal, reading::StoreReader& reader,
                                               const ExportPlace& place);
    reading::Outcome<void> walkOpenSessions(Signal signal, reading::StoreReader& reader,
                                            const ExportPlace& place, SessionWalk& walk);
    void addSession(Metrics& metrics, const BookedSession& session,
                    const SessionContents& contents);
    reading::Outcome<void> addSingles(reading::StoreReader& reader, const ExportPlace& place,
                                      Metrics& metrics, PlaceChange& change);
    void addTotals(const ExportPlace& place, Metrics& metrics, double now);

    const ExportScope& scope_;
    SessionBook sessions_;
    LogRecords records_;
    Totals told_;
    Totals telling_;
    // Single messages tell one glitch more than once: those that were counted already.
    std::set<std::pair<double, std::string>> singles_;
    std::vector<std::pair<double, std::string>> newSingles_;
};

} // namespace halyard::exporting
