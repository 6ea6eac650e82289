// What fuzzers hold for true.
#pragma once

#include <cstdlib>

namespace halyard::fuzz {

// Ends the process, which a fuzzer takes for a finding.
inline void require(bool holds) {
    if (!holds) {
        std::abort();
    }
}

} // namespace halyard::fuzz
