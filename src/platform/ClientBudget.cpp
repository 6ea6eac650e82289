#include "platform/ClientBudget.h"

#include <string>

namespace halyard::platform {
namespace {

// In the order of ClientBudget::Work. Of rows, more than a group of the store has and
// less than what holds everybody back.
constexpr struct {
    std::size_t count;
    std::size_t bytes;
} kMostWork[] = {{4096, std::size_t{32} * 1024 * 1024},
                 {9216, std::size_t{12} * 1024 * 1024},
                 {32768, std::size_t{16} * 1024 * 1024}};

const ClientBudgetPtr*& currentBudget() {
    thread_local const ClientBudgetPtr* budget = nullptr;
    return budget;
}

std::string_view messageFor(ClientBound bound) {
    switch (bound) {
    case ClientBound::Memory:
        return "limits.memory: this process makes the daemon keep too much";
    case ClientBound::Sessions:
        return "limits.sessions: this process has too many sessions";
    case ClientBound::Connections:
        return "limits.connections: this process has too many connections";
    case ClientBound::Configuration:
        return "limits.configuration: the session's configuration would be too large";
    case ClientBound::Copies:
        break;
    }
    return "limits.copies: the message is too large for so many sessions";
}

} // namespace

Error boundReached(ClientBound bound) {
    return {std::string(kIpcErrorDomain), static_cast<std::int64_t>(IpcErrorCode::Bounded),
            std::string(messageFor(bound))};
}

void SharedLimits::set(const ClientLimits& limits) {
    memory_ = limits.memory;
    sessions_ = limits.sessions;
    connections_ = limits.connections;
    configuration_ = limits.configuration;
    summary_ = limits.summary;
    copies_ = limits.copies;
}

ClientLimits SharedLimits::get() const {
    return {memory_.load(),        sessions_.load(), connections_.load(),
            configuration_.load(), summary_.load(),  copies_.load()};
}

bool ClientBudget::charge(std::size_t bytes) {
    if (kept_.fetch_add(bytes) + bytes <= limits_->memory_.load()) {
        return true;
    }
    kept_.fetch_sub(bytes);
    return false;
}

bool ClientBudget::fits(std::size_t bytes) const {
    return kept_.load() + bytes <= limits_->memory_.load();
}

bool ClientBudget::add(std::atomic<std::size_t>& count, std::size_t most) {
    if (count.fetch_add(1) < most) {
        return true;
    }
    count.fetch_sub(1);
    return false;
}

void ClientBudget::begin(Work work, std::size_t bytes) {
    Level& level = work_[static_cast<std::size_t>(work)];
    level.count.fetch_add(1);
    level.bytes.fetch_add(bytes);
}

void ClientBudget::end(Work work, std::size_t count, std::size_t bytes) {
    Level& level = work_[static_cast<std::size_t>(work)];
    level.count.fetch_sub(count);
    level.bytes.fetch_sub(bytes);
    if (awaited_.load() && !hasBacklog() && !isHigh(work) && awaited_.exchange(false) && relief_) {
        relief_();
    }
}

bool ClientBudget::isHigh(Work work) const {
    const auto index = static_cast<std::size_t>(work);
    return work_[index].count.load() >= kMostWork[index].count ||
           work_[index].bytes.load() >= kMostWork[index].bytes;
}

// Asked a second time once the flag is up: either this sees the end, or who ends it
// sees the flag.
bool ClientBudget::waitsFor(bool (ClientBudget::*high)() const) {
    if (!(this->*high)()) {
        return false;
    }
    awaited_.store(true);
    return (this->*high)();
}

bool ClientBudget::isBacklogged() {
    return waitsFor(&ClientBudget::hasBacklog);
}

bool ClientBudget::isBusy() {
    return waitsFor(&ClientBudget::hasWork);
}

const ClientBudgetPtr& ClientBudget::current() {
    static const ClientBudgetPtr none;
    const ClientBudgetPtr* const budget = currentBudget();
    return budget != nullptr ? *budget : none;
}

BudgetScope::BudgetScope(const ClientBudgetPtr& budget)
    : outer_(std::exchange(currentBudget(), &budget)) {}

BudgetScope::~BudgetScope() {
    currentBudget() = outer_;
}

bool Allotment::resize(std::size_t bytes) {
    if (budget_ != nullptr) {
        if (bytes > bytes_ && !budget_->charge(bytes - bytes_)) {
            return false;
        }
        if (bytes < bytes_) {
            budget_->release(bytes_ - bytes);
        }
    }
    bytes_ = bytes;
    return true;
}

} // namespace halyard::platform
