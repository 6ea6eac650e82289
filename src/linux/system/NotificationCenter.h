// Named notifications within the process: operators and the configuration post
// them, the service hears of them on its own queue.
//
// Handlers run as tasks of the queues they came with, never on the poster's
// stack, so posting under a lock is harmless. Any thread.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "common/Mutex.h"
#include "platform/Device.h"

namespace halyard::linux_ {

class NotificationCenter final : public platform::Notifications {
public:
    static constexpr std::size_t kMaxRegistrations = 256;
    // The status of a registration beyond that; its token is -1.
    static constexpr std::uint32_t kTooManyRegistrations = 1;

    // Tokens count up from 1. Requires a queue and a handler.
    Registration registerFor(std::string_view name, std::shared_ptr<platform::SerialQueue> queue,
                             Handler handler) override;
    void post(std::string_view name) override;

private:
    struct Listener {
        std::shared_ptr<platform::SerialQueue> queue;
        std::shared_ptr<const Handler> handler;
        int token;
    };

    Mutex mutex_;
    // Those of one name in the order of registration.
    std::multimap<std::string, Listener, std::less<>> listeners_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard::linux_
