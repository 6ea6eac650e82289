// The durations that a trace left in its results file, by what they are of.
//
// The file is Google Benchmark's JSON, an entry a value. It is read as it streams by:
// only the numbers are kept. Free functions; any thread.
#pragma once

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

#include "reading/Trouble.h"

namespace halyard::reading {

// In nanoseconds. A percentile is a value that occurred: the least that so many of all
// do not exceed. The median of an even number lies in the middle of two.
struct TraceDurations {
    std::string name;
    std::uint64_t count = 0;
    double min = 0;
    double median = 0;
    double p90 = 0;
    double p99 = 0;
    double max = 0;
    double total = 0;
};

// In the order in which the names first occur.
Outcome<std::vector<TraceDurations>> readTraceResults(const std::filesystem::path& path);
// None when it is no such file.
std::optional<std::vector<TraceDurations>> readTraceResults(std::FILE* file);

} // namespace halyard::reading
