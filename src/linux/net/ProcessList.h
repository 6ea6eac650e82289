// The processes that are connected, for whoever wants to look at them from
// another thread. A process counts as often as it has connections.
//
// Any thread.
#pragma once

#include <cstdint>
#include <map>
#include <vector>

#include "common/Mutex.h"

namespace halyard::linux_ {

class ProcessList {
public:
    void add(std::int32_t pid) HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        ++connections_[pid];
    }
    void remove(std::int32_t pid) HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        const auto found = connections_.find(pid);
        if (found != connections_.end() && --found->second == 0) {
            connections_.erase(found);
        }
    }
    std::vector<std::int32_t> pids() const HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        std::vector<std::int32_t> result;
        for (const auto& [pid, count] : connections_) {
            result.push_back(pid);
        }
        return result;
    }

private:
    mutable Mutex mutex_;
    std::map<std::int32_t, std::size_t> connections_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard::linux_
