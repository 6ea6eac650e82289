// What the core asks about the device it runs on.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "common/Value.h"
#include "platform/WorkQueue.h"

namespace halyard::platform {

class Preferences {
public:
    virtual ~Preferences() = default;
    // None when the preference is not set. Any thread.
    virtual Value value(std::string_view key, std::string_view domain) const = 0;
};

class FeatureFlags {
public:
    virtual ~FeatureFlags() = default;
    virtual bool isEnabled(std::string_view domain, std::string_view flag) const = 0;
};

class DeviceProperties {
public:
    virtual ~DeviceProperties() = default;
    // None when the device does not say.
    virtual std::optional<bool> boolean(std::string_view name) const = 0;
};

// Named notifications, posted from inside or outside the process.
class Notifications {
public:
    struct Registration {
        std::uint32_t status = 0; // 0 is success
        int token = 0;
    };
    using Handler = std::function<void(int token)>;

    virtual ~Notifications() = default;
    // Every later post of `name` submits handler(token) to `queue`, for the rest
    // of the process's life.
    virtual Registration registerFor(std::string_view name, std::shared_ptr<SerialQueue> queue,
                                     Handler handler) = 0;
    virtual void post(std::string_view name) = 0;
};

// The kernel's record of a process, cut to what the core reads.
struct ProcessInfo {
    std::string shortCommandName; // at most 16 bytes
};

class ProcessTable {
public:
    virtual ~ProcessTable() = default;
    // None when there is no such process.
    virtual std::optional<ProcessInfo> infoForPID(std::int32_t pid) const = 0;
};

// The daemon's own process.
class OwnProcess {
public:
    virtual ~OwnProcess() = default;
    virtual std::int32_t pid() const = 0;
    virtual std::string name() const = 0;
    // Ends the process at once. Returns only in tests.
    virtual void terminate(int status) = 0;
};

} // namespace halyard::platform
