#include "linux/system/SmallFile.h"

#include <cerrno>
#include <unistd.h>

#include "linux/system/RegularFile.h"

namespace halyard::linux_ {
namespace {

std::errc lastError() {
    return static_cast<std::errc>(errno);
}

} // namespace

std::variant<std::string, std::errc> readSmallFile(const std::filesystem::path& path,
                                                   std::size_t most) {
    const RegularFile file(path);
    if (file.error() != std::errc{}) {
        return file.error();
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
            return lastError();
        }
        if (got == 0) {
            return text;
        }
        text.append(chunk, static_cast<std::size_t>(got));
        if (text.size() > most) {
            return std::errc::file_too_large;
        }
    }
}

} // namespace halyard::linux_
