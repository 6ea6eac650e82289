// Whether a store is sound, what is in it, and what can be done when it is not.
//
// Free functions; not thread-safe.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "reading/StoreReader.h"
#include "reading/Trouble.h"

namespace halyard::reading {

struct StoreCheck {
    bool ok = false;
    std::optional<std::int64_t> schema;
    std::vector<std::string> integrity; // what is wrong
    // In the order of the schema; none where a table cannot be counted.
    std::vector<std::pair<std::string, std::optional<std::int64_t>>> rows;
    std::optional<std::int64_t> unclosedSessions;
    std::uint64_t bytes = 0; // as bytesOfStore has it
};

// `progress` is told how far it is, from 0 to 1. Damage is a result; what cannot be
// looked at is trouble.
Outcome<StoreCheck> checkStore(const std::filesystem::path& path,
                               const std::function<void(double)>& progress);

// What a store takes on the disk: of the file and its write-ahead log.
std::uint64_t bytesOfStore(const std::filesystem::path& path);

// SQLite's quick look at every page.
bool isSound(StoreReader& reader);

struct StoreRepair {
    std::filesystem::path aside;
    std::uint64_t rows = 0;   // carried over
    std::uint64_t places = 0; // that could not be read
};

// Sets the store aside and carries over what can be read, as the daemon does. Fails
// while somebody has it open.
Outcome<StoreRepair> repairStore(const std::filesystem::path& path);

// Takes all rows out of a store that nobody has open; one that is damaged goes as a
// whole. How many rows went.
Outcome<std::uint64_t> purgeStore(const std::filesystem::path& path);

} // namespace halyard::reading
