#include "reading/TimeRange.h"

#include <cmath>
#include <fmt/format.h>

namespace halyard::reading {

std::string TimeRange::condition(std::string_view column) const {
    std::string sql;
    if (std::isfinite(since)) {
        sql = fmt::format("{} >= {}", column, since);
    }
    if (std::isfinite(until)) {
        sql += fmt::format("{}{} < {}", sql.empty() ? "" : " AND ", column, until);
    }
    return sql;
}

} // namespace halyard::reading
