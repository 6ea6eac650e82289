#include "linux/system/RegularFile.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halyard::linux_ {
namespace {

std::string pathOf(int descriptor) {
    return fmt::format("/proc/self/fd/{}", descriptor);
}

std::errc lastError() {
    return static_cast<std::errc>(errno);
}

std::errc kindError(int descriptor) {
    struct stat facts {};
    if (::fstat(descriptor, &facts) != 0) {
        return lastError();
    }
    if (S_ISDIR(facts.st_mode)) {
        return std::errc::is_a_directory;
    }
    return S_ISREG(facts.st_mode) ? std::errc{} : std::errc::invalid_argument;
}

} // namespace

RegularFile::RegularFile(const std::filesystem::path& path) {
    const int seen = ::open(path.c_str(), O_PATH | O_CLOEXEC);
    if (seen < 0) {
        error_ = lastError();
        return;
    }
    error_ = kindError(seen);
    if (error_ == std::errc{}) {
        descriptor_ = ::open(pathOf(seen).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
        error_ = descriptor_ < 0 ? lastError() : std::errc{};
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
