#include "linux/queues/Worker.h"

#include <chrono>
#include <condition_variable>
#include <csignal>
#include <memory>
#include <mutex>
#include <pthread.h>
#include <sched.h>
#include <sys/resource.h>

namespace halyard::linux_ {
namespace {

constexpr int kInteractiveNice = -10;
constexpr int kUtilityNice = 5;
constexpr std::chrono::milliseconds kMeetingLimit{20};

void blockSignals() {
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_BLOCK, &all, nullptr);
}

} // namespace

// Best effort: without the right to raise it, the default priority stays.
void applyPriority(platform::QueuePriority priority) {
    switch (priority) {
    case platform::QueuePriority::UserInteractive:
        (void)::setpriority(PRIO_PROCESS, 0, kInteractiveNice);
        break;
    case platform::QueuePriority::Utility:
        (void)::setpriority(PRIO_PROCESS, 0, kUtilityNice);
        break;
    case platform::QueuePriority::Background: {
        const sched_param none{};
        (void)::sched_setscheduler(0, SCHED_BATCH, &none);
        break;
    }
    }
}

Worker::Worker(std::string name, int threads, platform::QueuePriority priority)
    : name_(std::move(name)), context_(threads), guard_(context_.get_executor()) {
    for (int i = 0; i < threads; ++i) {
        threads_.emplace_back([this, priority] { run(priority); });
    }
}

Worker::~Worker() {
    stop();
}

void Worker::run(platform::QueuePriority priority) {
    blockSignals();
    pthread_setname_np(pthread_self(), name_.substr(0, 15).c_str());
    applyPriority(priority);
    context_.run();
}

// Each waits for the others a moment, so that no thread takes two.
void Worker::onEachThread(platform::Task task) {
    struct Meeting {
        std::mutex mutex;
        std::condition_variable changed;
        std::size_t missing;
    };
    const auto meeting = std::make_shared<Meeting>();
    meeting->missing = threads_.size();
    for (std::size_t i = 0; i < threads_.size(); ++i) {
        post([meeting, task] {
            task();
            std::unique_lock lock(meeting->mutex);
            --meeting->missing;
            meeting->changed.notify_all();
            meeting->changed.wait_for(lock, kMeetingLimit, [&] { return meeting->missing == 0; });
        });
    }
}

void Worker::stop() {
    context_.stop();
    for (std::thread& thread : threads_) {
        if (thread.joinable()) {
            thread.join();
        }
    }
}

} // namespace halyard::linux_
