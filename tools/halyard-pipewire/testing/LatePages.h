// Pages of a file whose contents come as late as a test wants: to the kernel, and
// to whoever touches one, they are on a very slow disk. Each costs one major fault
// and next to no processor time.
//
// The disk is a thread of this process that answers FUSE requests. (Pages that
// userfaultfd provides are not counted as major faults by every kernel, and those
// of a real disk cost the processor about as much time as the disk.)
#pragma once

#include <chrono>
#include <cstddef>
#include <thread>

namespace halyard::glitching {

class LatePages final {
public:
    // Throws for who may not mount anything.
    LatePages(std::size_t count, std::chrono::nanoseconds delay);
    ~LatePages();
    LatePages(const LatePages&) = delete;
    LatePages& operator=(const LatePages&) = delete;

    // One that nobody has touched. Requires that there is one left.
    void touchNext();

private:
    void open();
    void serve() const;
    bool answerNext() const;

    const std::size_t count_;
    const std::chrono::nanoseconds delay_;
    int requests_ = -1;
    std::thread server_;
    volatile const std::byte* memory_ = nullptr;
    std::size_t touched_ = 0;
};

} // namespace halyard::glitching
