#include "linux/drivers/SharedFolder.h"

#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <memory>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include "linux/drivers/SampledFile.h"

namespace halyard::linux_ {
namespace {

constexpr mode_t kMode = S_ISVTX | S_IRWXU | S_IRWXG | S_IRWXO;
constexpr mode_t kModeBits = 07777;

class Descriptor {
public:
    explicit Descriptor(int number) : number_(number) {}
    ~Descriptor() {
        if (number_ >= 0) {
            ::close(number_);
        }
    }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    int number() const { return number_; }
    int release() { return std::exchange(number_, -1); }

private:
    int number_;
};

int openFolder(const std::filesystem::path& path) {
    return ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
}

Failure refused() {
    return {std::errc::operation_not_permitted};
}

} // namespace

Result<void> SharedFolder::make(const std::filesystem::path& path) {
    if (::mkdir(path.c_str(), S_IRWXU) != 0 && errno != EEXIST) {
        return Failure::ofErrno(path.native());
    }
    const Descriptor folder(openFolder(path));
    struct stat facts {};
    if (folder.number() < 0 || ::fstat(folder.number(), &facts) != 0) {
        return Failure::ofErrno(path.native());
    }
    // Another user's could be taken away, with what is in it.
    if (facts.st_uid != 0 && facts.st_uid != ::geteuid()) {
        return Failure{std::errc::operation_not_permitted, path.native()};
    }
    // The mode that mkdir() was told lacks what the umask says.
    if ((facts.st_mode & kModeBits) != kMode && ::fchmod(folder.number(), kMode) != 0) {
        return Failure::ofErrno(path.native());
    }
    return {};
}

bool SharedFolder::isThere() const {
    return Descriptor(openFolder(path_)).number() >= 0;
}

Result<int> SharedFolder::open(const std::string& name) const {
    const Descriptor folder(openFolder(path_));
    if (folder.number() < 0) {
        return Failure::ofErrno();
    }
    open_how how{};
    how.flags = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY | O_NOFOLLOW;
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_XDEV;
    Descriptor file(
        static_cast<int>(::syscall(SYS_openat2, folder.number(), name.c_str(), &how, sizeof how)));
    if (file.number() < 0) {
        const bool odd = errno == ELOOP || errno == EXDEV || errno == ENXIO || errno == EACCES;
        return odd ? refused() : Failure::ofErrno();
    }
    struct stat facts {};
    if (::fstat(file.number(), &facts) != 0 || !S_ISREG(facts.st_mode) || !trusts_(facts.st_uid)) {
        return refused();
    }
    return file.release();
}

bool SharedFolder::look(const std::function<bool(const char* name)>& visit) const {
    Descriptor folder(openFolder(path_));
    if (folder.number() < 0) {
        return meansAbsent(Failure::ofErrno());
    }
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(::fdopendir(folder.number()), ::closedir);
    if (entries == nullptr) {
        return false;
    }
    (void)folder.release(); // The list's now.
    for (std::size_t count = 0; count < kMaxEntries; ++count) {
        const dirent* const entry = ::readdir(entries.get());
        if (entry == nullptr) {
            return true;
        }
        if (!visit(entry->d_name)) {
            return false;
        }
    }
    return ::readdir(entries.get()) == nullptr;
}

} // namespace halyard::linux_
