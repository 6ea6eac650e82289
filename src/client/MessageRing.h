// The bounded queue between the threads that report and the client's own thread:
// a ring of bytes with many writers and one reader.
//
// Why a ring and not a queue of objects: a writer neither allocates nor frees,
// and takes no lock that the reader or a preempted writer might hold. It claims
// its bytes with one compare-and-swap, copies, and publishes them by writing the
// record's length; when there is no room it is told so at once. One ring for all
// threads, and not one for each, because the order of calls across threads is
// what makes a session's create, start, messages and stop fit together. The
// price: a writer that is preempted between claim and publication holds up the
// reader (never another writer).
//
// Memory is mapped once and not shared with forked children, so that a fork does
// not make writers pay for copied pages.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace halyard::client {

class MessageRing {
public:
    // Requires that `capacity` is a power of two, at least 4,096. Throws
    // std::bad_alloc when it cannot be mapped.
    explicit MessageRing(std::size_t capacity);
    ~MessageRing();
    MessageRing(const MessageRing&) = delete;
    MessageRing& operator=(const MessageRing&) = delete;

    std::size_t capacity() const { return capacity_; }
    // The largest record that always finds room in an empty ring.
    std::size_t maxRecord() const { return capacity_ / 2; }

    // Writers, any thread. ------------------------------------------------------

    struct Claim {
        enum class Outcome { Granted, Full, Sealed };
        Outcome outcome;
        char* bytes = nullptr;  // 8-aligned
        std::uint32_t size = 0; // what publish() wants back
        std::uint64_t used = 0; // bytes in use, this record included
    };
    // Claims `bytes` if no more than `limit` bytes of the ring are in use then.
    // A granted claim must be published, and soon. Requires bytes <= maxRecord()
    // and limit <= capacity().
    Claim claim(std::size_t bytes, std::size_t limit) noexcept;
    void publish(const Claim& claim) noexcept;

    // Every later claim answers Sealed. Any thread.
    void seal() noexcept;
    std::uint64_t used() const noexcept;
    // Where the next record will go: see releasedTo().
    std::uint64_t end() const noexcept;
    // All records before this place have been released.
    std::uint64_t releasedTo() const noexcept { return head_.load(std::memory_order_acquire); }

    // The one reader. -----------------------------------------------------------

    struct Record {
        const char* bytes; // Valid until it is released.
        std::uint64_t next;
    };
    // The published record at `position`, which is releasedTo() or the `next` of
    // a record before. False when it is not published yet, or not even claimed.
    [[nodiscard]] bool read(std::uint64_t position, Record& record) const noexcept;
    // Gives the memory before `position` (some record's `next`) back to writers.
    void release(std::uint64_t position) noexcept;
    // When nothing is queued: goes back to the beginning of the memory if much of
    // it has been passed, so that a client which never has much queued never uses
    // more (and its writers find their pages in memory and cache). Moves
    // releasedTo().
    void rewind() noexcept;

private:
    std::int64_t usedAt(std::uint64_t tail) const noexcept;
    std::atomic<std::uint32_t>& lengthAt(std::uint64_t position) const noexcept;
    void clear(std::uint64_t from, std::uint64_t to) noexcept;

    static constexpr std::size_t kCacheLine = 64;
    const std::size_t capacity_;
    char* const bytes_;
    // Positions only grow; their low bits are the place in the ring.
    alignas(kCacheLine) std::atomic<std::uint64_t> tail_{0};
    alignas(kCacheLine) std::atomic<std::uint64_t> head_{0};
};

} // namespace halyard::client
