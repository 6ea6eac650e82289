// Reads what PipeWire's profiler tells: records of cycles in portions.
//
// Records have grown over the releases. Blocks are found by their key, fields by
// their place and type; what is beyond is skipped, what is missing stays unknown.
#pragma once

#include <cstddef>
#include <functional>

struct spa_pod;

#include "Cycle.h"

namespace halyard::pipewire {

using CycleListener = std::function<void(const Cycle&)>;

// Calls `listener` for each record of `portion`, whose header and body are within
// `size` bytes, 8-byte aligned. Records that say too little are skipped; the result
// is their number. The cycle is the reader's and lives during the call.
std::size_t readProfile(const spa_pod* portion, std::size_t size, const CycleListener& listener);

} // namespace halyard::pipewire
