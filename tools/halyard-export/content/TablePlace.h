// Where a signal stands in a table of the store, and what became of the rows before it.
//
// Free functions; the thread of the reader.
#pragma once

#include <cstdint>
#include <string>

#include "content/ConsentHistory.h"
#include "place/ExportPlace.h"
#include "reading/StoreReader.h"

namespace halyard::exporting {

// Where to go on. A place in a table whose rows began anew, because a store was emptied or
// replaced, is none. `time` is the table's column.
reading::Outcome<Position> startIn(reading::StoreReader& reader, const std::string& table,
                                   const char* time, Position position);

// Moves the place of `table` to a row, and counts those between as lost, unless they were
// never to leave. Where ids leapt, nothing is lost: the rows may come yet, and are remembered
// as late.
void passTo(Position& position, const std::string& table, Position row,
            const ConsentHistory& consent, PlaceChange& change);

} // namespace halyard::exporting
