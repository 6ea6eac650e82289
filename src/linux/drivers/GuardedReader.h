// Reads sources that may block for ever (a driver that hangs, a file system that
// has lost its server) without blocking its caller for longer than a moment.
//
// The reads run one after the other on a thread of their own. One that does not
// come back in time is left behind with its thread, and its source is not read
// again until it does; the rest goes on on a new thread. At most kMaxStuck
// threads are left behind at a time; beyond that nothing is read.
//
// One caller at a time.
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <span>
#include <thread>
#include <vector>

#include "linux/drivers/ChannelSource.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

class GuardedReader {
public:
    static constexpr std::size_t kMaxStuck = 4;

    // `patience` is for one call of read() and each source that blocks in it.
    explicit GuardedReader(std::chrono::milliseconds patience) : patience_(patience) {}
    ~GuardedReader();
    GuardedReader(const GuardedReader&) = delete;
    GuardedReader& operator=(const GuardedReader&) = delete;

    // In the order of the sources, which are shared with the threads.
    std::vector<Reading> read(std::span<const std::shared_ptr<ChannelSource>> sources,
                              platform::SteadyTime now);

private:
    using Sources = std::vector<std::shared_ptr<ChannelSource>>;
    struct Desk;
    struct Stuck {
        std::shared_ptr<Desk> desk;
        std::shared_ptr<ChannelSource> source;
    };

    static void work(const std::shared_ptr<Desk>& desk);
    void startThread();
    // Lets go of the thread, which is at `source`.
    void leaveThread(const std::shared_ptr<ChannelSource>& source);
    void forgetThoseThatCameBack();
    bool isStuck(const ChannelSource& source) const;

    const std::chrono::milliseconds patience_;
    std::shared_ptr<Desk> desk_;
    std::thread thread_;
    std::vector<Stuck> stuck_;
};

} // namespace halyard::linux_
