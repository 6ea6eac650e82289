// What the daemon says of driver statistics in a session, taken apart: the compact
// texts of histograms and states, and the keys that they stand under.
//
// Free functions and values; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace halyard::reading {

// "out.speaker_Speaker_Histogram_Cycletime": the driver, then its groups, the kind, the
// channel. Where there is no driver, its place is empty.
struct StatisticName {
    std::string driver;
    std::string group; // with its subgroup, if any
    std::string channel;
};
// None for what is no such key of this kind ("Simple", "Histogram", "State").
std::optional<StatisticName> statisticName(std::string_view key, std::string_view kind);

struct HistogramText {
    struct Bucket {
        std::int64_t lower = 0;
        std::int64_t upper = 0;
        std::int64_t hits = 0;
    };
    std::string unit;
    std::int64_t min = 0;
    std::int64_t max = 0;
    std::vector<Bucket> buckets; // those with hits
};
// None for a text of another form.
std::optional<HistogramText> histogramIn(std::string_view text);

struct StateText {
    std::string name;
    std::uint64_t transitions = 0;
    std::uint64_t residency = 0;
    double dutyCycle = 0;
};
// Up to the first that is of another form.
std::vector<StateText> statesIn(std::string_view text);

} // namespace halyard::reading
