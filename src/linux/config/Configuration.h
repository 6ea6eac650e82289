// The settings in force, and the core's view of them.
//
// Readers get snapshots, so that a reload never changes what somebody is in the
// middle of reading. A file that cannot be taken is told in one log line, and none of
// the files changes anything; what no file says has its default.
#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <vector>

#include "common/Mutex.h"
#include "linux/config/Settings.h"
#include "platform/Device.h"

namespace halyard::linux_ {

// Any thread. The defaults are in force until the first reload(), which main
// calls once log lines have somewhere to go.
class Configuration final : public platform::Preferences,
                            public platform::FeatureFlags,
                            public platform::DeviceProperties {
public:
    using Observer = std::function<void(const Settings& before, const Settings& after)>;

    enum class Outcome {
        Unchanged,
        Changed, // Observers have been called.
        Refused, // A file cannot be taken; what was in force stays.
    };

    explicit Configuration(const std::filesystem::path& directory);

    [[nodiscard]] std::shared_ptr<const Settings> settings() const;

    // Reads the files and puts them in force.
    Outcome reload();

    // `observer` runs on the thread of each reload() that changes something,
    // once the new settings are in force, and must not call reload() or
    // observe() itself.
    void observe(Observer observer);

    Value value(std::string_view key, std::string_view domain) const override;
    bool isEnabled(std::string_view domain, std::string_view flag) const override;
    std::optional<bool> boolean(std::string_view name) const override;

private:
    Outcome refuse(const SettingsFailure& failure) HY_REQUIRES(reloading_);
    Outcome putInForce(Settings settings, std::size_t dropIns) HY_REQUIRES(reloading_);

    const std::filesystem::path directory_;
    Mutex reloading_; // taken before mutex_
    std::vector<Observer> observers_ HY_GUARDED_BY(reloading_);
    bool taken_ HY_GUARDED_BY(reloading_) = false; // a reload() has succeeded
    mutable Mutex mutex_;
    std::shared_ptr<const Settings> settings_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard::linux_
