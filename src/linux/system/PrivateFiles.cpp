#include "linux/system/PrivateFiles.h"

#include <atomic>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr mode_t kFileMode = 0600;
constexpr mode_t kSharedFileMode = 0640;
constexpr mode_t kDirectoryMode = 0750;
constexpr mode_t kModeBits = 07777;
constexpr std::int64_t kNobody = -1;

std::atomic<std::int64_t>& readers() {
    static std::atomic<std::int64_t> group{kNobody};
    return group;
}

mode_t wantedMode(const struct stat& facts, bool shared) {
    if (S_ISREG(facts.st_mode)) {
        return shared ? kSharedFileMode : kFileMode;
    }
    const mode_t kept = facts.st_mode & kModeBits & ~(mode_t{0777} & ~kDirectoryMode);
    return shared ? kept | kDirectoryMode : kept;
}

// `path` names what `facts` are of, also where a link has taken its place.
Result<void> apply(const struct stat& facts, const char* path) {
    if (!S_ISREG(facts.st_mode) && !S_ISDIR(facts.st_mode)) {
        return {};
    }
    const std::int64_t group = readers().load();
    bool shared = group != kNobody;
    Result<void> result;
    // Before the mode: a file that the readers do not own is not opened to its group.
    if (shared && facts.st_gid != static_cast<gid_t>(group) &&
        ::chown(path, static_cast<uid_t>(-1), static_cast<gid_t>(group)) != 0) {
        result = Failure::ofErrno();
        shared = false;
    }
    const mode_t mode = wantedMode(facts, shared);
    if ((facts.st_mode & kModeBits) != mode && ::chmod(path, mode) != 0) {
        result = Failure::ofErrno();
    }
    return result;
}

} // namespace

void makeNewFilesPrivate() {
    (void)::umask(S_IRWXG | S_IRWXO);
}

Result<void> makePrivateDirectory(const fs::path& path) {
    if (::mkdir(path.c_str(), kDirectoryMode) == 0) {
        // What mkdir() was told lacks what the umask says.
        if (::chmod(path.c_str(), kDirectoryMode) != 0) {
            return Failure::ofErrno(path.native());
        }
        return keepPrivate(path);
    }
    const Failure failure = Failure::ofErrno(path.native());
    struct stat facts {};
    if (failure.code != std::errc::file_exists || ::lstat(path.c_str(), &facts) != 0) {
        return failure;
    }
    if (Result<void> link = refuseLink(path); !link.ok()) {
        return link;
    }
    return S_ISDIR(facts.st_mode) ? keepPrivate(path) : failure;
}

void setReaders(std::optional<std::uint32_t> group) {
    readers() = group ? std::int64_t{*group} : kNobody;
}

Result<void> keepPrivate(int descriptor) {
    struct stat facts {};
    if (::fstat(descriptor, &facts) != 0) {
        return Failure::ofErrno();
    }
    return apply(facts, ("/proc/self/fd/" + std::to_string(descriptor)).c_str());
}

Result<void> shareWithReaders(int descriptor) {
    return readers().load() == kNobody ? Result<void>() : keepPrivate(descriptor);
}

Result<void> refuseLink(const fs::path& directory) {
    std::error_code ignored;
    if (fs::is_symlink(fs::symlink_status(directory, ignored))) {
        return Failure{std::errc::too_many_symbolic_link_levels, directory.native()};
    }
    return {};
}

// Opened as a mere place: closing any other descriptor of the store's file would let
// go of the locks that SQLite holds on it.
Result<void> keepPrivate(const fs::path& path) {
    const int descriptor = ::open(path.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC);
    if (descriptor < 0) {
        return Failure::ofErrno(path.native());
    }
    Result<void> done = keepPrivate(descriptor);
    ::close(descriptor);
    return done.ok() ? done : Failure{done.failure().code, path.native()};
}

Result<void> keepTreePrivate(const fs::path& directory) {
    Result<void> result = keepPrivate(directory);
    std::error_code error;
    if (!result.ok() || !fs::is_directory(fs::symlink_status(directory, error))) {
        return result;
    }
    fs::recursive_directory_iterator entry(directory, fs::directory_options::skip_permission_denied,
                                           error);
    for (; !error && entry != fs::recursive_directory_iterator(); entry.increment(error)) {
        const Result<void> kept = keepPrivate(entry->path());
        // What has gone meanwhile needs nothing.
        if (!kept.ok() && kept.failure().code != std::errc::no_such_file_or_directory) {
            result = result.ok() ? kept : result;
        }
    }
    return result;
}

} // namespace halyard::linux_
