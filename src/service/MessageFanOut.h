// Routes one client message to the sessions concerned and to the four sinks.
//
// In steps: a message for thousands of sessions takes longer than others may wait, so
// whoever has it runs it as tasks of the service work queue, in the order of arrival of
// messages as far as each session sees it. What it makes the daemon keep and copy is
// looked at before any of it is made.
//
// Borrows nothing; lives for that one message.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "common/Error.h"
#include "common/Message.h"
#include "service/HYReportingServiceDelegateProtocol.h"
#include "session/HYReportingSession.h"

namespace halyard {

class MessageFanOut {
public:
    using Delegate = HYReportingServiceDelegateProtocol;
    using Session = std::shared_ptr<HYReportingSession>;
    using ReporterIDs = std::optional<std::vector<std::int64_t>>;
    // The sender's own sessions.
    using OwnLookup = std::function<Session(std::int64_t reporterID)>;

    // Without a list the message goes to every started session or, where there is
    // none, out on its own; unknown reporter IDs are skipped silently. The name is
    // that of the sender's process, where issue capture will want it.
    MessageFanOut(Message message, ReporterIDs reporterIDs, std::optional<std::string> processName)
        : message_(std::move(message)), reporterIDs_(std::move(reporterIDs)),
          processName_(std::move(processName)) {}

    // Takes a step; true when it was the last. The first one tells of a disabled
    // service or a bound by error().
    [[nodiscard]] bool advance(Delegate& delegate, const OwnLookup& findOwn);
    const MaybeError& error() const { return error_; }

private:
    enum class Stage { Begin, FindSessions, Offer };

    bool begin(Delegate& delegate);
    bool findSessions(Delegate& delegate, const OwnLookup& findOwn);
    Session find(std::int64_t reporterID, const Delegate& delegate, const OwnLookup& findOwn);
    // Whether all that the message would leave and take is within bounds.
    bool isAllowed();
    bool offerToSome(Delegate& delegate);
    void offer(Delegate& delegate, const Session& session, bool last);
    void offerToSinks(Delegate& delegate, const Session& session) const;
    void sendStandalone(Delegate& delegate) const;

    Message message_;
    ReporterIDs reporterIDs_;
    std::optional<std::string> processName_;
    Stage stage_ = Stage::Begin;
    MaybeError error_;
    std::size_t bytes_ = 0; // of the message
    std::size_t next_ = 0;  // of the IDs, then of the sessions
    std::vector<Session> sessions_;
    SessionLookups lookups_;
};

// A list of session descriptions, for log lines, of `count` sessions of which these
// come first. What a line with one depends on that has a number beside it.
std::vector<Value> tellSessions(std::int64_t number,
                                const std::vector<std::shared_ptr<HYReportingSession>>& sessions,
                                std::size_t count);
Value describeSessions(const std::vector<std::shared_ptr<HYReportingSession>>& sessions,
                       std::size_t count);
inline Value describeSessions(const std::vector<std::shared_ptr<HYReportingSession>>& sessions) {
    return describeSessions(sessions, sessions.size());
}

} // namespace halyard
