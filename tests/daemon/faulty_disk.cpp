// A disk that misbehaves and a clock that jumps, for the tests of the whole daemon: loaded
// before the C library, it looks before each call into memory that it shares with the test.
// That is the file which FAULTY_DISK names, and faulty_disk.py is the other side.
//
// Faults concern what lies in the daemon's folders "state" and "log", and syncs of anything.

#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <dlfcn.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

// The numbers are those of faulty_disk.py.
enum Fault : std::int64_t {
    kNone,
    kSlow,       // each sync takes `milliseconds` longer
    kHang,       // no sync comes back while this is set
    kReadError,  // EIO
    kWriteError, // EIO
    kTorn,       // half of each write reaches the file, then EIO
    kFull,       // ENOSPC
    kReadOnly,   // EROFS
};

struct Shared {
    std::atomic<std::int64_t> syncs;
    std::atomic<std::int64_t> bytes;
    std::atomic<std::int64_t> fault;
    std::atomic<std::int64_t> milliseconds;
    std::atomic<std::int64_t> clockSeconds; // by which the wall clock is ahead
};

template <class Function> Function* next(Function*, const char* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

Shared& shared() {
    static Shared none;
    static Shared* const mapped = [] {
        const char* const path = std::getenv("FAULTY_DISK");
        // Not open(): that is ours, and asks for this.
        const auto fd = static_cast<int>(
            path == nullptr ? -1 : ::syscall(SYS_openat, AT_FDCWD, path, O_RDWR | O_CLOEXEC));
        if (fd < 0) {
            return &none;
        }
        void* const memory =
            ::mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
        ::close(fd);
        return memory == MAP_FAILED ? &none : static_cast<Shared*>(memory);
    }();
    return *mapped;
}

void beforeSync() {
    ++shared().syncs;
    if (shared().fault == kSlow) {
        ::usleep(static_cast<useconds_t>(shared().milliseconds) * 1000);
    }
    while (shared().fault == kHang) {
        ::usleep(10000);
    }
}

bool isOurs(const char* path) {
    return std::strstr(path, "/state") != nullptr || std::strstr(path, "/log/") != nullptr;
}

bool isOurs(int fd) {
    std::array<char, 64> link{};
    std::array<char, PATH_MAX> path{};
    (void)std::snprintf(link.data(), link.size(), "/proc/self/fd/%d", fd);
    return ::readlink(link.data(), path.data(), path.size() - 1) > 0 && isOurs(path.data());
}

// The error of a call that changes what lies there; 0 when it may go on.
template <class Place> int errorOfChange(Place place) {
    const std::int64_t fault = shared().fault;
    const int error = fault == kFull                           ? ENOSPC
                      : fault == kReadOnly                     ? EROFS
                      : fault == kWriteError || fault == kTorn ? EIO
                                                               : 0;
    return error != 0 && isOurs(place) ? error : 0;
}

bool refused(int error) {
    errno = error != 0 ? error : errno;
    return error != 0;
}

bool readingFails(int fd) {
    return shared().fault == kReadError && isOurs(fd) && refused(EIO);
}

// Nothing new can be made, and on a read-only disk nothing be opened for writing.
bool openingFails(const char* path, int flags) {
    const int error = (flags & (O_CREAT | O_ACCMODE)) == 0 ? 0 : errorOfChange(path);
    const bool concerned = error == EROFS || ((flags & O_CREAT) != 0 && ::access(path, F_OK) != 0);
    return concerned && refused(error);
}

} // namespace

extern "C" {

int fsync(int fd) {
    static auto* const real = next(&fsync, "fsync");
    beforeSync();
    return real(fd);
}

int fdatasync(int fd) {
    static auto* const real = next(&fdatasync, "fdatasync");
    beforeSync();
    return real(fd);
}

ssize_t pread64(int fd, void* bytes, size_t count, off64_t offset) {
    static auto* const real = next(&pread64, "pread64");
    return readingFails(fd) ? -1 : real(fd, bytes, count, offset);
}

ssize_t read(int fd, void* bytes, size_t count) {
    static auto* const real = next(&read, "read");
    return readingFails(fd) ? -1 : real(fd, bytes, count);
}

ssize_t pwrite64(int fd, const void* bytes, size_t count, off64_t offset) {
    static auto* const real = next(&pwrite64, "pwrite64");
    if (const int error = errorOfChange(fd); error != 0) {
        if (shared().fault == kTorn) {
            (void)!real(fd, bytes, count / 2, offset);
        }
        errno = error;
        return -1;
    }
    const ssize_t written = real(fd, bytes, count, offset);
    shared().bytes += written > 0 ? written : 0;
    return written;
}

ssize_t write(int fd, const void* bytes, size_t count) {
    static auto* const real = next(&write, "write");
    return refused(errorOfChange(fd)) ? -1 : real(fd, bytes, count);
}

int ftruncate64(int fd, off64_t length) {
    static auto* const real = next(&ftruncate64, "ftruncate64");
    const int error = errorOfChange(fd);
    return error == EROFS && refused(error) ? -1 : real(fd, length);
}

int open(const char* path, int flags, ...) {
    static auto* const real = next(&open, "open");
    std::va_list arguments;
    va_start(arguments, flags);
    const auto mode = static_cast<mode_t>((flags & O_CREAT) != 0 ? va_arg(arguments, int) : 0);
    va_end(arguments);
    return openingFails(path, flags) ? -1 : real(path, flags, mode);
}

int open64(const char* path, int flags, ...) {
    static auto* const real = next(&open64, "open64");
    std::va_list arguments;
    va_start(arguments, flags);
    const auto mode = static_cast<mode_t>((flags & O_CREAT) != 0 ? va_arg(arguments, int) : 0);
    va_end(arguments);
    return openingFails(path, flags) ? -1 : real(path, flags, mode);
}

int access(const char* path, int mode) noexcept {
    static auto* const real = next(&access, "access");
    const int error = (mode & W_OK) != 0 ? errorOfChange(path) : 0;
    return error == EROFS && refused(error) ? -1 : real(path, mode);
}

int unlink(const char* path) noexcept {
    static auto* const real = next(&unlink, "unlink");
    const int error = errorOfChange(path);
    return error == EROFS && refused(error) ? -1 : real(path);
}

int rename(const char* from, const char* to) noexcept {
    static auto* const real = next(&rename, "rename");
    const int error = errorOfChange(to);
    return error == EROFS && refused(error) ? -1 : real(from, to);
}

int clock_gettime(clockid_t clock, timespec* time) noexcept {
    static auto* const real = next(&clock_gettime, "clock_gettime");
    const int status = real(clock, time);
    if (status == 0 && clock == CLOCK_REALTIME) {
        time->tv_sec += shared().clockSeconds;
    }
    return status;
}
}
