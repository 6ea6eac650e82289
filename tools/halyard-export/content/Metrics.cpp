#include "content/Metrics.h"

#include <algorithm>
#include <cmath>

#include "common/HYReportingUtility.h"

namespace halyard::exporting {
namespace {

using namespace otlp;

constexpr const char* kCountText = "What a driver counted during a session";
constexpr const char* kHistogramText = "What a driver measured during a session";
constexpr const char* kResidencyText = "How long something of a driver was in a state";
constexpr const char* kGlitchText = "How long sound was missing";

void addTimes(Writer& point, Metrics::Stretch stretch) {
    point.add_fixed64(point::kStart, nanoseconds(std::min(stretch.from, stretch.to)));
    point.add_fixed64(point::kTime, nanoseconds(stretch.to));
}

struct Buckets {
    std::vector<double> bounds;
    std::vector<std::uint64_t> counts;
    std::uint64_t count = 0;
    double sum = 0; // by the middles of the buckets
};

// The buckets of a text that have hits, with those between them: n bounds part n + 1
// stretches, of which the first and the last have none.
Buckets bucketsOf(const reading::HistogramText& text) {
    Buckets all;
    const auto addBound = [&all](std::int64_t bound, std::uint64_t before) {
        all.bounds.push_back(static_cast<double>(bound));
        all.counts.push_back(before);
    };
    for (const auto& [lower, upper, hits] : text.buckets) {
        if (hits <= 0 || upper <= lower ||
            (!all.bounds.empty() && static_cast<double>(lower) < all.bounds.back())) {
            continue; // what no driver says
        }
        if (all.bounds.empty() || static_cast<double>(lower) > all.bounds.back()) {
            addBound(lower, 0);
        }
        addBound(upper, static_cast<std::uint64_t>(hits));
        all.count += static_cast<std::uint64_t>(hits);
        all.sum += static_cast<double>(hits) *
                   (static_cast<double>(lower) + static_cast<double>(upper)) / 2;
    }
    all.counts.push_back(0);
    return all;
}

void addBuckets(Writer& point, const std::vector<double>& bounds,
                const std::vector<std::uint64_t>& counts) {
    point.add_packed_fixed<std::uint64_t>(point::kBucketCounts, counts.begin(), counts.end());
    point.add_packed_fixed<double>(point::kExplicitBounds, bounds.begin(), bounds.end());
}

} // namespace

void Metrics::addPoint(std::string_view name, std::string_view unit, Kind kind,
                       std::string_view description, const std::string& point) {
    Series& series = series_[{std::string(name), std::string(unit)}];
    series.kind = kind;
    series.description = description;
    Writer(series.points).add_message(metric::kDataPoints, point);
}

void Metrics::addDriver(Writer& point, Tag tag, const DriverFacts& facts) {
    const std::pair<std::string_view, const std::string*> all[] = {{"group", &facts.group},
                                                                   {"subgroup", &facts.subgroup},
                                                                   {"driver", &facts.driver},
                                                                   {"channel", &facts.channel}};
    for (const auto& [key, text] : all) {
        if (!text->empty() && !omission_.omits(key)) {
            addText(point, tag, key, *text);
        }
    }
}

void Metrics::addCount(const DriverFacts& facts, std::int64_t value, Stretch stretch) {
    std::string bytes;
    Writer point(bytes);
    addTimes(point, stretch);
    point.add_sfixed64(point::kInt, value);
    addDriver(point, point::kAttributes, facts);
    addPoint("halyard.driver.count", facts.unit, Kind::DeltaSum, kCountText, bytes);
}

void Metrics::addHistogram(const DriverFacts& facts, const reading::HistogramText& text,
                           Stretch stretch) {
    const Buckets buckets = bucketsOf(text);
    std::string bytes;
    Writer point(bytes);
    addTimes(point, stretch);
    point.add_fixed64(point::kCount, buckets.count);
    point.add_double(point::kHistogramSum, buckets.sum);
    addBuckets(point, buckets.bounds, buckets.counts);
    addDriver(point, point::kHistogramAttributes, facts);
    point.add_double(point::kMin, static_cast<double>(text.min));
    point.add_double(point::kMax, static_cast<double>(text.max));
    addPoint("halyard.driver.histogram", text.unit, Kind::Histogram, kHistogramText, bytes);
}

void Metrics::addResidency(const DriverFacts& facts, const reading::StateText& state,
                           Stretch stretch) {
    std::string bytes;
    Writer point(bytes);
    addTimes(point, stretch);
    point.add_sfixed64(point::kInt, static_cast<std::int64_t>(
                                        std::min<std::uint64_t>(state.residency, INT64_MAX)));
    addDriver(point, point::kAttributes, facts);
    if (!omission_.omits("state")) {
        addText(point, point::kAttributes, "state", state.name);
    }
    addPoint("halyard.driver.residency", facts.unit, Kind::DeltaSum, kResidencyText, bytes);
}

void Metrics::addStatistics(const TimedPayload& message, Stretch stretch) {
    if (!fields_.parse(message.payload)) {
        return;
    }
    fields_.forEachEntry([&](std::string_view key, const rapidjson::Value& value) {
        if (omission_.omits(key)) {
            return;
        }
        const std::string_view text =
            value.IsString() ? std::string_view(value.GetString(), value.GetStringLength())
                             : std::string_view();
        if (message.type == kAudioEventTypeSimple && value.IsInt64()) {
            if (const auto facts = names_.factsOf(key, "Simple")) {
                addCount(*facts, value.GetInt64(), stretch);
            }
        } else if (message.type == kAudioEventTypeHistogram) {
            const auto facts = names_.factsOf(key, "Histogram");
            const auto histogram = reading::histogramIn(text);
            if (facts && histogram) {
                addHistogram(*facts, *histogram, stretch);
            }
        } else if (message.type == kAudioEventTypeState) {
            if (const auto facts = names_.factsOf(key, "State")) {
                for (const reading::StateText& state : reading::statesIn(text)) {
                    addResidency(*facts, state, stretch);
                }
            }
        }
    });
}

void Metrics::addGlitch(std::string_view cause, double seconds) {
    if (!std::isfinite(seconds) || seconds < 0) {
        return;
    }
    Lengths& lengths = glitches_[std::string(cause)];
    lengths.buckets.resize(std::size(kGlitchBounds) + 1);
    lengths.least = lengths.count == 0 ? seconds : std::min(lengths.least, seconds);
    lengths.most = std::max(lengths.most, seconds);
    lengths.sum += seconds;
    ++lengths.count;
    // A bucket holds its upper bound.
    const auto* const bound =
        std::lower_bound(std::begin(kGlitchBounds), std::end(kGlitchBounds), seconds);
    ++lengths.buckets[static_cast<std::size_t>(bound - std::begin(kGlitchBounds))];
}

void Metrics::endGlitches(Stretch stretch) {
    const std::vector<double> bounds(std::begin(kGlitchBounds), std::end(kGlitchBounds));
    for (const auto& [cause, lengths] : glitches_) {
        std::string bytes;
        Writer point(bytes);
        addTimes(point, stretch);
        point.add_fixed64(point::kCount, lengths.count);
        point.add_double(point::kHistogramSum, lengths.sum);
        addBuckets(point, bounds, lengths.buckets);
        if (!omission_.omits("issue_type")) {
            addText(point, point::kHistogramAttributes, "issue_type", cause);
        }
        point.add_double(point::kMin, lengths.least);
        point.add_double(point::kMax, lengths.most);
        addPoint("halyard.audio.issue.duration", "s", Kind::Histogram, kGlitchText, bytes);
    }
    glitches_.clear();
}

void Metrics::addTotal(std::string_view name, std::string_view description, std::string_view reason,
                       std::uint64_t value, Stretch stretch) {
    std::string bytes;
    Writer point(bytes);
    addTimes(point, stretch);
    point.add_sfixed64(point::kInt, static_cast<std::int64_t>(value));
    addText(point, point::kAttributes, "reason", reason);
    addPoint(name, "{record}", Kind::CumulativeSum, description, bytes);
}

std::size_t Metrics::finish(RequestBody& body) {
    std::size_t totals = 0;
    for (const auto& [key, series] : series_) {
        totals += series.kind == Kind::CumulativeSum ? 1 : 0;
        std::string data = series.points;
        Writer writer(data);
        writer.add_enum(metric::kTemporality,
                        series.kind == Kind::CumulativeSum ? metric::kCumulative : metric::kDelta);
        if (series.kind != Kind::Histogram) {
            writer.add_bool(metric::kIsMonotonic, true);
        }
        std::string bytes;
        Writer item(bytes);
        item.add_string(metric::kName, key.first);
        item.add_string(metric::kDescription, series.description);
        item.add_string(metric::kUnit, key.second);
        item.add_message(series.kind == Kind::Histogram ? metric::kHistogram : metric::kSum, data);
        body.add(bytes);
    }
    series_.clear();
    return totals;
}

} // namespace halyard::exporting
