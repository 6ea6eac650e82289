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
#include <vector>

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
    // Some of it was not damaged, but could not be read: another time it may be.
    bool unreadable = false;
    // Whether the new database took them all.
    StoreResult whole;
};
enum class SalvageTime {
    AtOnce, // into a file that has nothing newer
    Later,  // what is there stays as it is, and sessions that come are over
};
// Ids stay as they are. Requires that `fresh` has the tables and no open
// transaction.
StoreSalvage storeCarryOver(const std::filesystem::path& damaged, sqlite3* fresh,
                            SalvageTime time = SalvageTime::AtOnce, const char* vfs = nullptr);

// Notes beside a file that was set aside that not all of it could be read, and which
// are noted so.
void storeNoteUnread(const std::filesystem::path& aside, bool unread);
std::vector<std::filesystem::path> storeUnread(const std::filesystem::path& path);

// Reads the file and its log from end to end, as plain bytes. SQLite's code.
[[nodiscard]] int storeReadPlainly(const std::filesystem::path& path, const char* vfs);

} // namespace halyard::linux_
