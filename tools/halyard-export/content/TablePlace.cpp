#include "content/TablePlace.h"

#include <fmt/format.h>

namespace halyard::exporting {
namespace {

using reading::Outcome;
using reading::Row;
using reading::StoreReader;

// More rows than any store had: ids leap where the daemon makes room for rows that it may
// still save from a damaged file.
constexpr std::int64_t kLeap = std::int64_t{1} << 32;

} // namespace

Outcome<Position> startIn(StoreReader& reader, const std::string& table, const char* time,
                          Position position) {
    if (position.id == 0) {
        return position;
    }
    bool isThere = false;
    bool isOther = false;
    const auto looked =
        reader.forEach({table, time, "", position.id - 1, position.id}, [&](const Row& row) {
            isThere = true;
            isOther = row.real(1) != position.time;
            return false;
        });
    if (!looked.ok()) {
        return looked.failure();
    }
    if (!isThere) {
        const auto newest = reader.integer(fmt::format("SELECT max(id) FROM {}", table));
        if (!newest.ok()) {
            return newest.failure();
        }
        // An empty table may be about to go on where it was.
        isOther = newest.value().value_or(position.id) < position.id;
    }
    return isOther ? Position{} : position;
}

void passTo(Position& position, const std::string& table, Position row,
            const ConsentHistory& consent, PlaceChange& change) {
    const std::int64_t missing = row.id - position.id - 1;
    if (missing >= kLeap) {
        change.late[{table, row.id}] = position;
    } else if (position.id > 0 && missing > 0 &&
               (consent.isGivenAt(position.time) || consent.isGivenAt(row.time))) {
        change.losses[Loss::Removed] += static_cast<std::uint64_t>(missing);
    }
    position = row;
}

} // namespace halyard::exporting
