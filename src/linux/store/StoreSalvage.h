// What becomes of a damaged store: its files are set aside under another name,
// and the rows that can still be read are carried over into the new one.
//
// Rows are read one by one in the order of their ids; where reading fails, the
// ids behind are tried in growing steps, so a hole costs little more than what
// was in it. A row whose JSON is broken counts as unreadable.
//
// Stateless; whoever owns the new database.
#pragma once

#include <cstdint>
#include <filesystem>

#include "common/Result.h"
#include "linux/store/StoreSqlite.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

// How many sets of damaged files are kept; older ones are removed.
inline constexpr std::size_t kDamagedStoresKept = 3;

// Moves the file and its companions (write-ahead log, shared memory) out of the
// way; the file's new path.
Result<std::filesystem::path> storeSetAside(const std::filesystem::path& path,
                                            platform::WallTime now);

struct StoreSalvage {
    std::uint64_t carried = 0;
    // Places at which reading failed. One may stand for many rows.
    std::uint64_t holes = 0;
    // Whether the new database took them all.
    StoreResult whole;
};
// Ids stay as they are. Requires that `fresh` has the tables and no open
// transaction.
StoreSalvage storeCarryOver(const std::filesystem::path& damaged, sqlite3* fresh);

} // namespace halyard::linux_
