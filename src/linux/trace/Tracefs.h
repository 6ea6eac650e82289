// The kernel's tracing directory: the small writes it is steered by, and the
// names under which what is ours lies in it.
//
// Any thread.
#pragma once

#include <filesystem>
#include <string>
#include <string_view>

#include "common/Result.h"

namespace halyard::linux_ {

inline constexpr const char* kTracefs = "/sys/kernel/tracing";

// One write of all of `text`. With `append` to a file of definitions, which
// opening otherwise clears. A failure names the file.
Result<void> writeTracefs(const std::filesystem::path& file, std::string_view text,
                          bool append = false);

// A name for an instance and for a group of probes that no other process uses.
// It tells its owner, for whoever clears up behind a process that was killed.
[[nodiscard]] std::string uniqueTraceName();

// Removes instances and probes whose owner has gone, and counts them. Instances
// that somebody still reads stay.
std::size_t removeTraceLeftovers(const std::filesystem::path& tracefs);

} // namespace halyard::linux_
