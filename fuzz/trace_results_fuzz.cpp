// A results file of a trace may come from anywhere: whatever it holds, what is said of
// it adds up.

#include <cstdint>
#include <cstdio>
#include <vector>

#include "Require.h"
#include "reading/TraceResults.h"

using halyard::fuzz::require;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    std::vector<std::uint8_t> bytes(data, data + size);
    std::FILE* const file = size == 0 ? nullptr : ::fmemopen(bytes.data(), size, "r");
    if (file == nullptr) {
        return 0;
    }
    const auto results = halyard::reading::readTraceResults(file);
    std::fclose(file);
    for (const auto& of : results ? *results : std::vector<halyard::reading::TraceDurations>()) {
        require(of.min <= of.median && of.median <= of.max);
        require(of.min <= of.p90 && of.p90 <= of.p99 && of.p99 <= of.max);
    }
    return 0;
}
