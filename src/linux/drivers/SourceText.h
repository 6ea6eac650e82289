// Readers of the text that the kernel, drivers and operators' scripts keep
// statistics in. Text that is not in the format, or has more entries than any
// real one, yields nothing: the channel is then missing rather than wrong.
//
// Pure functions; any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace halyard::linux_ {

inline constexpr std::size_t kMaxSourceStates = 128;
inline constexpr std::size_t kMaxSourceBuckets = 1024;

struct SourceState {
    std::string name;
    std::uint64_t residency = 0;
    std::uint64_t transitions = 0; // into it

    bool operator==(const SourceState&) const = default;
};

struct SourceBucket {
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    std::uint64_t hits = 0;

    bool operator==(const SourceBucket&) const = default;
};

using SourceStates = std::vector<SourceState>;
using SourceBuckets = std::vector<SourceBucket>;

// One integer and blanks around it.
std::optional<std::int64_t> parseInteger(std::string_view text);

// Where a number stands in a table of words: a row by its number from 1 or by
// its first word (which may end in ":"), a column by its number from 1.
struct FieldPlace {
    std::string row;
    std::size_t column = 1;
};
// The field may also be "key=number".
std::optional<std::int64_t> parseField(std::string_view text, const FieldPlace& place);

// "some avg10=0.00 ... total=123" of /proc/pressure: the total, µs, of the line
// that begins with that word.
std::optional<std::int64_t> parsePressure(std::string_view text, std::string_view line);

// The sum of "1,2,3", a count per processor.
std::optional<std::uint64_t> parsePerCpuCount(std::string_view text);

// States and buckets: each name and each pair of bounds once, because changes are
// found by them. What an odd file has twice is one, with the sum of the numbers.

// cpufreq's time_in_state: "FREQUENCY TICKS" in each line; ms.
std::optional<SourceStates> parseTimeInState(std::string_view text);
// cpufreq's trans_table ("From : To", counts from the row's to the column's
// state): the transitions into each, without residencies.
std::optional<SourceStates> parseTransitionTable(std::string_view text);
// devfreq's trans_stat: the same with the residency, ms, at the end of each row.
std::optional<SourceStates> parseTransitionStatistics(std::string_view text);

// "LOWER UPPER HITS" in each line, "#" begins a comment.
std::optional<SourceBuckets> parseBuckets(std::string_view text);
// A "hist" file of tracefs with one numeric key, plain, .buckets= or .log2.
std::optional<SourceBuckets> parseTraceHistogram(std::string_view text);

// A PCM substream's "status" in /proc/asound.
struct PcmStatus {
    std::string state; // "RUNNING", ..., "CLOSED"
    std::optional<std::int64_t> owner;
    // By the stream's own clock, and only comparable with each other.
    std::optional<std::chrono::nanoseconds> triggered;
    std::optional<std::chrono::nanoseconds> stamped;
    std::optional<std::int64_t> frames; // hw_ptr
};
std::optional<PcmStatus> parsePcmStatus(std::string_view text);

} // namespace halyard::linux_
