// What --since and --until take.
//
// A free function; any thread.
#pragma once

#include <optional>
#include <string_view>

namespace halyard::ctl {

// RFC 3339 ("2026-11-22T14:03:12Z"), "today" and "yesterday" (0:00 of that day, local
// time), or how long before `now` ("90m"; s, m, h or d). None for anything else.
std::optional<double> timeArgument(std::string_view text, double now);

} // namespace halyard::ctl
