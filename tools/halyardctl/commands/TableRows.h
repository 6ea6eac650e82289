// Rows of a table as JSON, for the commands that list and that follow.
//
// Free functions; any thread.
#pragma once

#include <string>

#include "linux/store/Schema.h"
#include "output/JsonStream.h"
#include "reading/Rows.h"

namespace halyard::ctl {

// An object with the columns of its table; requires a row with columnNames(table).
void writeRow(JsonStream& json, linux_::StoreTable table, const reading::Row& row);

// All but the id, as SQL has them.
std::string columnNames(const linux_::StoreTableSchema& table);

} // namespace halyard::ctl
