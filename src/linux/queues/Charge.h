// What a client's unfinished work counts against.
//
// The listener makes one charge for the requests of one read and makes it
// current while it hands them over. Queues keep the charge of whoever submits a
// task and make it current again while the task runs, so the charge lives until
// the last task that came out of those requests has run. Its end tells the
// connection that it may be read from again.
//
// A charge also says whose work it is, for the queue that gives each client its turn
// and for the budget that pays for what the work leaves.
#pragma once

#include <memory>
#include <utility>

#include "platform/ClientBudget.h"

namespace halyard::linux_ {

class Charge {
public:
    // Of nobody's in particular: the daemon's own work.
    Charge() = default;
    explicit Charge(platform::ClientBudgetPtr client) : client_(std::move(client)) {}
    virtual ~Charge() = default;

    const platform::ClientBudgetPtr& client() const { return client_; }

private:
    const platform::ClientBudgetPtr client_;
};

using ChargePtr = std::shared_ptr<Charge>;

// The calling thread's charge; null outside a client's work.
ChargePtr& currentCharge();

// Makes a charge current for a scope.
class ChargeScope {
public:
    explicit ChargeScope(ChargePtr charge)
        : previous_(std::exchange(currentCharge(), std::move(charge))), pays_(clientOf()) {}
    ~ChargeScope() { currentCharge() = std::move(previous_); }
    ChargeScope(const ChargeScope&) = delete;
    ChargeScope& operator=(const ChargeScope&) = delete;

private:
    static const platform::ClientBudgetPtr& clientOf() {
        static const platform::ClientBudgetPtr nobody;
        return currentCharge() != nullptr ? currentCharge()->client() : nobody;
    }

    ChargePtr previous_;
    const platform::BudgetScope pays_;
};

} // namespace halyard::linux_
