// A disk that misbehaves, for the tests of the whole daemon: loaded before the C library,
// it looks into the file that FAULTY_DISK names before each sync and each read.
//
// "hang": no sync comes back while that stands there. "slow MS": each takes so long. "eio":
// files of the store cannot be read. Syncs and bytes written are counted in the file with
// ".counts" behind its name, as two numbers of 8 bytes.

#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

namespace {

struct Counts {
    std::atomic<unsigned long> syncs;
    std::atomic<unsigned long> bytes;
};

template <class Function> Function* next(Function*, const char* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

Counts& counts() {
    static Counts none;
    static Counts* const mapped = [] {
        const char* const path = std::getenv("FAULTY_DISK");
        if (path == nullptr) {
            return &none;
        }
        std::array<char, PATH_MAX> name{};
        (void)std::snprintf(name.data(), name.size(), "%s.counts", path);
        const int fd = ::open(name.data(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        if (fd < 0 || ::ftruncate(fd, sizeof(Counts)) != 0) {
            return &none;
        }
        void* const memory =
            ::mmap(nullptr, sizeof(Counts), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
        ::close(fd);
        return memory == MAP_FAILED ? &none : static_cast<Counts*>(memory);
    }();
    return *mapped;
}

std::array<char, 64> order() {
    std::array<char, 64> text{};
    const char* const path = std::getenv("FAULTY_DISK");
    const int fd = path == nullptr ? -1 : ::open(path, O_RDONLY | O_CLOEXEC);
    if (fd >= 0) {
        (void)!::read(fd, text.data(), text.size() - 1);
        ::close(fd);
    }
    return text;
}

void beforeSync() {
    ++counts().syncs;
    std::array<char, 64> now = order();
    if (std::strncmp(now.data(), "slow ", 5) == 0) {
        ::usleep(static_cast<useconds_t>(std::atoi(now.data() + 5)) * 1000);
    }
    while (std::strncmp(now.data(), "hang", 4) == 0) {
        ::usleep(10000);
        now = order();
    }
}

bool isOfStore(int fd) {
    std::array<char, 64> link{};
    std::array<char, PATH_MAX> path{};
    (void)std::snprintf(link.data(), link.size(), "/proc/self/fd/%d", fd);
    return ::readlink(link.data(), path.data(), path.size() - 1) > 0 &&
           std::strstr(path.data(), "telemetry.db") != nullptr;
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
    if (std::strncmp(order().data(), "eio", 3) == 0 && isOfStore(fd)) {
        errno = EIO;
        return -1;
    }
    return real(fd, bytes, count, offset);
}

ssize_t pwrite64(int fd, const void* bytes, size_t count, off64_t offset) {
    static auto* const real = next(&pwrite64, "pwrite64");
    const ssize_t written = real(fd, bytes, count, offset);
    counts().bytes += written > 0 ? static_cast<unsigned long>(written) : 0;
    return written;
}
}
