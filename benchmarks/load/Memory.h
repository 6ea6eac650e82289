// What the daemon holds in memory: idle, per idle connection, per idle session,
// and over the time of a held load.
#pragma once

#include <cstdint>
#include <vector>

#include "load/Options.h"

namespace halyard::load {

struct IdleMemory {
    std::uint64_t idleBytes = 0;
    double perConnection = 0;
    double perCreatedSession = 0;
    double perStartedSession = 0;
};

struct HoldSample {
    double seconds = 0;
    std::uint64_t residentBytes = 0;
    std::uint64_t messages = 0;
};

IdleMemory measureIdleMemory(const Options& options);

// Every client sends at its share of the rate and stops and starts its session
// every 1,000 messages, as players do: a started session remembers its messages.
std::vector<HoldSample> holdLoad(const Options& options);

} // namespace halyard::load
