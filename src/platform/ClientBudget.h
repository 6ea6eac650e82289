// What one client process makes the daemon keep, and how much of it may be.
//
// Requests are answered and forgotten; what stays behind them (sessions, their
// configuration, the newest message of each kind, the texts of summaries, frames that
// have not come in whole, answers that nobody takes) is charged here before it is made
// and given back when it goes. All connections of a process share one budget, since
// opening another costs a client nothing. What does not fit is refused with the name of
// the bound, or left out where it can be counted; it never costs another client
// anything. So who sends pays, also for what a session of another client keeps of it.
//
// Any thread; a charge costs an atomic operation or two.
#pragma once

#include <array>
#include <atomic>
#include <cstddef>
#include <functional>
#include <memory>
#include <string_view>
#include <utility>

#include "common/Error.h"
#include "platform/SizeExpectation.h"

namespace halyard::platform {

// As an operator settles them, in the table of this name; docs/configuration.md.
struct ClientLimits {
    std::size_t memory = std::size_t{128} * 1024 * 1024;      // of a process
    std::size_t sessions = 50'000;                            // of a process
    std::size_t connections = 4096;                           // of a process
    std::size_t configuration = std::size_t{4} * 1024 * 1024; // of a session
    std::size_t summary = std::size_t{8} * 1024 * 1024;       // of a session
    std::size_t copies = std::size_t{64} * 1024 * 1024;       // of one message

    bool operator==(const ClientLimits&) const = default;
};

enum class ClientBound { Memory, Sessions, Connections, Configuration, Copies };

// What a request that a bound refuses is answered; names the bound.
Error boundReached(ClientBound bound);

// The limits of all clients, which an operator may change at any time.
class SharedLimits {
public:
    explicit SharedLimits(const ClientLimits& limits = {}) { set(limits); }
    void set(const ClientLimits& limits);
    ClientLimits get() const;

private:
    friend class ClientBudget;
    std::atomic<std::size_t> memory_{0};
    std::atomic<std::size_t> sessions_{0};
    std::atomic<std::size_t> connections_{0};
    std::atomic<std::size_t> configuration_{0};
    std::atomic<std::size_t> summary_{0};
    std::atomic<std::size_t> copies_{0};
};

class ClientBudget {
public:
    explicit ClientBudget(std::shared_ptr<const SharedLimits> limits)
        : limits_(std::move(limits)) {}
    ClientBudget(const ClientBudget&) = delete;
    ClientBudget& operator=(const ClientBudget&) = delete;

    ClientLimits limits() const { return limits_->get(); }

    // Bytes. False, and nothing is charged, when they do not fit.
    [[nodiscard]] bool charge(std::size_t bytes);
    void release(std::size_t bytes) { kept_.fetch_sub(bytes); }
    bool fits(std::size_t bytes) const;
    std::size_t keptBytes() const { return kept_.load(); }

    // False when there are too many already.
    [[nodiscard]] bool addSession() { return add(sessions_, limits_->sessions_.load()); }
    void removeSession() { sessions_.fetch_sub(1); }
    [[nodiscard]] bool addConnection() { return add(connections_, limits_->connections_.load()); }
    void removeConnection() { connections_.fetch_sub(1); }

    // What is on its way: it slows its client down rather than being refused.
    enum class Work {
        Requests, // read and not done
        Rows,     // wait for the disk
        Singles,  // wait for their second
    };
    void begin(Work work, std::size_t bytes);
    void end(Work work, std::size_t count, std::size_t bytes);
    // Whether as much waits as one client may have waiting, so that no more of its
    // requests are done. Then the relief handler is called once it does not.
    [[nodiscard]] bool isBacklogged();
    // The same, also for requests that are not done: no more of them are read.
    [[nodiscard]] bool isBusy();
    // Any thread calls it. Requires that no other thread uses this object yet.
    void setReliefHandler(std::function<void()> handler) { relief_ = std::move(handler); }
    // Of its rows whose contents are made later. Each client's own: large ones of
    // another would look like a backlog of this one.
    SizeExpectation& laterBytes() { return laterBytes_; }

    // Of the client whose request the calling thread is at; null outside of any.
    static const std::shared_ptr<ClientBudget>& current();

private:
    static constexpr std::size_t kWorks = 3;
    struct Level {
        std::atomic<std::size_t> count{0};
        std::atomic<std::size_t> bytes{0};
    };

    static bool add(std::atomic<std::size_t>& count, std::size_t most);
    bool isHigh(Work work) const;
    bool waitsFor(bool (ClientBudget::*high)() const);
    bool hasBacklog() const { return isHigh(Work::Rows) || isHigh(Work::Singles); }
    bool hasWork() const { return hasBacklog() || isHigh(Work::Requests); }

    const std::shared_ptr<const SharedLimits> limits_;
    std::atomic<std::size_t> kept_{0};
    std::atomic<std::size_t> sessions_{0};
    std::atomic<std::size_t> connections_{0};
    std::array<Level, kWorks> work_;
    std::atomic<bool> awaited_{false}; // Somebody was told to wait.
    std::function<void()> relief_;
    SizeExpectation laterBytes_;
};
using ClientBudgetPtr = std::shared_ptr<ClientBudget>;

// Makes a budget the current one for a scope. Borrows it.
class BudgetScope {
public:
    explicit BudgetScope(const ClientBudgetPtr& budget);
    ~BudgetScope();
    BudgetScope(const BudgetScope&) = delete;
    BudgetScope& operator=(const BudgetScope&) = delete;

private:
    const ClientBudgetPtr* const outer_;
};

// Bytes of a budget, for as long as this lives. Without a budget they are free.
class Allotment {
public:
    Allotment() = default;
    explicit Allotment(ClientBudgetPtr budget) : budget_(std::move(budget)) {}
    Allotment(Allotment&& other) noexcept
        : budget_(std::move(other.budget_)), bytes_(std::exchange(other.bytes_, 0)) {}
    Allotment& operator=(Allotment&& other) noexcept {
        std::swap(budget_, other.budget_);
        std::swap(bytes_, other.bytes_);
        return *this;
    }
    ~Allotment() { (void)resize(0); }

    // False, and nothing has changed, when so many do not fit.
    [[nodiscard]] bool resize(std::size_t bytes);
    std::size_t bytes() const { return bytes_; }
    bool isOf(const ClientBudgetPtr& budget) const { return budget_ == budget; }

private:
    ClientBudgetPtr budget_;
    std::size_t bytes_ = 0;
};

} // namespace halyard::platform
