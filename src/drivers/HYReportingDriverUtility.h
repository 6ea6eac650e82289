// Subscribes to the statistics channels of the audio drivers, takes snapshots of
// them for sessions, and later sends what changed since as up to three messages
// of the session: counters, histograms and state residencies in compact text.
//
// The subscriptions are made once, at construction: a driver that comes later is
// not seen before the next start of the service. Every failure is logged and
// costs its driver or channel only.
//
// Runs on whatever queue the service calls it from, one call at a time.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "common/Value.h"
#include "drivers/HYReportingIOChannelSubscription.h"
#include "platform/HWReport.h"
#include "session/HYReportingSession.h"

namespace halyard {

class HYReportingDriverUtility final {
public:
    using Subscriptions = std::vector<HYReportingIOChannelSubscription>;

    HYReportingDriverUtility();

    // The current samples of all drivers that can be sampled.
    platform::DriverSnapshotRef getSnapShot() const;
    // Reports the change since the session's snapshot, which stays as it is;
    // nothing for a session without one. Requires a session.
    void sendDriverLogsForSession(const std::shared_ptr<HYReportingSession>& session) const;

    // Each adds at most one entry to `driverStats`.
    static void processSimpleData(const platform::HWReportChannel& channel,
                                  Dictionary& driverStats);
    static void processHistogramData(const platform::HWReportChannel& channel,
                                     Dictionary& driverStats);
    static void processStateData(const platform::HWReportChannel& channel, Dictionary& driverStats);
    // "CodecOne_Stats_RxPath_Simple_FrameDrops"
    static std::string getDriverStatsKey(const platform::HWReportChannel& channel,
                                         std::string_view type);

    const Subscriptions& ioChannelSubscriptions() const { return ioChannelSubscriptions_; }
    void setIoChannelSubscriptions(Subscriptions subscriptions) {
        ioChannelSubscriptions_ = std::move(subscriptions);
    }

private:
    struct Statistics {
        Dictionary simple;
        Dictionary histogram;
        Dictionary state;
    };

    void subscribeTo(const std::shared_ptr<HYReportingDriver>& driver);
    static void collect(const HYReportingIOChannelSubscription& subscription,
                        const platform::DriverSnapshotRef& snapshot, Statistics& statistics);
    static void processChannel(const platform::HWReportChannel& channel, Statistics& statistics);

    Subscriptions ioChannelSubscriptions_;
};

} // namespace halyard
