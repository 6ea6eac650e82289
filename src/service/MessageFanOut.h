// Routes one client message to the sessions concerned and to the four sinks.
//
// Runs on the service work queue, so sessions see one message at a time, in the
// order of arrival. Borrows all that it is given but the message; lives for that
// one message.
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
    using Session = std::shared_ptr<HYReportingSession>;
    using Lookup = std::function<Session(std::int64_t reporterID)>;

    // The name is that of the sender's process, where issue capture will want it.
    MessageFanOut(HYReportingServiceDelegateProtocol& delegate, Message message,
                  const std::optional<std::string>& processName)
        : delegate_(delegate), message_(std::move(message)), processName_(processName) {}

    // Without a list the message goes to every started session or, where there
    // is none, out on its own. The error is that of a disabled service; unknown
    // reporter IDs are skipped silently. Call it once: the message goes.
    MaybeError route(const std::optional<std::vector<std::int64_t>>& reporterIDs,
                     const Lookup& findAcrossAllClients);

private:
    void sendToAddressed(const std::vector<std::int64_t>& reporterIDs,
                         const Lookup& findAcrossAllClients);
    void broadcast() const;
    void sendStandalone() const;
    void offerToSinks(const Session& session) const;

    HYReportingServiceDelegateProtocol& delegate_;
    Message message_;
    const std::optional<std::string>& processName_;
};

// What lines of the log name of a list; of the rest they have the number.
inline constexpr std::size_t kNamedInLog = 16;

// A list of session descriptions, for log lines, of `count` sessions of which these
// come first.
Value describeSessions(const std::vector<std::shared_ptr<HYReportingSession>>& sessions,
                       std::size_t count);
inline Value describeSessions(const std::vector<std::shared_ptr<HYReportingSession>>& sessions) {
    return describeSessions(sessions, sessions.size());
}

} // namespace halyard
