#include "linux/system/SmallFile.h"

#include <cerrno>
#include <unistd.h>

#include "linux/system/RegularFile.h"

namespace halyard::linux_ {

Result<std::string> readSmallFile(const std::filesystem::path& path, std::size_t most) {
    const RegularFile file(path);
    if (!file.opened().ok()) {
        return file.opened().failure();
    }
    // Sizes of procfs files are not known before they are read.
    std::string text;
    char chunk[4096];
    for (;;) {
        const ssize_t got = ::read(file.descriptor(), chunk, sizeof chunk);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got < 0) {
            return Failure::ofErrno();
        }
        if (got == 0) {
            return text;
        }
        text.append(chunk, static_cast<std::size_t>(got));
        if (text.size() > most) {
            return Failure{std::errc::file_too_large};
        }
    }
}

} // namespace halyard::linux_
