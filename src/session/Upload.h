// The upload of one session: opened when the session starts, fed with its
// messages, closed when it stops.
//
// All of that runs in this order on a queue of its own, the relay queue. Opening
// waits for back ends and holds back what is behind it.
//
// A part of its session: whatever it queues keeps the session until it is done,
// and this with it.
//
// Any thread may queue and ask.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <utility>

#include "common/Message.h"
#include "common/Mutex.h"
#include "platform/MessageAccounts.h"
#include "platform/RelayReporting.h"
#include "platform/WorkQueue.h"
#include "session/AsyncSemaphore.h"
#include "sinks/SessionFacts.h"

namespace halyard {

// How long an opening upload session waits for its back ends, in seconds; the
// integer part counts.
inline constexpr const char* HYReportingRelayReportingTimeOut = "9.0";

class Upload final {
public:
    using Session = std::shared_ptr<const SessionFacts>;

    struct Delivery {
        Message tagged;
        std::optional<Dictionary> original; // as the client sent it, where it will be logged
        bool wasStarted;                    // the session, when the message was sent
        bool redundant;
    };

    // Borrows the session, which owns it.
    Upload(std::int64_t reporterID, const SessionFacts& session)
        : reporterID_(reporterID), session_(session) {}
    Upload(const Upload&) = delete; // What is queued points to it.
    Upload& operator=(const Upload&) = delete;

    // Whether the session's messages are uploaded; who calls the rest asks first.
    bool enabled() const { return enabled_.load(); }
    void setEnabled(bool enabled) { enabled_.store(enabled); }

    // Queue an opening, a delivery, word of repeats and a closing. All are handed the session that
    // owns this. The upload session is told what its session is now.
    void start(Session session) HY_EXCLUDES(mutex_);
    void relay(Session session, Delivery delivery) HY_EXCLUDES(mutex_);
    void relay(Session session, const platform::Repeats& repeats) HY_EXCLUDES(mutex_);
    void stop(Session session, platform::UploadEnding ending) HY_EXCLUDES(mutex_);

    // Whether back ends were found; the flag itself, not a copy.
    const std::atomic<bool>& startedState() const { return relayReportingSessionStarted_; }
    bool hasSession() const HY_EXCLUDES(mutex_);

private:
    struct Opening;

    std::shared_ptr<Upload> kept(Session session) { return {std::move(session), this}; }
    // Made on first use.
    std::shared_ptr<platform::SerialQueue> relayReportingQueue() HY_EXCLUDES(mutex_);
    std::shared_ptr<platform::RelayReporting> relayReportingSession() const HY_EXCLUDES(mutex_);

    // On the relay queue.
    void openRelayReporting(const std::shared_ptr<Upload>& self, const Opening& opening);
    void finishOpening(bool signalled);
    void deliver(Delivery delivery);
    // Why messages of now are not uploaded; none when they are.
    std::optional<platform::MessageCount> ruleAgainst(const platform::RelayReporting* upload) const;
    void closeRelayReporting(platform::UploadEnding ending);
    void dropRelayReportingSession() HY_EXCLUDES(mutex_);

    // On a thread of the upload framework.
    void backendsFound(const std::optional<List>& backends);

    const std::int64_t reporterID_;
    const SessionFacts& session_;
    const std::shared_ptr<AsyncSemaphore> relayreportingBackendSemaphore_ =
        std::make_shared<AsyncSemaphore>();
    std::atomic<bool> enabled_{false};
    std::atomic<bool> relayReportingSessionStarted_{false};

    mutable Mutex mutex_;
    std::shared_ptr<platform::SerialQueue> relayReportingQueue_ HY_GUARDED_BY(mutex_);
    std::shared_ptr<platform::RelayReporting> relayReportingSession_ HY_GUARDED_BY(mutex_);
    Value relayReportingAgentToken_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard
