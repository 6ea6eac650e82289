// Why rows are lost, and how many were. Plain values.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "linux/store/Schema.h"
#include "linux/store/StoreSqlite.h"

namespace halyard::linux_ {

// Why a row was not stored.
enum class StoreLoss : std::uint8_t {
    NoStore,  // There was none since the start.
    DiskFull, // Or over quota.
    ReadOnly,
    Locked, // By another process that would not let go.
    IoError,
    Stuck,    // An operation of the file system did not come back.
    Rejected, // The row itself: too big for the database, say.
};
inline constexpr std::size_t kStoreLosses = 7;
// In the order of StoreLoss.
struct StoreLossName {
    std::string_view inStatus;
    std::string_view inLog;
};
inline constexpr std::array<StoreLossName, kStoreLosses> kStoreLossNames = {
    {{"no_store", "no store"},
     {"disk_full", "disk full"},
     {"read_only", "read-only"},
     {"locked", "locked by another process"},
     {"io_error", "input/output error"},
     {"stuck", "the file system does not answer"},
     {"rejected", "rejected"}}};
using StoreLosses = std::array<std::uint64_t, kStoreLosses>;
using StoreLossesByTable = std::array<StoreLosses, kStoreTables>;

std::string_view nameOf(StoreLoss reason); // for the log
StoreLoss lossOf(const StoreFailure& failure);
// The row itself is refused, and the rest of its group is not.
bool concernsOneRow(const StoreFailure& failure);
std::uint64_t sum(const StoreLosses& losses);
std::uint64_t sum(const StoreLossesByTable& losses);

} // namespace halyard::linux_
