#include "client/MessageRing.h"

#include <sys/mman.h>

#include <algorithm>
#include <cstring>
#include <new>

namespace halyard::client {
namespace {

// Each record begins with its length and 4 spare bytes; a length of zero means:
// not published. Cleared memory is what makes that true for the next lap.
constexpr std::size_t kPrefix = 8;
constexpr std::size_t kAlignment = 16;
// Marks the filler at the end of a lap, where the next record did not fit.
constexpr std::uint32_t kFiller = 0x80000000U;
// Flags in the tail, above every position.
constexpr std::uint64_t kSealed = std::uint64_t{1} << 63;
constexpr std::uint64_t kRewinding = std::uint64_t{1} << 62;
constexpr std::uint64_t kPosition = kRewinding - 1;
// The beginning of the ring, which is kept in use and in memory.
constexpr std::size_t kWarm = 128 * 1024;

constexpr std::size_t rounded(std::size_t bytes) {
    return (bytes + kPrefix + kAlignment - 1) & ~(kAlignment - 1);
}

char* map(std::size_t capacity) {
    void* const memory =
        ::mmap(nullptr, capacity, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (memory == MAP_FAILED) {
        throw std::bad_alloc();
    }
    ::madvise(memory, capacity, MADV_DONTFORK);
    // So that writers need not wait for the kernel to find pages; where it is not
    // supported they do, once.
    ::madvise(memory, std::min(capacity, kWarm), MADV_POPULATE_WRITE);
    return static_cast<char*>(memory);
}

} // namespace

MessageRing::MessageRing(std::size_t capacity) : capacity_(capacity), bytes_(map(capacity)) {}

MessageRing::~MessageRing() {
    ::munmap(bytes_, capacity_);
}

std::atomic<std::uint32_t>& MessageRing::lengthAt(std::uint64_t position) const noexcept {
    static_assert(sizeof(std::atomic<std::uint32_t>) == sizeof(std::uint32_t));
    return *reinterpret_cast<std::atomic<std::uint32_t>*>(bytes_ + (position & (capacity_ - 1)));
}

// Negative when `tail` is out of date.
std::int64_t MessageRing::usedAt(std::uint64_t tail) const noexcept {
    std::uint64_t head = head_.load(std::memory_order_acquire);
    if ((tail & kRewinding) != 0) {
        // The head is about to be where this lap begins; see rewind().
        head = tail & kPosition & ~(std::uint64_t{capacity_} - 1);
    }
    return static_cast<std::int64_t>((tail & kPosition) - head);
}

MessageRing::Claim MessageRing::claim(std::size_t bytes, std::size_t limit) noexcept {
    const std::size_t size = rounded(bytes);
    std::uint64_t tail = tail_.load(std::memory_order_relaxed);
    std::size_t filler = 0;
    std::int64_t used = 0;
    do {
        if ((tail & kSealed) != 0) {
            return {.outcome = Claim::Outcome::Sealed};
        }
        const std::size_t left = capacity_ - (tail & (capacity_ - 1));
        filler = left < size ? left : 0;
        used = usedAt(tail) + static_cast<std::int64_t>(filler + size);
        // While the lap's beginning stands for the head, the lap must not end.
        const bool ends = (tail & kRewinding) != 0 && left <= size;
        if (used > static_cast<std::int64_t>(limit) || ends) {
            return {.outcome = Claim::Outcome::Full};
        }
    } while (!tail_.compare_exchange_weak(tail, tail + filler + size, std::memory_order_seq_cst,
                                          std::memory_order_relaxed));
    tail &= kPosition;
    if (filler != 0) {
        lengthAt(tail).store(static_cast<std::uint32_t>(filler) | kFiller,
                             std::memory_order_release);
    }
    char* const start = bytes_ + ((tail + filler) & (capacity_ - 1));
    return {.outcome = Claim::Outcome::Granted,
            .bytes = start + kPrefix,
            .size = static_cast<std::uint32_t>(size),
            .used = static_cast<std::uint64_t>(used)};
}

void MessageRing::publish(const Claim& claim) noexcept {
    reinterpret_cast<std::atomic<std::uint32_t>*>(claim.bytes - kPrefix)
        ->store(claim.size, std::memory_order_release);
}

void MessageRing::seal() noexcept {
    tail_.fetch_or(kSealed);
}

std::uint64_t MessageRing::end() const noexcept {
    return tail_.load() & kPosition;
}

std::uint64_t MessageRing::used() const noexcept {
    // The tail is read first, so it may be out of date.
    return static_cast<std::uint64_t>(std::max<std::int64_t>(usedAt(tail_.load()), 0));
}

bool MessageRing::read(std::uint64_t position, Record& record) const noexcept {
    std::uint32_t length = lengthAt(position).load(std::memory_order_acquire);
    if ((length & kFiller) != 0) {
        position += length & ~kFiller;
        length = lengthAt(position).load(std::memory_order_acquire);
    }
    if (length == 0) {
        return false;
    }
    record = {bytes_ + (position & (capacity_ - 1)) + kPrefix, position + length};
    return true;
}

void MessageRing::clear(std::uint64_t from, std::uint64_t to) noexcept {
    const std::size_t start = from & (capacity_ - 1);
    const std::size_t size = to - from;
    const std::size_t first = std::min(size, capacity_ - start);
    std::memset(bytes_ + start, 0, first);
    std::memset(bytes_, 0, size - first);
}

void MessageRing::release(std::uint64_t position) noexcept {
    const std::uint64_t head = head_.load(std::memory_order_relaxed);
    if (position != head) {
        clear(head, position);
        head_.store(position, std::memory_order_release);
    }
}

// Skips the rest of the lap, as long as no writer has claimed anything of it.
// Between the two steps the head is behind; the flag tells writers where it is
// going to be, so that none of them sees a ring that is full of nothing.
void MessageRing::rewind() noexcept {
    std::uint64_t end = head_.load(std::memory_order_relaxed);
    const std::uint64_t offset = end & (capacity_ - 1);
    if (offset <= std::min(kWarm, capacity_) / 2) {
        return;
    }
    const std::uint64_t nextLap = end - offset + capacity_;
    if (tail_.compare_exchange_strong(end, nextLap | kRewinding)) {
        head_.store(nextLap, std::memory_order_release);
        tail_.fetch_and(~kRewinding);
    }
}

} // namespace halyard::client
