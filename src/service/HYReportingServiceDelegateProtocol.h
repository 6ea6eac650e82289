// What the service object offers to its client objects, which know it by
// nothing else.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "common/HYReportingUtility.h"
#include "common/Value.h"
#include "platform/HWReport.h"
#include "platform/KeptLine.h"

namespace halyard {

class HYReportingClientServerInstance;
class HYReportingSession;
class MessageSinks;

// What lines of the log name of a list; of the rest they have the number.
inline constexpr std::size_t kNamedInLog = 16;

// What came of looking for sessions of other clients, for lines of the log.
struct SessionLookups {
    struct Found {
        std::int64_t reporterID;
        std::int32_t pid; // of the client that holds it
    };
    void addFound(std::int64_t reporterID, std::int32_t pid) {
        if (++foundCount <= kNamedInLog) {
            found.push_back({reporterID, pid});
        }
    }
    void addFailed(std::int64_t reporterID) {
        if (++failedCount <= kNamedInLog) {
            failed.push_back(reporterID);
        }
    }

    std::vector<Found> found; // the first of them
    std::vector<std::int64_t> failed;
    std::size_t foundCount = 0;
    std::size_t failedCount = 0;
};

// All on the service work queue, but for findReportingSessionForID (any thread).
class HYReportingServiceDelegateProtocol {
public:
    using Client = std::shared_ptr<HYReportingClientServerInstance>;
    using Session = std::shared_ptr<HYReportingSession>;

    virtual ~HYReportingServiceDelegateProtocol() = default;

    virtual Dictionary getDefaults() const = 0;
    virtual std::optional<Dictionary> getFeaturesState() const = 0;
    virtual std::vector<Client> getAllClients() const = 0;
    virtual bool isReportingEnabled() const = 0;
    virtual std::vector<Session> getAllActiveReportingSessions() const = 0;
    // The line about these that every message without an address writes.
    virtual platform::KeptLine& activeSessionsLine() = 0;
    virtual Session findReportingSessionForID(std::int64_t reporterID) const = 0;
    // The same for one of many: what is to be told is noted, and told later.
    virtual Session findReportingSessionForID(std::int64_t reporterID,
                                              SessionLookups& lookups) const = 0;
    virtual void tell(const SessionLookups& lookups) const = 0;
    // A session has left its client's map.
    virtual void sessionRetired(const HYReportingSession& session) = 0;
    // The driver statistics as they are now.
    virtual platform::DriverSnapshotRef getSnapShot() = 0;
    // Sends what changed since the session's snapshot.
    virtual void sendDriverLogsForSession(const Session& session) = 0;
    virtual void removeClient(const HYReportingClientServerInstance& client) = 0;
    // What every message is offered to.
    virtual MessageSinks& sinks() = 0;
    // Offers the message to the issue capture of internal builds alone, the last
    // of the sinks.
    virtual void handleEventForIBX(const Dictionary& message, AudioEventCategory category,
                                   AudioEventType type, const Session& session,
                                   const std::optional<std::string>& processName) = 0;
    virtual std::int64_t activeSessionCount() const = 0;
    virtual void setActiveSessionCount(std::int64_t count) = 0;
};

} // namespace halyard
