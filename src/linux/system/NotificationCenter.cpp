#include "linux/system/NotificationCenter.h"

#include <utility>
#include <vector>

namespace halyard::linux_ {

NotificationCenter::Registration
NotificationCenter::registerFor(std::string_view name, std::shared_ptr<platform::SerialQueue> queue,
                                Handler handler) {
    const MutexLock lock(mutex_);
    if (listeners_.size() >= kMaxRegistrations) {
        return {kTooManyRegistrations, -1};
    }
    const int token = static_cast<int>(listeners_.size()) + 1;
    listeners_.emplace(name, Listener{std::move(queue),
                                      std::make_shared<const Handler>(std::move(handler)), token});
    return {0, token};
}

void NotificationCenter::post(std::string_view name) {
    std::vector<Listener> heard;
    {
        const MutexLock lock(mutex_);
        const auto [first, last] = listeners_.equal_range(name);
        for (auto listener = first; listener != last; ++listener) {
            heard.push_back(listener->second);
        }
    }
    for (const Listener& listener : heard) {
        listener.queue->async(
            [handler = listener.handler, token = listener.token] { (*handler)(token); });
    }
}

} // namespace halyard::linux_
