// What the report shows: all that was asked for, summed up, and the newest of everything
// that is listed.
//
// However large the store, a digest is bounded (Limits): sums are of everything, lists
// keep their newest entries and say how many went, names are cut. So a page of it is one
// that a browser opens, and gathering takes the memory of one page.
//
// A value; the thread of whoever has it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <vector>

#include "reading/DriverStatistics.h"
#include "reading/GlitchTally.h"
#include "reading/Sessions.h"
#include "reading/TraceResults.h"
#include "report/RowChunks.h"

namespace halyard::ctl {

using reading::HistogramText;
using reading::StateText;
using reading::StatisticName;

// What was asked for.
struct ReportScope {
    double now = 0;
    reading::TimeRange range{};
    std::string applicationPattern{}; // empty: all
};

// A list whose oldest entries go.
template <class T> class Newest {
public:
    explicit Newest(std::size_t most) : most_(most) {}
    void add(T one) {
        entries_.push_back(std::move(one));
        if (entries_.size() > most_) {
            entries_.pop_front();
            ++gone_;
        }
    }
    std::deque<T>& entries() { return entries_; }
    const std::deque<T>& entries() const { return entries_; }
    std::uint64_t gone() const { return gone_; }

private:
    const std::size_t most_;
    std::deque<T> entries_;
    std::uint64_t gone_ = 0;
};

// A stretch in which a stream ran at one volume.
struct Stretch {
    std::int64_t session = 0;
    double from = 0;
    double to = 0;
    std::optional<double> volume; // 0 to 1
};

struct RouteChange {
    std::int64_t session = 0;
    double time = 0;
    std::vector<std::string> devices;
};

template <class T> struct Statistic {
    std::int64_t session = 0;
    StatisticName name;
    T value;
};

struct ApplicationTotals {
    std::optional<std::string> name;
    bool isOthers = false;
    std::uint64_t sessions = 0;
    double playedSeconds = 0; // of those that played, within what was asked for
    double capturedSeconds = 0;
};

// Of one table: all of its rows, or the newest.
struct TableRows {
    TableRows(std::string of, const RowChunks::Limits& limits)
        : name(std::move(of)), rows(limits) {}
    std::string name; // as --json has it
    RowChunks rows;
};

struct Digest {
    struct Limits {
        std::size_t sessions = 2000;
        std::size_t applications = 500;
        std::size_t glitches = 4000;
        std::size_t stretches = 20000;
        std::size_t routes = 2000;
        std::size_t histograms = 2000;
        std::size_t residencies = 2000;
        std::size_t counters = 4000;
        std::size_t durations = 500;
        RowChunks::Limits messages{};
        RowChunks::Limits others{std::size_t{256} * 1024, std::size_t{16} * 1024 * 1024,
                                 std::size_t{64} * 1024};
    };
    // Bytes of a name, and devices of a session, that are kept.
    static constexpr std::size_t kNameBytes = 120;
    static constexpr std::size_t kDevices = 8;

    explicit Digest(const Limits& limits);

    ReportScope scope{};
    bool isLive = false; // sessions without an end still run

    std::uint64_t sessionCount = 0;
    double playedSeconds = 0;
    double capturedSeconds = 0;
    reading::GlitchSum glitchSum;
    std::vector<ApplicationTotals> applications; // by falling time
    reading::GlitchTally byApplication{reading::GlitchKey::Application};
    reading::GlitchTally byDevice{reading::GlitchKey::Device};
    reading::GlitchTally byCause{reading::GlitchKey::Cause};

    Newest<reading::Session> sessions;
    Newest<std::string> glitches; // each a JSON object
    Newest<Stretch> stretches;
    Newest<RouteChange> routes;
    Newest<Statistic<HistogramText>> histograms;
    Newest<Statistic<std::vector<StateText>>> residencies;
    Newest<Statistic<std::int64_t>> counters;
    std::optional<std::vector<reading::TraceDurations>> trace;
    std::deque<TableRows> tables;
};

// At most kNameBytes, whole letters, with "…" where something is missing.
std::string shortName(std::string_view name);

} // namespace halyard::ctl
