#pragma once

#include <cstdint>
#include <functional>

#include "common/Error.h"
#include "common/Value.h"

namespace halyard::platform {

// What operators may ask of the running adapters. Any thread.
class Operations {
public:
    virtual ~Operations() = default;
    // Calls `done` once everything that was accepted before is durable: requests
    // and deliveries that are queued, single messages that wait for their
    // moment, rows that wait for a commit.
    virtual void flush(std::function<void()> done) = 0;
    // Removes everything that was collected and accepted before: rows, incidents,
    // summaries, traces, damaged files. Answers how many rows went.
    using PurgeReply = std::function<void(const MaybeError& error, std::uint64_t rows)>;
    virtual void purge(PurgeReply reply) = 0;
    // Counters of the adapters; the keys are listed in docs/wire.md.
    virtual Dictionary status() const = 0;
};

} // namespace halyard::platform
