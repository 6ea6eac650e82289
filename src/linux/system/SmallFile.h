// Reads files that are known to be small: configuration, procfs.
#pragma once

#include <cstddef>
#include <filesystem>
#include <string>

#include "common/Result.h"

namespace halyard::linux_ {

// The whole of a regular file. file_too_large when it has more than `most`
// bytes, invalid_argument when it is none: others are not even opened. Any thread.
Result<std::string> readSmallFile(const std::filesystem::path& path, std::size_t most);

} // namespace halyard::linux_
