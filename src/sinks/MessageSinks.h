// The four sinks behind one call.
//
// The order of the sinks shows in the log and in the store, where readers rely
// on it; this is the only place that knows it.
//
// Not thread-safe: runs on the service work queue, because issue capture does.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "common/Message.h"
#include "sinks/HYReportingUtilityIBXStateManager.h"
#include "sinks/SessionFacts.h"

namespace halyard {

class MessageSinks {
public:
    // Issue capture exists on internal builds only. Requires an installed
    // platform.
    MessageSinks();
    virtual ~MessageSinks() = default;

    // To analytics, the energy ledger, the metrics and issue capture. The process
    // is the sender's, where it is known. Requires a session.
    virtual void handleEvent(const Message& message,
                             const std::shared_ptr<const SessionFacts>& session,
                             const std::optional<std::string>& processName);
    // To the last of them alone.
    void captureIssue(const Message& message, const std::shared_ptr<const SessionFacts>& session,
                      const std::optional<std::string>& processName);

private:
    std::unique_ptr<HYReportingUtilityIBXStateManager> issueCapture_;
};

} // namespace halyard
