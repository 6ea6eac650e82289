// The files that hold what was collected, beside the store itself.
//
// Free functions; any thread.
#pragma once

#include <filesystem>

#include "common/Result.h"

namespace halyard::linux_ {

// Where the daemon keeps its store and its incidents, and what it calls them.
inline constexpr const char* kStoreFile = "telemetry.db";
inline constexpr const char* kIncidentsFolder = "incidents";
// In that, while one is put together.
inline constexpr const char* kUnfinishedIncident = ".unfinished";

// The store's file with what SQLite and repairs put beside it.
Result<void> keepStorePrivate(const std::filesystem::path& state);
// All that was collected in both directories, and the directories themselves, see
// PrivateFiles.h. What else lies in them stays as it is.
Result<void> keepCollectedPrivate(const std::filesystem::path& state,
                                  const std::filesystem::path& logs);

// Removes incidents and files of the store that were set aside. Links are removed and
// not followed. Goes on after a failure, and tells of the first.
Result<void> removeCollectedState(const std::filesystem::path& state);
// Removes summaries and traces.
Result<void> removeCollectedLogs(const std::filesystem::path& logs);

// Removes what daemons that were killed left half-written in both directories. Requires
// that no other writes there.
void removeUnfinished(const std::filesystem::path& state, const std::filesystem::path& logs);

} // namespace halyard::linux_
