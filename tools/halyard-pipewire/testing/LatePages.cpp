#include "LatePages.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <linux/fuse.h>
#include <string>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <system_error>
#include <unistd.h>

namespace halyard::glitching {

namespace {

constexpr std::size_t kPage = 4096;

void require(bool holds, const char* what) {
    if (!holds) {
        throw std::system_error(errno, std::generic_category(), what);
    }
}

void reply(int to, std::uint64_t request, const void* data, std::size_t size, int error = 0) {
    fuse_out_header header{.len = static_cast<std::uint32_t>(sizeof header + size),
                           .error = -error,
                           .unique = request};
    const std::array<iovec, 2> parts{{{&header, sizeof header}, {const_cast<void*>(data), size}}};
    static_cast<void>(writev(to, parts.data(), parts.size()));
}

template <class Answer> void reply(int to, std::uint64_t request, const Answer& answer) {
    reply(to, request, &answer, sizeof answer);
}

fuse_init_out agreement() {
    fuse_init_out out{};
    out.major = FUSE_KERNEL_VERSION;
    out.minor = FUSE_KERNEL_MINOR_VERSION;
    out.max_write = kPage;
    return out;
}

fuse_attr_out attributes(std::size_t bytes) {
    fuse_attr_out out{};
    out.attr_valid = 3600;
    out.attr.ino = FUSE_ROOT_ID;
    out.attr.size = bytes;
    out.attr.mode = S_IFREG | 0400;
    out.attr.nlink = 1;
    return out;
}

} // namespace

LatePages::LatePages(std::size_t count, std::chrono::nanoseconds delay)
    : count_(count), delay_(delay), requests_(::open("/dev/fuse", O_RDWR | O_CLOEXEC)) {
    require(requests_ >= 0, "/dev/fuse");
    open();
}

// The file system is but that file, and nobody else finds it.
void LatePages::open() {
    std::string name = "/tmp/glitch-XXXXXX";
    const int place = mkstemp(name.data());
    require(place >= 0, "mkstemp");
    close(place);
    const std::string options =
        "fd=" + std::to_string(requests_) + ",rootmode=100400,user_id=0,group_id=0";
    const bool mounted =
        mount("glitch", name.c_str(), "fuse", MS_NOSUID | MS_NODEV, options.c_str()) == 0;
    const int error = errno;
    if (mounted) {
        server_ = std::thread([this] { serve(); });
        const int file = ::open(name.c_str(), O_RDONLY | O_CLOEXEC);
        struct stat size {};
        fstat(file, &size); // the kernel asks for no size by itself
        void* const memory = mmap(nullptr, count_ * kPage, PROT_READ, MAP_PRIVATE, file, 0);
        madvise(memory, count_ * kPage, MADV_RANDOM); // no reading ahead
        memory_ = static_cast<std::byte*>(memory);
        close(file);
        umount2(name.c_str(), MNT_DETACH);
    }
    unlink(name.c_str());
    errno = error;
    require(mounted, "mount");
}

// The last reference to the file system is the mapping: without it requests end.
LatePages::~LatePages() {
    munmap(const_cast<std::byte*>(memory_), count_ * kPage);
    server_.join();
    close(requests_);
}

void LatePages::serve() const {
    while (answerNext()) {
    }
}

bool LatePages::answerNext() const {
    alignas(fuse_in_header) std::array<char, FUSE_MIN_READ_BUFFER + kPage> buffer{};
    const ssize_t size = read(requests_, buffer.data(), buffer.size());
    if (size < static_cast<ssize_t>(sizeof(fuse_in_header))) {
        return size < 0 && (errno == EINTR || errno == EAGAIN || errno == ENOENT);
    }
    fuse_in_header request{};
    std::memcpy(&request, buffer.data(), sizeof request);
    switch (request.opcode) {
    case FUSE_INIT:
        reply(requests_, request.unique, agreement());
        break;
    case FUSE_GETATTR:
        reply(requests_, request.unique, attributes(count_ * kPage));
        break;
    case FUSE_OPEN:
        reply(requests_, request.unique, fuse_open_out{});
        break;
    case FUSE_READ: {
        std::this_thread::sleep_for(delay_);
        static constexpr std::array<char, kPage> kNothing{};
        reply(requests_, request.unique, kNothing);
        break;
    }
    case FUSE_FORGET:
    case FUSE_BATCH_FORGET:
    case FUSE_INTERRUPT:
        break; // not to be answered
    default:
        reply(requests_, request.unique, nullptr, 0, ENOSYS);
    }
    return true;
}

void LatePages::touchNext() {
    static_cast<void>(memory_[touched_]);
    touched_ += kPage;
}

} // namespace halyard::glitching
