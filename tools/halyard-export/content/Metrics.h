// Numbers of closed sessions as metrics: driver statistics and the lengths of glitches.
//
// Everything is a delta over its session, so that a receiver adds up without knowing who
// restarted when. Not thread-safe.
#pragma once

#include <map>
#include <string>
#include <utility>
#include <vector>

#include "content/DriverFacts.h"
#include "content/Omission.h"
#include "content/SessionContents.h"
#include "otlp/RequestBody.h"
#include "reading/DriverStatistics.h"

namespace halyard::exporting {

// The bounds of the lengths of glitches, in seconds.
inline constexpr double kGlitchBounds[] = {0.01, 0.02, 0.05, 0.1, 0.2, 0.5, 1, 2, 5, 10};

class Metrics {
public:
    // From when to when the numbers were collected; seconds since 1970.
    struct Stretch {
        double from = 0;
        double to = 0;
    };

    // Borrows both.
    Metrics(const Omission& omission, const DriverNames& names)
        : omission_(omission), names_(names) {}

    void addStatistics(const TimedPayload& message, Stretch stretch);
    // Each glitch once.
    void addGlitch(std::string_view cause, double seconds);
    // What was added by addGlitch, as one point for each cause.
    void endGlitches(Stretch stretch);
    // A sum since `stretch.from`.
    void addTotal(std::string_view name, std::string_view description, std::string_view reason,
                  std::uint64_t value, Stretch stretch);

    // One metric for each name and unit. Returns how many of them are totals.
    std::size_t finish(otlp::RequestBody& body);

private:
    enum class Kind : std::uint8_t { DeltaSum, CumulativeSum, Histogram };
    struct Series {
        Kind kind = Kind::DeltaSum;
        std::string description;
        std::string points;
    };
    struct Lengths {
        std::uint64_t count = 0;
        double sum = 0;
        double least = 0;
        double most = 0;
        std::vector<std::uint64_t> buckets;
    };

    void addPoint(std::string_view name, std::string_view unit, Kind kind,
                  std::string_view description, const std::string& point);
    void addDriver(otlp::Writer& point, otlp::Tag tag, const DriverFacts& facts);
    void addCount(const DriverFacts& facts, std::int64_t value, Stretch stretch);
    void addHistogram(const DriverFacts& facts, const reading::HistogramText& text,
                      Stretch stretch);
    void addResidency(const DriverFacts& facts, const reading::StateText& state, Stretch stretch);

    const Omission& omission_;
    const DriverNames& names_;
    reading::JsonFields fields_;
    std::map<std::pair<std::string, std::string>, Series> series_; // by name and unit
    std::map<std::string, Lengths, std::less<>> glitches_;         // by cause
};

} // namespace halyard::exporting
