// What is new in the store for each signal, as the body of the next request.
//
// A batch says what changes about the place once it has arrived; taking the next one
// without committing the first gives the same again. Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
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
#include "content/SessionWalk.h"
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
    // Traces and metrics both leave: what is read for the one is kept for the other.
    bool sharesSessions = false;
    BatchLimits limits;
};

class Collector {
public:
    // Borrows `scope`; one collector for one store and one scope.
    explicit Collector(const ExportScope& scope)
        : scope_(scope), sessions_(scope.identity), walk_(sessions_, scope.consent),
          records_(scope.identity, scope.omission, scope.consent, sessions_) {}

    reading::Outcome<Batch> collect(Signal signal, reading::StoreReader& reader,
                                    const ExportPlace& place, double now);
    // The batch of this signal that was taken last has arrived, or was given up.
    void arrived(Signal signal);
    // The body of a batch that is done with: its memory is used for the next.
    void takeBack(otlp::RequestBody body) { spare_ = std::move(body); }

private:
    struct Rows {
        std::int64_t after = 0;
        std::int64_t upTo = INT64_MAX;
    };
    using Contents = std::shared_ptr<ContentsOf>;
    // What the messages of the sessions in a walk told.
    struct Gathered {
        std::vector<std::pair<std::int64_t, double>> sessions; // rows, and when they were opened
        ConsentHistory consent;
        double at = 0;
        Contents contents;
    };
    using Totals = std::map<Loss, std::uint64_t>;

    Batch emptyBatch();
    reading::Outcome<Batch> collectLogs(reading::StoreReader& reader, const ExportPlace& place);
    reading::Outcome<Batch> collectTraces(reading::StoreReader& reader, const ExportPlace& place,
                                          double now);
    reading::Outcome<Batch> collectMetrics(reading::StoreReader& reader, const ExportPlace& place,
                                           double now);
    reading::Outcome<void> collectTable(std::size_t table, reading::StoreReader& reader,
                                        const ExportPlace& place, Batch& batch);
    reading::Outcome<void> collectRows(std::size_t table, reading::StoreReader& reader, Rows rows,
                                       Batch& batch, const std::function<void(Position)>& pass);
    reading::Outcome<Contents> contentsOf(const SessionGroup& walk, Wanted wanted,
                                          reading::StoreReader& reader, double now);
    void addSession(Metrics& metrics, const BookedSession& session,
                    const SessionContents& contents);
    reading::Outcome<void> addSingles(reading::StoreReader& reader, const ExportPlace& place,
                                      Metrics& metrics, PlaceChange& change);
    void addTotals(const ExportPlace& place, Metrics& metrics, double now);

    const ExportScope& scope_;
    SessionBook sessions_;
    SessionWalk walk_;
    LogRecords records_;
    otlp::RequestBody spare_;
    std::optional<Gathered> gathered_; // for the signal that comes second
    Totals told_;
    Totals telling_;
    // Single messages tell one glitch more than once: those that were counted already.
    std::set<std::pair<double, std::string>> singles_;
    std::vector<std::pair<double, std::string>> newSingles_;
};

} // namespace halyard::exporting
