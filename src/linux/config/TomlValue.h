// TOML's values as ours. Only the settings' sources include this: the library's
// header is heavy.
#pragma once

#include <optional>
#include <toml++/toml.h>

#include "common/Value.h"

namespace halyard::linux_ {

// A date alone is its first moment; a date-time without an offset is meant in
// UTC; a time of no day, which has no value of its own, is its text. None when
// lists and tables nest deeper than `depth`. Requires depth >= 0.
[[nodiscard]] std::optional<Value> valueOfToml(const toml::node& node, int depth);

} // namespace halyard::linux_
