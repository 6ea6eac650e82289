// What a message costs when there are few, and what a session costs: at low rates a
// daemon's time goes into being woken up.
#pragma once

#include <cstdint>
#include <vector>

#include "load/Options.h"

namespace halyard::load {

struct PacedLoad {
    std::uint64_t requests = 0;
    double seconds = 0;
    std::uint64_t cpuNanoseconds = 0;
    std::vector<double> answerSeconds; // in order, from the shortest

    double cpuPerRequest() const {
        return static_cast<double>(cpuNanoseconds) / static_cast<double>(requests);
    }
};

struct Churn {
    std::uint32_t sessions = 0;
    double awaitedSeconds = 0; // each request sent once the one before is answered
    std::uint64_t awaitedCpu = 0;
    double togetherSeconds = 0; // all created before the first starts, and so on
    std::uint64_t togetherCpu = 0;
};

// Every client sends a request at its share of the rate and awaits its answer.
PacedLoad measurePaced(const Options& options);

// One client creates, configures, starts, stops and destroys one session after the other.
Churn measureChurn(const Options& options);

} // namespace halyard::load
