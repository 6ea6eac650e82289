// Takes everything that was collected out of a store, so that not a byte of it is left
// in the file or its write-ahead log.
//
// Deleted rows stay in free pages and in what the log still holds. So the file is built
// anew from what is left, which is next to nothing, and the log is moved into it and
// cut off. That is quick, whatever the store held.
//
// Stateless; whoever owns the database.
#pragma once

#include <cstdint>

#include "linux/store/StoreSqlite.h"

namespace halyard::linux_ {

// How many rows went. Sessions from the row `firstOpen` on that are open keep theirs,
// without what it told; they do not count. Requires no open transaction and no statement
// under way. SQLITE_BUSY when a reader keeps what was deleted alive: the rows are gone
// for everybody else then, and the next purge has less to do.
// The identity goes as well: what comes is another store's, whose owner agrees or not as
// of `now`.
Result<std::uint64_t, StoreFailure> storePurge(sqlite3* database, std::int64_t firstOpen,
                                               double now);

} // namespace halyard::linux_
