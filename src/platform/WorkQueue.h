#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string_view>

namespace halyard::platform {

using Task = std::function<void()>;

enum class QueuePriority { UserInteractive, Utility, Background };

// Runs tasks asynchronously. Both operations may be called from any thread and
// never run the task on the calling stack. Tasks must not throw.
class WorkQueue {
public:
    virtual ~WorkQueue() = default;
    virtual void async(Task task) = 0;
    // Submits the task after `delay`, as async() would then.
    virtual void asyncAfter(std::chrono::nanoseconds delay, Task task) = 0;
};

// Runs one task at a time, in the order of submission.
//
// A task that has to wait for something does not block its thread: it suspends
// the queue, returns, and whoever ends the wait resumes it. So any number of
// queues can wait at once on the few threads that serve them all.
class SerialQueue : public WorkQueue {
public:
    // Holds back everything behind the running task until resume(), or until
    // `limit` has passed, when `onTimeout` runs first and the rest follows.
    // Requires that it is called from a task of this queue, once.
    virtual void suspend(std::chrono::nanoseconds limit, Task onTimeout) = 0;
    // Runs `first` before anything that is held back, then goes on. False, and
    // `first` is dropped, when the limit ran out before. Any thread.
    [[nodiscard]] virtual bool resume(Task first) = 0;

    // For a task that would take long: the rest of it, as a task that runs before
    // anything else of the same client, once others have had their turn. Requires that
    // it is called from a task of this queue, as the last that it does, once.
    virtual void continueWith(Task rest) = 0;

    // The queue whose task the calling thread is running, innermost; null when it
    // runs none.
    static const SerialQueue* current();
    bool isCurrent() const { return current() == this; }

protected:
    // Whoever implements a queue keeps one while it runs tasks.
    class Running {
    public:
        explicit Running(const SerialQueue& queue);
        ~Running();
        Running(const Running&) = delete;
        Running& operator=(const Running&) = delete;

    private:
        const SerialQueue* const outer_;
    };
};

class QueueFactory {
public:
    virtual ~QueueFactory() = default;
    // A queue that is dropped still runs what was submitted to it.
    virtual std::shared_ptr<SerialQueue> makeSerialQueue(std::string_view name,
                                                         QueuePriority priority) = 0;
    // The shared concurrent queue of lowest priority. Borrowed.
    virtual WorkQueue& backgroundQueue() = 0;
};

} // namespace halyard::platform
