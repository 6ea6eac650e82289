// Memory that makes a thread wait when it is touched.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <thread>

namespace halyard::glitching {

// Pages of a disk file that nothing holds in memory: each costs a real read.
class DiskPages final {
public:
    // Writes the file (unlinked) below $TMPDIR or /tmp. Throws when it cannot.
    explicit DiskPages(std::size_t pages);
    ~DiskPages();
    DiskPages(const DiskPages&) = delete;
    DiskPages& operator=(const DiskPages&) = delete;

    void touch() const;

private:
    const std::size_t bytes_;
    int file_ = -1;
    volatile const std::byte* memory_ = nullptr;
};

// One page that a thread of this process provides as late as it is told to. The
// kernel counts the wait as a major fault, like one for a slow disk, and unlike
// with a disk it lasts exactly as long as a test wants.
class LatePage final {
public:
    // Throws where userfaultfd is not allowed.
    LatePage();
    ~LatePage();
    LatePage(const LatePage&) = delete;
    LatePage& operator=(const LatePage&) = delete;

    // From any one thread, which waits meanwhile.
    void touch(std::chrono::nanoseconds delay);

private:
    void provide() const;

    int faults_ = -1;
    int ending_ = -1;
    std::byte* page_ = nullptr;
    std::atomic<std::chrono::nanoseconds> delay_{std::chrono::nanoseconds(0)};
    std::thread provider_;
};

} // namespace halyard::glitching
