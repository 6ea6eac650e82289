// A stretch of time that a command looks at, as seconds since 1970.
#pragma once

#include <limits>
#include <string>
#include <string_view>

namespace halyard::reading {

struct TimeRange {
    double since = -std::numeric_limits<double>::infinity();
    double until = std::numeric_limits<double>::infinity(); // not included

    bool contains(double time) const { return time >= since && time < until; }
    // The same as a condition of SQL; empty when every time will do.
    std::string condition(std::string_view column) const;
};

} // namespace halyard::reading
