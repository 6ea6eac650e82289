#pragma once

#include <functional>
#include <mutex>
#include <vector>

#include "platform/Random.h"
#include "platform/TraceMarks.h"

namespace halyard::testing {

// Any thread; the members want the markers at rest.
class FakeTraceMarks final : public platform::TraceMarks {
public:
    void mark(std::uint32_t code, std::uint64_t arg1, std::uint64_t arg2, std::uint64_t arg3,
              std::uint64_t arg4) override {
        {
            const std::lock_guard lock(mutex_);
            codes.push_back(code);
            argumentsAllZero = argumentsAllZero && (arg1 | arg2 | arg3 | arg4) == 0;
        }
        if (onMark) {
            onMark(code);
        }
    }

    std::vector<std::uint32_t> codes;
    bool argumentsAllZero = true;
    std::function<void(std::uint32_t code)> onMark;

private:
    std::mutex mutex_;
};

// Returns what a test put in, cut to the bound.
class FakeRandom final : public platform::Random {
public:
    std::uint32_t uniform(std::uint32_t bound) override {
        lastBound = bound;
        return next % bound;
    }

    std::uint32_t next = 0;
    std::uint32_t lastBound = 0;
};

} // namespace halyard::testing
