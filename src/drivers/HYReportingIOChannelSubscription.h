// One live subscription to a group of driver channels.
//
// Not thread-safe: filled while the utility that holds it is built, read from
// then on.
#pragma once

#include <memory>
#include <utility>

#include "drivers/HYReportingDriver.h"
#include "platform/HWReport.h"

namespace halyard {

class HYReportingIOChannelSubscription final {
public:
    explicit HYReportingIOChannelSubscription(std::shared_ptr<HYReportingDriver> driver)
        : driver_(std::move(driver)) {}

    // Borrowed: a handle of the library, never released. Null until it is set,
    // and when subscribing failed.
    platform::HWReportSubscription* subscription() const { return subscription_; }
    void setSubscription(platform::HWReportSubscription* subscription) {
        subscription_ = subscription;
    }
    // Handed back to the library at each sample; may be null.
    const platform::HWReportChannelsRef& subscribedChannels() const { return subscribedChannels_; }
    void setSubscribedChannels(platform::HWReportChannelsRef channels) {
        subscribedChannels_ = std::move(channels);
    }
    const std::shared_ptr<HYReportingDriver>& driver() const { return driver_; }
    void setDriver(std::shared_ptr<HYReportingDriver> driver) { driver_ = std::move(driver); }

private:
    platform::HWReportSubscription* subscription_ = nullptr;
    platform::HWReportChannelsRef subscribedChannels_;
    std::shared_ptr<HYReportingDriver> driver_;
};

} // namespace halyard
