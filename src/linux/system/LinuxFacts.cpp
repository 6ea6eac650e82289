#include "linux/system/LinuxFacts.h"

#include <condition_variable>
#include <ctime>
#include <mutex>
#include <random>

#include "linux/queues/BlockingSection.h"

namespace halyard::linux_ {
namespace {

class SystemCondition final : public platform::Condition {
public:
    void lock() override { mutex_.lock(); }
    void unlock() override { mutex_.unlock(); }
    bool waitFor(std::chrono::nanoseconds timeout) override {
        const BlockingSection blocking;
        return condition_.wait_for(mutex_, timeout) == std::cv_status::no_timeout;
    }
    void signal() override { condition_.notify_one(); }

private:
    std::mutex mutex_;
    std::condition_variable_any condition_;
};

} // namespace

platform::WallTime SystemClock::wallTime() const {
    return std::chrono::system_clock::now();
}

platform::SteadyTime SystemClock::steadyTime() const {
    return std::chrono::steady_clock::now();
}

std::chrono::nanoseconds SystemClock::systemUptime() const {
    timespec now{};
    ::clock_gettime(CLOCK_BOOTTIME, &now);
    return std::chrono::seconds(now.tv_sec) + std::chrono::nanoseconds(now.tv_nsec);
}

std::chrono::seconds SystemClock::utcOffset(platform::WallTime time) const {
    const std::time_t seconds =
        std::chrono::floor<std::chrono::seconds>(time).time_since_epoch().count();
    std::tm local{};
    return std::chrono::seconds(::localtime_r(&seconds, &local) != nullptr ? local.tm_gmtoff : 0);
}

std::uint32_t SystemRandom::uniform(std::uint32_t bound) {
    thread_local std::mt19937 engine{std::random_device{}()};
    return std::uniform_int_distribution<std::uint32_t>(0, bound - 1)(engine);
}

std::unique_ptr<platform::Condition> SystemConditions::makeCondition() {
    return std::make_unique<SystemCondition>();
}

} // namespace halyard::linux_
