#include "client/Client.h"

#include <signal.h>

#include <algorithm>
#include <bit>
#include <new>

#include "client/Frames.h"
#include "client/Worker.h"
#include "protocol/Wire.h"

namespace halyard::client {
namespace {

std::size_t capacityFor(std::size_t memoryLimit) {
    const std::size_t wanted = memoryLimit != 0 ? memoryLimit : Client::kDefaultMemory;
    // Lengths in the queue are 32 bits wide.
    return std::bit_floor(std::clamp<std::size_t>(wanted, Client::kLeastMemory, 1U << 30));
}

bool fitsFrame(const Submission& submission) {
    const std::size_t ids = submission.record.idCount;
    return submission.body.size() + submission.tail.size() + ids * (1 + sizeof(std::int64_t)) +
               kMaxStampBytes + kFrameOverhead <=
           protocol::kMaxFrameBytes;
}

// The client whose thread this is.
thread_local const Client* ownClient = nullptr;

struct ThreadStart {
    const Client* client;
    Worker worker;
};

void* runThread(void* argument) {
    const std::unique_ptr<ThreadStart> start(static_cast<ThreadStart*>(argument));
    ownClient = start->client;
    start->worker.run();
    return nullptr;
}

} // namespace

Client::Client(Settings settings, const Clock& clock)
    : settings_(std::move(settings)), clock_(clock), ring_(capacityFor(settings_.memoryLimit)) {}

// Signals are the host's business: the thread takes none.
bool Client::startThread() {
    std::unique_ptr<ThreadStart> start(new ThreadStart{this, Worker(*this)});
    generation_ = forkGeneration();
    sigset_t all;
    sigset_t before;
    ::sigfillset(&all);
    ::pthread_sigmask(SIG_SETMASK, &all, &before);
    const bool started = ::pthread_create(&thread_, nullptr, runThread, start.get()) == 0;
    ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
    if (started) {
        static_cast<void>(start.release()); // The thread's now.
        ::pthread_setname_np(thread_, "halyard");
    }
    return started;
}

bool Client::onThread() const noexcept {
    return ownClient == this;
}

halyard_result Client::refuse(const Record& record, halyard_result reason) noexcept {
    if (record.isMessage()) {
        auto& counter = reason == HALYARD_QUEUE_FULL  ? counters_.queueFull
                        : reason == HALYARD_TOO_LARGE ? counters_.tooLarge
                                                      : counters_.invalid;
        counter.fetch_add(1, std::memory_order_relaxed);
    }
    return reason;
}

void Client::write(const MessageRing::Claim& claim, const Submission& submission) const noexcept {
    char* const ids = claim.bytes + sizeof(Record);
    const std::size_t idBytes = submission.record.idCount * sizeof(std::int64_t);
    if (idBytes != 0) {
        std::memcpy(ids, submission.ids, idBytes);
    }
    char* const body = ids + idBytes;
    char* end = std::copy(submission.body.begin(), submission.body.end(), body);
    end = std::copy(submission.tail.begin(), submission.tail.end(), end);
    Stamps stamps;
    if (submission.stamped) {
        stamps = writeMissingStamps(end, submission.present, clock_);
    }
    Record record = submission.record;
    record.bodyBytes =
        static_cast<std::uint32_t>(end - body) + static_cast<std::uint32_t>(stamps.bytes);
    record.entryCount += stamps.entries;
    new (claim.bytes) Record(record);
}

halyard_result Client::submit(const Submission& submission) noexcept {
    const Record& record = submission.record;
    if (isForked()) {
        return HALYARD_FORKED;
    }
    const std::size_t size = sizeof(Record) + record.idCount * sizeof(std::int64_t) +
                             submission.body.size() + submission.tail.size() +
                             (submission.stamped ? kMaxStampBytes : 0);
    if (!fitsFrame(submission) || size > ring_.maxRecord()) {
        return refuse(record, HALYARD_TOO_LARGE);
    }
    const std::size_t limit = record.isMessage() ? messageLimit() : ring_.capacity();
    const MessageRing::Claim claim = ring_.claim(size, limit);
    if (claim.outcome == MessageRing::Claim::Outcome::Sealed) {
        return HALYARD_CLOSED;
    }
    if (claim.outcome == MessageRing::Claim::Outcome::Full) {
        return refuse(record, HALYARD_QUEUE_FULL);
    }
    write(claim, submission);
    ring_.publish(claim);
    wakeUp_.notify(claim.used, !record.isMessage() || record.callback);
    return HALYARD_OK;
}

void Client::abandon(std::unique_ptr<Abandoned> session) noexcept {
    Abandoned* const added = session.release();
    added->next = abandoned_.load(std::memory_order_relaxed);
    while (!abandoned_.compare_exchange_weak(added->next, added)) {
    }
    wakeUp_.notify(0, true);
}

Client::Losses Client::losses() const noexcept {
    using enum protocol::ClientLoss;
    Losses losses{};
    const auto set = [&](protocol::ClientLoss reason, const std::atomic<std::uint64_t>& count) {
        losses[static_cast<std::size_t>(reason)] = count.load(std::memory_order_relaxed);
    };
    set(QueueFull, counters_.queueFull);
    set(Discarded, counters_.discarded);
    set(TooLarge, counters_.tooLarge);
    set(Invalid, counters_.invalid);
    return losses;
}

bool Client::countSession() noexcept {
    if (sessions_.fetch_add(1) < kMaxSessions) {
        return true;
    }
    uncountSession();
    return false;
}

halyard_result Client::flush(std::chrono::milliseconds timeout) {
    const std::uint64_t target = ring_.end();
    const MutexLock lock(flushMutex_);
    flushWaiters_.fetch_add(1);
    wakeUp_.notify(0, true);
    const bool done =
        flushed_.wait_for(flushMutex_, timeout, [&] { return announced_.load() >= target; });
    flushWaiters_.fetch_sub(1);
    return done ? HALYARD_OK : HALYARD_TIMED_OUT;
}

void Client::announceReleased() {
    announced_.store(ring_.releasedTo());
    if (flushWaiters_.load() != 0) {
        const MutexLock lock(flushMutex_);
        flushed_.notify_all();
    }
}

halyard_result Client::close(std::chrono::milliseconds timeout) {
    closingDeadline_ = std::chrono::steady_clock::now() + timeout;
    ring_.seal();
    closing_.store(true);
    wakeUp_.notify(0, true);
    ::pthread_join(thread_, nullptr);
    return leftovers_ ? HALYARD_TIMED_OUT : HALYARD_OK;
}

std::vector<std::string> defaultSocketPaths(const char* (*environment)(const char*), bool isRoot) {
    const auto set = [&](const char* name) -> std::string {
        const char* const value = environment(name);
        return value != nullptr ? value : "";
    };
    constexpr const char* kName = "/reporting.sock";
    std::vector<std::string> paths;
    const std::string runtime = set("RUNTIME_DIRECTORY");
    if (!runtime.empty()) {
        // A service manager may name several, separated by colons.
        paths.push_back(runtime.substr(0, runtime.find(':')) + kName);
    }
    const std::string session = set("XDG_RUNTIME_DIR");
    if (!isRoot && !session.empty()) {
        paths.push_back(session + "/halyard" + kName);
    }
    paths.push_back(std::string("/run/halyard") + kName);
    return paths;
}

} // namespace halyard::client
