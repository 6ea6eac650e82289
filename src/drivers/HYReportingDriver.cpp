#include "drivers/HYReportingDriver.h"

#include <utility>

#include "drivers/OptionalText.h"

namespace halyard {

std::shared_ptr<HYReportingDriver>
HYReportingDriver::driverWithGroupName(std::optional<std::string> groupName,
                                       std::optional<std::string> subGroupName) {
    return std::shared_ptr<HYReportingDriver>(
        new HYReportingDriver(std::move(groupName), std::move(subGroupName)));
}

HYReportingDriver::HYReportingDriver(std::optional<std::string> groupName,
                                     std::optional<std::string> subGroupName)
    : groupName_(std::move(groupName)), subGroupName_(std::move(subGroupName)) {}

std::optional<std::string> HYReportingDriver::groupName() const {
    const MutexLock lock(mutex_);
    return groupName_;
}

void HYReportingDriver::setGroupName(std::optional<std::string> name) {
    const MutexLock lock(mutex_);
    groupName_ = std::move(name);
}

std::optional<std::string> HYReportingDriver::subGroupName() const {
    const MutexLock lock(mutex_);
    return subGroupName_;
}

void HYReportingDriver::setSubGroupName(std::optional<std::string> name) {
    const MutexLock lock(mutex_);
    subGroupName_ = std::move(name);
}

std::string HYReportingDriver::description() const {
    const MutexLock lock(mutex_);
    return std::string(orNull(groupName_)).append("-").append(orNull(subGroupName_));
}

} // namespace halyard
