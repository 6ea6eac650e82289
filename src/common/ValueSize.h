// About how much memory values keep alive.
//
// Pure functions; any thread. What several values share counts for each of them.
#pragma once

#include <cstddef>

#include "common/Value.h"

namespace halyard {

// Beside the Value itself.
std::size_t bytesOf(const Value& value);
std::size_t bytesOf(const Dictionary& dictionary);

} // namespace halyard
