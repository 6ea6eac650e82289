// What a client's unfinished work counts against.
//
// The listener makes one charge for the requests of one read and makes it
// current while it hands them over. Queues keep the charge of whoever submits a
// task and make it current again while the task runs, so the charge lives until
// the last task that came out of those requests has run. Its end tells the
// connection that it may be read from again.
#pragma once

#include <memory>
#include <utility>

namespace halyard::linux_ {

class Charge {
public:
    virtual ~Charge() = default;
};

using ChargePtr = std::shared_ptr<Charge>;

// The calling thread's charge; null outside a client's work.
ChargePtr& currentCharge();

// Makes a charge current for a scope.
class ChargeScope {
public:
    explicit ChargeScope(ChargePtr charge)
        : previous_(std::exchange(currentCharge(), std::move(charge))) {}
    ~ChargeScope() { currentCharge() = std::move(previous_); }
    ChargeScope(const ChargeScope&) = delete;
    ChargeScope& operator=(const ChargeScope&) = delete;

private:
    ChargePtr previous_;
};

} // namespace halyard::linux_
