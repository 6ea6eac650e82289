// The one service object: it accepts connections, keeps the clients in the order
// of their acceptance, answers what spans all of them, and reports how long each
// stayed.
//
// The client list changes on the service work queue only. The monitor lock
// guards the creation of client objects and findReportingSessionForID, which
// delivery threads may use.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "common/Mutex.h"
#include "common/Value.h"
#include "drivers/HYReportingDriverUtility.h"
#include "platform/Listener.h"
#include "platform/WorkQueue.h"
#include "service/FeatureState.h"
#include "service/HYReportingServiceDelegateProtocol.h"
#include "sinks/MessageSinks.h"

namespace halyard {

class HYReportingServiceDelegate final
    : public platform::ListenerDelegate,
      public HYReportingServiceDelegateProtocol,
      public std::enable_shared_from_this<HYReportingServiceDelegate> {
public:
    // Reads the defaults, registers for the feature notifications and subscribes
    // to the driver statistics.
    static std::shared_ptr<HYReportingServiceDelegate> make();

    bool
    shouldAcceptNewConnection(const std::shared_ptr<platform::Connection>& connection) override;

    Dictionary getDefaults() const override { return defaults_; }
    std::optional<Dictionary> getFeaturesState() const override;
    std::vector<Client> getAllClients() const override;
    bool isReportingEnabled() const override { return reportingEnabled_; }
    std::vector<Session> getAllActiveReportingSessions() const override;
    platform::KeptLine& activeSessionsLine() override { return activeSessionsLine_; }
    Session findReportingSessionForID(std::int64_t reporterID) const override;
    Session findReportingSessionForID(std::int64_t reporterID,
                                      SessionLookups& lookups) const override;
    void tell(const SessionLookups& lookups) const override;
    void sessionRetired(const HYReportingSession& session) override;
    platform::DriverSnapshotRef getSnapShot() override;
    void sendDriverLogsForSession(const Session& session) override;
    void removeClient(const HYReportingClientServerInstance& client) override;
    MessageSinks& sinks() override { return sinks_; }
    void handleEventForIBX(const Dictionary& message, AudioEventCategory category,
                           AudioEventType type, const Session& session,
                           const std::optional<std::string>& processName) override;
    std::int64_t activeSessionCount() const override { return activeSessionCount_.load(); }
    void setActiveSessionCount(std::int64_t count) override;

    // The master switch, which nothing in the daemon ever turns off.
    void setReportingEnabled(bool enabled) { reportingEnabled_ = enabled; }
    const std::shared_ptr<platform::SerialQueue>& serviceQueue() const { return serviceQueue_; }

    // What operators see; the keys are listed in docs/wire.md. Any thread, but a
    // whole only on the service work queue.
    Dictionary status() const;
    // Whether a session's stop waits for its trace to complete. Any thread.
    bool isStopWaiting() const;

private:
    HYReportingServiceDelegate();

    void listenForFeatureStateChanges();
    void featureChanged(int token);
    void addClient(const Client& client) HY_EXCLUDES(monitor_);
    // The client may be gone already.
    static void reportUptime(std::int32_t pid, const HYReportingClientServerInstance* client);

    std::shared_ptr<platform::SerialQueue> serviceQueue_;
    bool reportingEnabled_ = true;
    const Dictionary defaults_;
    // Written on the service work queue only.
    std::atomic<std::int64_t> activeSessionCount_{0};
    bool withholdsUploads_ = false; // On the service work queue.
    std::atomic<std::uint64_t> repeatsOfRetiredSessions_{0};
    std::vector<FeatureRecord> features_;
    std::unique_ptr<HYReportingDriverUtility> driverUtility_;
    MessageSinks sinks_;
    // On the service work queue, like all lines that tell of sessions.
    platform::KeptLine activeSessionsLine_;
    mutable std::array<platform::KeptLine, kNamedInLog> clientLines_;

    mutable Mutex monitor_;
    std::vector<Client> clients_ HY_GUARDED_BY(monitor_);
};

} // namespace halyard
