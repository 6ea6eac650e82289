// Clock, randomness, conditions and kernel trace marks of the real system.
#pragma once

#include "platform/Clock.h"
#include "platform/Condition.h"
#include "platform/Random.h"

namespace halyard::linux_ {

class SystemClock final : public platform::Clock {
public:
    platform::WallTime wallTime() const override;
    platform::SteadyTime steadyTime() const override;
    std::chrono::nanoseconds systemUptime() const override;
    std::chrono::seconds utcOffset(platform::WallTime time) const override;
};

class SystemRandom final : public platform::Random {
public:
    std::uint32_t uniform(std::uint32_t bound) override;
};

class SystemConditions final : public platform::ConditionFactory {
public:
    std::unique_ptr<platform::Condition> makeCondition() override;
};

} // namespace halyard::linux_
