// Work queues that a test drains by hand, on its own thread.
//
// Tasks run in the order in which they were submitted, whichever queue they
// belong to; a suspended queue keeps its own until it is resumed. Delayed tasks
// become ready when advance() passes their time.
#pragma once

#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/WorkQueue.h"
#include "testing/ManualClock.h"

namespace halyard::testing {

class ManualQueues final : public platform::QueueFactory {
public:
    // Borrows `clock`.
    explicit ManualQueues(ManualClock& clock);
    ~ManualQueues() override;

    std::shared_ptr<platform::SerialQueue>
    makeSerialQueue(std::string_view name, platform::QueuePriority priority) override;
    platform::WorkQueue& backgroundQueue() override;

    // Runs the oldest ready task of any queue that is not suspended, nor running
    // the task that calls this; false when there is none.
    bool runOne();
    void runUntilIdle();
    // Drops what is pending.
    void clear();
    void advance(std::chrono::nanoseconds by);

    std::size_t queuesMade(std::string_view name) const;
    // Those of them that somebody still holds.
    std::size_t queuesHeld(std::string_view name) const;
    // Of the queue made last under this name; none when there is none.
    std::optional<platform::QueuePriority> priority(std::string_view name) const;
    // Tasks submitted to queues of this name that have not run.
    std::size_t pending(std::string_view name) const;

private:
    class Queue;
    struct Ready {
        std::shared_ptr<Queue> queue;
        platform::Task task;
    };
    struct Delayed {
        platform::SteadyTime due;
        std::shared_ptr<Queue> queue;
        platform::Task task;
    };

    ManualClock& clock_;
    std::deque<Ready> ready_;
    std::deque<Delayed> delayed_;
    struct Made {
        std::string name;
        platform::QueuePriority priority;
        std::weak_ptr<Queue> queue;
    };
    std::vector<Made> made_;
    std::shared_ptr<Queue> background_;
};

} // namespace halyard::testing
