#include "linux/drivers/SampledFile.h"

#include <cerrno>
#include <fcntl.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>
#include <utility>

namespace halyard::linux_ {
namespace {

constexpr std::size_t kFirstRead = 4096;

Result<int> openPath(const std::filesystem::path& path) {
    const int descriptor = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    return descriptor >= 0 ? Result<int>(descriptor) : Failure::ofErrno();
}

} // namespace

SampledFile::SampledFile(std::filesystem::path path, DescriptorBudget& budget, Opener opener)
    : path_(std::move(path)), budget_(&budget), opener_(std::move(opener)) {}

SampledFile::SampledFile(SampledFile&& other) noexcept
    : path_(std::move(other.path_)), budget_(other.budget_), opener_(std::move(other.opener_)),
      descriptor_(std::exchange(other.descriptor_, -1)), ofKernel_(other.ofKernel_),
      oneRead_(other.oneRead_) {}

SampledFile::~SampledFile() {
    close();
}

void SampledFile::close() {
    if (descriptor_ >= 0) {
        ::close(descriptor_);
        descriptor_ = -1;
        budget_->fetch_add(1);
    }
}

Result<void> SampledFile::open() {
    const Result<int> opened = opener_ ? opener_() : openPath(path_);
    if (!opened.ok()) {
        return opened.failure();
    }
    const int descriptor = opened.value();
    struct stat facts {};
    if (::fstat(descriptor, &facts) != 0 || !S_ISREG(facts.st_mode)) {
        ::close(descriptor);
        return Failure{S_ISDIR(facts.st_mode) ? std::errc::is_a_directory
                                              : std::errc::invalid_argument};
    }
    struct statfs system {};
    if (::fstatfs(descriptor, &system) == 0) {
        const auto type = static_cast<unsigned long>(system.f_type);
        oneRead_ = type == SYSFS_MAGIC;
        ofKernel_ =
            oneRead_ || type == PROC_SUPER_MAGIC || type == TRACEFS_MAGIC || type == DEBUGFS_MAGIC;
    }
    descriptor_ = descriptor;
    budget_->fetch_sub(1);
    return {};
}

// Scripts write a new file and move it over the old one, which stays readable
// through us, unchanged for ever.
bool SampledFile::isStillTheFile() const {
    if (ofKernel_) {
        return true;
    }
    struct stat opened {};
    struct stat named {};
    return ::fstat(descriptor_, &opened) == 0 && ::stat(path_.c_str(), &named) == 0 &&
           opened.st_dev == named.st_dev && opened.st_ino == named.st_ino;
}

Result<void> SampledFile::readOpen(std::string& text) const {
    text.resize(kFirstRead);
    std::size_t have = 0;
    for (;;) {
        if (have == text.size()) {
            if (have > kMaxSampledFile) {
                return Failure{std::errc::file_too_large};
            }
            text.resize(have * 4);
        }
        const ssize_t got =
            ::pread(descriptor_, text.data() + have, text.size() - have, static_cast<off_t>(have));
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got < 0) {
            return Failure::ofErrno();
        }
        have += static_cast<std::size_t>(got);
        if (got == 0 || (oneRead_ && have < text.size())) {
            break;
        }
    }
    text.resize(have);
    if (have > kMaxSampledFile) {
        return Failure{std::errc::file_too_large};
    }
    return {};
}

Result<void> SampledFile::read(std::string& text) {
    text.clear();
    if (descriptor_ >= 0) {
        if (isStillTheFile() && readOpen(text).ok()) {
            return {};
        }
        close();
    }
    Result<void> result = open();
    if (result.ok()) {
        result = readOpen(text);
        if (!result.ok() || opener_ || budget_->load() < 0) {
            close();
        }
    }
    if (!result.ok()) {
        text.clear();
    }
    return result;
}

} // namespace halyard::linux_
