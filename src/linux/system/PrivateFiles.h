// Who may read what the daemon keeps: its own user, and a group of readers where the
// operator names one.
//
// Files are 0600, or 0640 and the readers' own; directories lose what they have beyond
// 0750. New files get that from the umask of the process, which is as much everybody's
// as the group is: hence functions and not an object. What was there before is brought
// into line by keepPrivate(). No link is ever followed.
//
// Any thread.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>

#include "common/Result.h"

namespace halyard::linux_ {

// Nobody else reads what is made from here on. Once, before there are threads.
void makeNewFilesPrivate();

// None: no readers. Holds for what is made or brought into line from here on.
void setReaders(std::optional<std::uint32_t> group);

// Makes a directory where there is none. One that is there is brought into line; a link
// to one is a failure. Its parent must be there.
Result<void> makePrivateDirectory(const std::filesystem::path& path);

// Brings one file or directory into line; others (links, sockets) stay as they are.
Result<void> keepPrivate(const std::filesystem::path& path);
// The same for an open file.
Result<void> keepPrivate(int descriptor);
// Lets the readers, where there are any, read a file that was just made.
Result<void> shareWithReaders(int descriptor);
// A failure when `directory` is a link: what stands in it is somebody else's choice.
Result<void> refuseLink(const std::filesystem::path& directory);
// A directory with everything below. Goes on after a failure, and tells of the first.
Result<void> keepTreePrivate(const std::filesystem::path& directory);

} // namespace halyard::linux_
