#include "linux/system/RegularFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halyard::linux_ {
namespace {

std::string pathOf(int descriptor) {
    return fmt::format("/proc/self/fd/{}", descriptor);
}

Result<void> checkKind(int descriptor) {
    struct stat facts {};
    if (::fstat(descriptor, &facts) != 0) {
        return Failure::ofErrno();
    }
    if (S_ISREG(facts.st_mode)) {
        return {};
    }
    return Failure{S_ISDIR(facts.st_mode) ? std::errc::is_a_directory
                                          : std::errc::invalid_argument};
}

} // namespace

RegularFile::RegularFile(const std::filesystem::path& path) {
    const int seen = ::open(path.c_str(), O_PATH | O_CLOEXEC);
    if (seen < 0) {
        opened_ = Failure::ofErrno();
        return;
    }
    opened_ = checkKind(seen);
    if (opened_.ok()) {
        descriptor_ = ::open(pathOf(seen).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
        if (descriptor_ < 0) {
            opened_ = Failure::ofErrno();
        }
    }
    ::close(seen);
}

RegularFile::~RegularFile() {
    if (descriptor_ >= 0) {
        ::close(descriptor_);
    }
}

std::string RegularFile::path() const {
    return pathOf(descriptor_);
}

} // namespace halyard::linux_
