// Names one group of driver channels. The names may be read and set, each as a
// whole, from any thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "common/Mutex.h"

namespace halyard {

class HYReportingDriver final {
public:
    // An absent name matches any.
    static std::shared_ptr<HYReportingDriver>
    driverWithGroupName(std::optional<std::string> groupName,
                        std::optional<std::string> subGroupName);

    std::optional<std::string> groupName() const HY_EXCLUDES(mutex_);
    void setGroupName(std::optional<std::string> name) HY_EXCLUDES(mutex_);
    std::optional<std::string> subGroupName() const HY_EXCLUDES(mutex_);
    void setSubGroupName(std::optional<std::string> name) HY_EXCLUDES(mutex_);

    // "Speaker-(null)". Snapshots file a driver's samples under this, absent
    // names included, so that two groups never share a key by leaving one out.
    std::string description() const HY_EXCLUDES(mutex_);

private:
    HYReportingDriver(std::optional<std::string> groupName,
                      std::optional<std::string> subGroupName);

    mutable Mutex mutex_;
    std::optional<std::string> groupName_ HY_GUARDED_BY(mutex_);
    std::optional<std::string> subGroupName_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard
