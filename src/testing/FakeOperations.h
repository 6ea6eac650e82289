#pragma once

#include <functional>
#include <utility>
#include <vector>

#include "platform/Operations.h"

namespace halyard::testing {

// Keeps flushes and purges until the test completes them.
class FakeOperations final : public platform::Operations {
public:
    void flush(std::function<void()> done) override { flushes.push_back(std::move(done)); }
    void purge(PurgeReply reply) override { purges.push_back(std::move(reply)); }
    Dictionary status() const override { return counters; }

    std::vector<std::function<void()>> flushes;
    std::vector<PurgeReply> purges;
    Dictionary counters;
};

} // namespace halyard::testing
