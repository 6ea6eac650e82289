// What a trace left in its results.
#pragma once

#include <cstdint>
#include <filesystem>

namespace halyard::load {

struct TraceResults {
    std::uint64_t events = 0; // recorded, in pairs or alone
    std::uint64_t lost = 0;   // as the daemon counted them
};

// Reads the time line of the only trace in it. Throws std::runtime_error.
TraceResults readTraceResults(const std::filesystem::path& timeline);

} // namespace halyard::load
