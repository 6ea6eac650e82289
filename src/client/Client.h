// What the handles of the C ABI share: the queue, the way to wake its reader, the
// counters, and the thread (see Worker) behind them.
//
// submit() is the hand-over, real-time safe and for any thread; the rest says
// who calls it.
#pragma once

#include <pthread.h>

#include <array>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "client/Connection.h"
#include "client/MessageRing.h"
#include "client/Record.h"
#include "client/TimeStamps.h"
#include "client/WakeUp.h"
#include "common/Mutex.h"
#include "protocol/ClientLosses.h"

namespace halyard::client {

struct Settings {
    std::vector<std::string> socketPaths; // The first that takes a connection counts.
    std::size_t memoryLimit = 0;          // 0: default
    std::chrono::milliseconds retryFirst{0};
    std::chrono::milliseconds retryLast{0};
    halyard_connection_fn connectionChanged = nullptr;
    void* context = nullptr;
};

// What a call hands over. Borrows all of it during submit().
struct Submission {
    Record record;
    const std::int64_t* ids = nullptr; // record.idCount of them
    std::string_view body = {};        // of a dictionary with record.entryCount entries
    std::string_view tail = {};        // goes behind the body; its entries count there, too
    bool stamped = false;              // Gets the time stamps that are not `present`.
    StampSet present = kNoStamps;
};

// A session that found no room for its destruction in the queue; the thread sees
// to it when the queue is empty.
struct Abandoned {
    std::int64_t reporterID = 0;
    bool started = false;
    Abandoned* next = nullptr;
};

class Client {
public:
    using SteadyTime = std::chrono::steady_clock::time_point;

    static constexpr std::size_t kDefaultMemory = 4 * 1024 * 1024;
    static constexpr std::size_t kLeastMemory = 64 * 1024;
    static constexpr std::uint32_t kMaxSessions = 65536;

    struct Counters {
        std::atomic<std::uint64_t> sent{0};
        std::atomic<std::uint64_t> queueFull{0};
        std::atomic<std::uint64_t> discarded{0};
        std::atomic<std::uint64_t> tooLarge{0};
        std::atomic<std::uint64_t> invalid{0};
        std::atomic<std::uint64_t> reconnects{0};
    };

    // Borrows `clock` for good. Throws std::bad_alloc.
    Client(Settings settings, const Clock& clock);
    Client(const Client&) = delete;
    Client& operator=(const Client&) = delete;

    // False when there is no thread to be had. Once, right after construction.
    [[nodiscard]] bool startThread();

    // Any thread. -----------------------------------------------------------------

    [[nodiscard]] halyard_result submit(const Submission& submission) noexcept;
    // Counts a record that is not handed over; answers `reason`.
    halyard_result refuse(const Record& record, halyard_result reason) noexcept;
    // Takes it.
    void abandon(std::unique_ptr<Abandoned> session) noexcept;
    bool isForked() const noexcept { return generation_ != forkGeneration(); }
    // True on this client's own thread, that is, in one of its callbacks.
    bool onThread() const noexcept;
    halyard_result flush(std::chrono::milliseconds timeout);
    // Ends the thread. Once.
    halyard_result close(std::chrono::milliseconds timeout);
    Counters& counters() noexcept { return counters_; }
    // Messages that were dropped, by protocol::ClientLoss.
    using Losses = std::array<std::uint64_t, protocol::kClientLossNames.size()>;
    Losses losses() const noexcept;
    const MessageRing& queue() const noexcept { return ring_; }
    // False when there are too many already.
    [[nodiscard]] bool countSession() noexcept;
    void uncountSession() noexcept { sessions_.fetch_sub(1); }

    // The client's thread. --------------------------------------------------------

    const Settings& settings() const noexcept { return settings_; }
    MessageRing& ring() noexcept { return ring_; }
    WakeUp& wakeUp() noexcept { return wakeUp_; }
    // Messages leave the last part of the queue to the other requests, so that
    // those, which the sessions' state is made of, always find room.
    std::size_t messageLimit() const noexcept { return ring_.capacity() - reserve(); }
    // From here on the queue is to be cut when it cannot be delivered.
    std::size_t cutMark() const noexcept { return ring_.capacity() - reserve() / 2; }
    bool isClosing() const noexcept { return closing_.load(); }
    // Requires isClosing().
    SteadyTime closingDeadline() const noexcept { return closingDeadline_; }
    void reportLeftovers() noexcept { leftovers_ = true; }
    bool hasAbandoned() const noexcept { return abandoned_.load() != nullptr; }
    // Linked by `next`; the caller owns all. Null when there are none.
    Abandoned* takeAbandoned() noexcept { return abandoned_.exchange(nullptr); }
    // Wakes whom flush() made wait for what has been released since.
    void announceReleased();

private:
    std::size_t reserve() const noexcept { return ring_.capacity() / 8; }
    void write(const MessageRing::Claim& claim, const Submission& submission) const noexcept;

    const Settings settings_;
    const Clock& clock_;
    MessageRing ring_;
    WakeUp wakeUp_;
    Counters counters_;
    // After what announces the process's forks has been set up by the worker's
    // connection; see startThread().
    std::uint32_t generation_ = 0;
    std::atomic<std::uint32_t> sessions_{0};
    std::atomic<Abandoned*> abandoned_{nullptr};

    pthread_t thread_{};
    std::atomic<bool> closing_{false};
    SteadyTime closingDeadline_; // Written before closing_.
    bool leftovers_ = false;     // Read when the thread has ended.

    Mutex flushMutex_; // Orders what is announced with who waits; guards nothing else.
    std::condition_variable_any flushed_;
    std::atomic<std::uint32_t> flushWaiters_{0};
    std::atomic<std::uint64_t> announced_{0};
};

// Where the daemon's socket is looked for, in this order. `environment` answers
// like getenv().
std::vector<std::string> defaultSocketPaths(const char* (*environment)(const char*), bool isRoot);

} // namespace halyard::client
