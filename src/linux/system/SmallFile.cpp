#include "linux/system/SmallFile.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halyard::linux_ {
namespace {

std::errc lastError() {
    return static_cast<std::errc>(errno);
}

class OpenFile {
public:
    explicit OpenFile(const std::filesystem::path& path)
        : descriptor_(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY)) {}
    ~OpenFile() {
        if (descriptor_ >= 0) {
            ::close(descriptor_);
        }
    }
    OpenFile(const OpenFile&) = delete;
    OpenFile& operator=(const OpenFile&) = delete;

    int descriptor() const { return descriptor_; }

private:
    const int descriptor_;
};

} // namespace

std::variant<std::string, std::errc> readSmallFile(const std::filesystem::path& path,
                                                   std::size_t most) {
    const OpenFile file(path);
    struct stat facts {};
    if (file.descriptor() < 0 || ::fstat(file.descriptor(), &facts) != 0) {
        return lastError();
    }
    if (!S_ISREG(facts.st_mode)) {
        return S_ISDIR(facts.st_mode) ? std::errc::is_a_directory : std::errc::invalid_argument;
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
