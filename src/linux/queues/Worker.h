// Threads that run what is posted to them, in the order of posting.
//
// Posting from any thread. stop() lets the running task end and drops the rest.
#pragma once

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>
#include <asio/post.hpp>
#include <string>
#include <thread>
#include <vector>

#include "platform/WorkQueue.h"

namespace halyard::linux_ {

// Of the calling thread, as far as the system lets us.
void applyPriority(platform::QueuePriority priority);

class Worker {
public:
    // `priority` is applied as far as the system lets us.
    Worker(std::string name, int threads, platform::QueuePriority priority);
    ~Worker();
    Worker(const Worker&) = delete;
    Worker& operator=(const Worker&) = delete;

    template <class Function> void post(Function&& function) {
        asio::post(context_, std::forward<Function>(function));
    }
    // Runs a task once on each thread; one that is busy for long may be left out.
    void onEachThread(platform::Task task);
    void stop();

private:
    void run(platform::QueuePriority priority);

    const std::string name_;
    asio::io_context context_;
    asio::executor_work_guard<asio::io_context::executor_type> guard_;
    std::vector<std::thread> threads_;
};

} // namespace halyard::linux_
