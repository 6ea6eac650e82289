#include "testing/ManualQueues.h"

#include <algorithm>
#include <cassert>

namespace halyard::testing {

class ManualQueues::Queue final : public platform::SerialQueue,
                                  public std::enable_shared_from_this<Queue> {
public:
    Queue(ManualQueues& owner, std::string name) : owner_(owner), name_(std::move(name)) {}

    void async(platform::Task task) override {
        owner_.ready_.push_back({shared_from_this(), std::move(task)});
    }
    void asyncAfter(std::chrono::nanoseconds delay, platform::Task task) override {
        owner_.delayed_.push_back(
            {owner_.clock_.steadyTime() + delay, shared_from_this(), std::move(task)});
    }
    void suspend(std::chrono::nanoseconds limit, platform::Task onTimeout) override {
        assert(!suspended_);
        suspended_ = true;
        const int wait = ++waits_;
        owner_.delayed_.push_back({owner_.clock_.steadyTime() + limit, owner_.background_,
                                   [self = shared_from_this(), wait, onTimeout] {
                                       if (self->suspended_ && self->waits_ == wait) {
                                           (void)self->resume(onTimeout);
                                       }
                                   }});
    }
    bool resume(platform::Task first) override {
        if (!suspended_) {
            return false;
        }
        suspended_ = false;
        owner_.ready_.push_front({shared_from_this(), std::move(first)});
        return true;
    }

    void continueWith(platform::Task rest) override {
        owner_.ready_.push_front({shared_from_this(), std::move(rest)});
    }

    void run(const platform::Task& task) {
        const Running running(*this);
        running_ = true;
        task();
        running_ = false;
    }
    bool ready() const { return !suspended_ && !running_; }
    const std::string& name() const { return name_; }

private:
    ManualQueues& owner_;
    std::string name_;
    bool suspended_ = false;
    bool running_ = false;
    int waits_ = 0;
};

ManualQueues::ManualQueues(ManualClock& clock)
    : clock_(clock), background_(std::make_shared<Queue>(*this, "background")) {}

ManualQueues::~ManualQueues() = default;

std::shared_ptr<platform::SerialQueue>
ManualQueues::makeSerialQueue(std::string_view name, platform::QueuePriority priority) {
    auto queue = std::make_shared<Queue>(*this, std::string(name));
    made_.push_back({std::string(name), priority, queue});
    return queue;
}

platform::WorkQueue& ManualQueues::backgroundQueue() {
    return *background_;
}

bool ManualQueues::runOne() {
    const auto next = std::find_if(ready_.begin(), ready_.end(),
                                   [](const Ready& ready) { return ready.queue->ready(); });
    if (next == ready_.end()) {
        return false;
    }
    const Ready running = std::move(*next);
    ready_.erase(next);
    running.queue->run(running.task);
    return true;
}

void ManualQueues::runUntilIdle() {
    while (runOne()) {
    }
}

void ManualQueues::clear() {
    ready_.clear();
    delayed_.clear();
}

void ManualQueues::advance(std::chrono::nanoseconds by) {
    const platform::SteadyTime until = clock_.steadyTime() + by;
    runUntilIdle();
    for (;;) {
        const auto next = std::min_element(
            delayed_.begin(), delayed_.end(),
            [](const Delayed& left, const Delayed& right) { return left.due < right.due; });
        if (next == delayed_.end() || next->due > until) {
            break;
        }
        clock_.advance(std::max(next->due - clock_.steadyTime(), std::chrono::nanoseconds(0)));
        ready_.push_back({next->queue, std::move(next->task)});
        delayed_.erase(next);
        runUntilIdle();
    }
    clock_.advance(until - clock_.steadyTime());
}

std::size_t ManualQueues::queuesMade(std::string_view name) const {
    return static_cast<std::size_t>(std::count_if(
        made_.begin(), made_.end(), [&](const Made& made) { return made.name == name; }));
}

std::size_t ManualQueues::queuesHeld(std::string_view name) const {
    return static_cast<std::size_t>(
        std::count_if(made_.begin(), made_.end(), [&](const Made& made) {
            return made.name == name && !made.queue.expired();
        }));
}

std::optional<platform::QueuePriority> ManualQueues::priority(std::string_view name) const {
    const auto made = std::find_if(made_.rbegin(), made_.rend(),
                                   [&](const Made& each) { return each.name == name; });
    return made != made_.rend() ? std::optional(made->priority) : std::nullopt;
}

std::size_t ManualQueues::pending(std::string_view name) const {
    return static_cast<std::size_t>(
        std::count_if(ready_.begin(), ready_.end(),
                      [&](const Ready& ready) { return ready.queue->name() == name; }));
}

} // namespace halyard::testing
