// The budgets of the processes that are connected, one for all connections of each.
//
// A process is known by its number and the time of its start, since numbers come again.
//
// On the io_context's thread, but for setLimits().
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <tuple>

#include "common/Mutex.h"
#include "linux/net/Peer.h"
#include "platform/ClientBudget.h"

namespace halyard::linux_ {

// In the kernel's ticks since the system's start; 0 when there is no such process.
std::uint64_t startOfProcess(std::int32_t pid);

class ClientBudgets {
public:
    ClientBudgets() = default;
    // Nobody is told of relief any more.
    ~ClientBudgets() { onRelief(nullptr); }
    ClientBudgets(const ClientBudgets&) = delete;
    ClientBudgets& operator=(const ClientBudgets&) = delete;

    // Never null.
    platform::ClientBudgetPtr of(const Peer& peer);
    // Any thread. Holds for those who are connected, too.
    void setLimits(const platform::ClientLimits& limits) { limits_->set(limits); }
    // Called on any thread when a client whose work had piled up may go on.
    void onRelief(std::function<void()> relief) {
        const MutexLock lock(relief_->mutex);
        relief_->tell = std::move(relief);
    }

private:
    using Process = std::tuple<std::int32_t, std::uint64_t, std::uint32_t>; // with its uid
    // Outlives this: work that is on its way keeps the budgets it is charged to.
    struct Relief {
        Mutex mutex;
        std::function<void()> tell HY_GUARDED_BY(mutex);
    };

    const std::shared_ptr<platform::SharedLimits> limits_ =
        std::make_shared<platform::SharedLimits>();
    std::map<Process, std::weak_ptr<platform::ClientBudget>> budgets_;
    std::size_t sweepAt_ = 64;
    const std::shared_ptr<Relief> relief_ = std::make_shared<Relief>();
};

} // namespace halyard::linux_
