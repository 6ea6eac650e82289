#include "SlowPages.h"

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <fcntl.h>
#include <linux/userfaultfd.h>
#include <poll.h>
#include <string>
#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <system_error>
#include <unistd.h>
#include <vector>

namespace halyard::glitching {

namespace {

constexpr std::size_t kPage = 4096;

void require(bool holds, const char* what) {
    if (!holds) {
        throw std::system_error(errno, std::generic_category(), what);
    }
}

int unlinkedFile() {
    const char* const folder = std::getenv("TMPDIR");
    std::string name = std::string(folder == nullptr ? "/tmp" : folder) + "/glitch-XXXXXX";
    const int file = mkstemp(name.data());
    require(file >= 0, name.c_str());
    unlink(name.c_str());
    return file;
}

std::byte* map(std::size_t bytes, int protection, int flags, int file) {
    void* const memory = mmap(nullptr, bytes, protection, flags, file, 0);
    require(memory != MAP_FAILED, "mmap");
    return static_cast<std::byte*>(memory);
}

} // namespace

DiskPages::DiskPages(std::size_t pages) : bytes_(pages * kPage), file_(unlinkedFile()) {
    const std::vector<std::byte> page(kPage, std::byte{1});
    for (std::size_t written = 0; written < bytes_; written += kPage) {
        require(write(file_, page.data(), kPage) == static_cast<ssize_t>(kPage), "write");
    }
    require(fsync(file_) == 0, "fsync");
    std::byte* const memory = map(bytes_, PROT_READ, MAP_SHARED, file_);
    memory_ = memory;
    madvise(memory, bytes_, MADV_RANDOM); // no reading ahead
    posix_fadvise(file_, 0, 0, POSIX_FADV_DONTNEED);
}

DiskPages::~DiskPages() {
    munmap(const_cast<std::byte*>(memory_), bytes_);
    close(file_);
}

void DiskPages::touch() const {
    for (std::size_t offset = 0; offset < bytes_; offset += kPage) {
        static_cast<void>(memory_[offset]);
    }
}

LatePage::LatePage()
    : faults_(
          static_cast<int>(syscall(SYS_userfaultfd, O_CLOEXEC | O_NONBLOCK | UFFD_USER_MODE_ONLY))),
      ending_(eventfd(0, EFD_CLOEXEC)) {
    require(faults_ >= 0, "userfaultfd");
    uffdio_api api{.api = UFFD_API, .features = 0, .ioctls = 0};
    require(ioctl(faults_, UFFDIO_API, &api) == 0, "UFFDIO_API");
    page_ = map(kPage, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1);
    uffdio_register range{.range = {.start = reinterpret_cast<std::uintptr_t>(page_), .len = kPage},
                          .mode = UFFDIO_REGISTER_MODE_MISSING,
                          .ioctls = 0};
    require(ioctl(faults_, UFFDIO_REGISTER, &range) == 0, "UFFDIO_REGISTER");
    provider_ = std::thread([this] { provide(); });
}

LatePage::~LatePage() {
    eventfd_write(ending_, 1);
    provider_.join();
    munmap(page_, kPage);
    close(faults_);
    close(ending_);
}

void LatePage::provide() const {
    std::array<pollfd, 2> sources{{{faults_, POLLIN, 0}, {ending_, POLLIN, 0}}};
    while (poll(sources.data(), sources.size(), -1) > 0 && sources[1].revents == 0) {
        uffd_msg message{};
        if (read(faults_, &message, sizeof message) != sizeof message) {
            continue;
        }
        std::this_thread::sleep_for(delay_.load());
        uffdio_zeropage page{
            .range = {.start = reinterpret_cast<std::uintptr_t>(page_), .len = kPage},
            .mode = 0,
            .zeropage = 0};
        ioctl(faults_, UFFDIO_ZEROPAGE, &page);
    }
}

void LatePage::touch(std::chrono::nanoseconds delay) {
    delay_ = delay;
    madvise(page_, kPage, MADV_DONTNEED);
    static_cast<void>(*static_cast<volatile std::byte*>(page_));
}

} // namespace halyard::glitching
