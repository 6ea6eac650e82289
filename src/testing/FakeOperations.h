#pragma once

#include <functional>
#include <utility>
#include <vector>

#include "platform/Operations.h"

namespace halyard::testing {

// Keeps the flushes until the test completes them.
class FakeOperations final : public platform::Operations {
public:
    void flush(std::function<void()> done) override { flushes.push_back(std::move(done)); }
    Dictionary status() const override { return counters; }

    std::vector<std::function<void()>> flushes;
    Dictionary counters;
};

} // namespace halyard::testing
