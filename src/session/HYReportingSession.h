// One reporting session of one client, from its creation to its destruction: its
// service type and configuration and, behind one face, the parts that do the
// work: the batch of the messages it accepted, their upload, and traces.
//
// Threads: the client's requests call it on the service work queue. The upload
// runs on a queue of its own. The accessors may be used from any thread; each
// yields a whole value.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "common/HYReportingUtility.h"
#include "common/Mutex.h"
#include "common/Value.h"
#include "platform/ClientBudget.h"
#include "platform/Clock.h"
#include "platform/HWReport.h"
#include "platform/QueueCheck.h"
#include "session/SessionBatch.h"
#include "session/SingleMessage.h"
#include "session/TraceControl.h"
#include "session/Upload.h"
#include "sinks/SessionFacts.h"

namespace halyard {

// Keys that clients may put into messages; the session treats them like any other.
inline constexpr const char* HYReportingSessionBlacklistFieldsKey = "_comparison_field_blacklist";
inline constexpr const char* HYReportingSessionThrottleSecondsKey = "_throttle_seconds";

class HYReportingSession final : public SessionFacts,
                                 public std::enable_shared_from_this<HYReportingSession> {
public:
    using SendReply = halyard::SendReply;
    using TransactionCompleteBlock = std::function<void(const MaybeError&, bool)>;
    using BatchedMessage = SessionBatch::Entry;

    // The first process identifier is the owner's.
    static std::shared_ptr<HYReportingSession>
    initWithID(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers);
    ~HYReportingSession() override;

    // Has the owner's budget pay for the session and for what it keeps of the owner's;
    // nobody does before. The bound that refuses it; none when it fits. Called once,
    // before anything else.
    [[nodiscard]] std::optional<platform::ClientBound> chargeTo(platform::ClientBudgetPtr owner);

    // For lines of the log: of a long application name only the beginning.
    std::string description() const { return std::string(sharedDescription().text()); }
    // The same, kept until something of it changes, since a broadcast shows every session.
    Value sharedDescription() const HY_EXCLUDES(mutex_);

    // Starting a started session and stopping one that is not are no-ops. A stop
    // blocks until the trace, if there is one, is complete.
    void start();
    void stop(platform::UploadEnding ending = platform::UploadEnding::Stopped);
    bool started() const { return batch_.started(); }
    // Tells the upload what was repeated so far, for a session that nobody will stop.
    void relayRepeats();

    void setServiceType(AudioServiceType type);
    // Merges; null is ignored. Never removes a key.
    void setConfiguration(const Dictionary* configuration) HY_EXCLUDES(mutex_);
    // The merge for clients: also takes "VQHostApplicationDisplayID" as the
    // application's name. The bound that it would pass, and then nothing has changed;
    // none when it is done.
    std::optional<platform::ClientBound>
    updateConfigurationWithContentsOfConfiguration(const Dictionary& update) HY_EXCLUDES(mutex_);

    // A client's message, which sendMessage takes for one of the daemon's own.
    void offer(Dictionary message, AudioEventCategory category, AudioEventType type);
    // What an offered message of `bytes` would add to what the session keeps.
    std::size_t growthBy(AudioEventCategory category, AudioEventType type,
                         std::size_t bytes) const {
        return batch_.growthBy(category, type, bytes);
    }

    // Batches the message unless it repeats its predecessor and, with relay
    // reporting enabled, hands it on to the relay queue. `sync` is ignored: every
    // delivery is asynchronous. The reply may be null; it is called at once and
    // never tells what became of the delivery.
    void sendMessage(Dictionary message, AudioEventCategory category, AudioEventType type,
                     bool sync, const SendReply& reply);
    void sendMessage(Dictionary message, AudioEventCategory category, AudioEventType type,
                     const SendReply& reply) {
        sendMessage(std::move(message), category, type, false, reply);
    }
    // Uploads one message on its own, one second later. `userInfo` is ignored:
    // the user information is built from the service type alone.
    static void sendSingleMessage(Dictionary message, AudioEventCategory category,
                                  AudioEventType type, AudioServiceType serviceType,
                                  const Dictionary& userInfo, SendReply reply);

    // What the accepted messages amount to; none while the session is not
    // started. The summary is handed over: asked again it starts anew.
    std::vector<Dictionary> createVolumeMessages() const { return batch_.volumeMessages(); }
    std::optional<Dictionary> createSummaryEventForSession() {
        return batch_.takeSummary(serviceType());
    }
    // On internal builds, writes the batch to a file of its own.
    void writeSummaryJson() const;

    std::int64_t reporterID() const { return reporterID_; }
    const std::vector<std::int32_t>& processIdentifiers() const { return processIdentifiers_; }
    AudioServiceType serviceType() const override { return serviceType_.load(); }
    std::string serviceName() const;
    Dictionary configuration() const override HY_EXCLUDES(mutex_);
    bool shouldReportOrientation() const { return false; }
    // Stores the reply of a start request that is held until the session stops,
    // and returns the one held before.
    TransactionCompleteBlock exchangeTransactionCompleteBlock(TransactionCompleteBlock block)
        HY_EXCLUDES(mutex_);
    // Kept for the driver statistics, which report the change since; null when
    // there is none. The session itself does not read it.
    platform::DriverSnapshotRef driverSnapShot() const HY_EXCLUDES(mutex_);
    void setDriverSnapShot(platform::DriverSnapshotRef snapshot) HY_EXCLUDES(mutex_);

    // Of the batch (see SessionBatch).
    std::uint64_t redundantMessages() const { return batch_.redundantMessages(); }
    std::uint32_t messageIdentifierCount(std::string_view base) const {
        return batch_.countFor(base);
    }
    std::vector<BatchedMessage> nestedAggregatedPayloadData() const { return batch_.entries(); }

    // Of the upload (see Upload).
    bool relayReportingEnabled() const { return upload_.enabled(); }
    void setRelayReportingEnabled(bool enabled) { upload_.setEnabled(enabled); }
    const std::atomic<bool>& getRelayReportingStartedState() const {
        return upload_.startedState();
    }
    bool hasRelayReportingSession() const { return upload_.hasSession(); }

    // Of the trace.
    void setupTracing(const std::string* fileName) { trace_->setupTracing(fileName); }
    std::optional<std::string> tracingFileName() const { return trace_->tracingFileName(); }
    bool startedTracing() const { return trace_->startedTracing(); }
    // Whether its start or its end may have to do with a trace, and so take long.
    bool mayTrace() const { return serviceType() == kAudioServiceTypeTest || startedTracing(); }
    std::optional<platform::SteadyTime> stopWaitsSince() const { return trace_->stopWaitsSince(); }
    std::string getPSTraceFileURL() const { return trace_->getPSTraceFileURL(); }

private:
    HYReportingSession(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers);

    // What a description was made of.
    struct Described {
        AudioServiceType type{};
        bool started = false;
        Value name;
        Value text; // none before the first
    };

    std::string describedBy(AudioServiceType type, bool isStarted, const Value& name) const;
    void take(Dictionary message, AudioEventCategory category, AudioEventType type);
    void sendVolumeEvents();
    void sendSummaryEvent();

    // Who pays for the session, if anybody; and its place among the owner's sessions.
    platform::ClientBudgetPtr owner_;
    bool hasPlace_ = false;
    platform::Allotment ownBytes_;

    // Where sessions are made and, but for what is for any thread, used.
    const platform::SameQueue onServiceQueue_;

    const std::int64_t reporterID_;
    const std::vector<std::int32_t> processIdentifiers_;
    std::atomic<AudioServiceType> serviceType_{kAudioServiceTypeUnknown};
    SessionBatch batch_;
    Upload upload_;
    // Shared with nobody; the trace framework looks whether it is still there.
    const std::shared_ptr<TraceControl> trace_;

    mutable Mutex mutex_;
    Dictionary configuration_ HY_GUARDED_BY(mutex_);
    mutable Described described_ HY_GUARDED_BY(mutex_);
    platform::Allotment configurationBytes_ HY_GUARDED_BY(mutex_);
    TransactionCompleteBlock transactionCompleteBlock_ HY_GUARDED_BY(mutex_);
    platform::DriverSnapshotRef driverSnapShot_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard
