#pragma once

#include <exception>
#include <mutex>
#include <thread>
#include <vector>

namespace halyard::load {

// Runs task(0) to task(count - 1) on a thread each and waits for all; throws
// what the first that failed threw.
template <class Task> void runWorkers(std::size_t count, Task task) {
    std::exception_ptr failure;
    std::mutex mutex;
    {
        std::vector<std::jthread> threads;
        for (std::size_t i = 0; i < count; ++i) {
            threads.emplace_back([&, i] {
                try {
                    task(i);
                } catch (...) {
                    const std::lock_guard lock(mutex);
                    failure = failure ? failure : std::current_exception();
                }
            });
        }
    }
    if (failure) {
        std::rethrow_exception(failure);
    }
}

} // namespace halyard::load
