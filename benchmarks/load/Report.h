// What was measured, as a table and as JSON.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "load/Memory.h"
#include "load/Options.h"
#include "load/Rates.h"
#include "load/Throughput.h"

namespace halyard::load {

struct Report {
    std::vector<Measurement> throughput; // medians; the floor first
    std::optional<IdleMemory> idle;
    std::vector<HoldSample> held;
    std::vector<PacedLoad> paced; // of each round
    std::vector<Churn> churn;
};

std::string asTable(const Options& options, const Report& report);
std::string asJson(const Options& options, const Report& report);

} // namespace halyard::load
