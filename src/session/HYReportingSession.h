// One reporting session of one client, from its creation to its destruction: its
// service type and configuration and, while it runs, the batch of the messages
// it accepted and its upload session.
//
// Threads: the client's requests call it on the service work queue. Opening the
// upload session, every delivery to it and its closing run, in that order, on
// the session's own relay queue. The accessors may be used from any thread; each
// yields a whole value.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "common/Error.h"
#include "common/HYReportingUtility.h"
#include "common/Mutex.h"
#include "common/Value.h"
#include "platform/Clock.h"
#include "platform/HWReport.h"
#include "platform/PerformanceTrace.h"
#include "platform/RelayReporting.h"
#include "platform/Semaphore.h"
#include "platform/WorkQueue.h"
#include "session/AsyncSemaphore.h"
#include "session/MessageBatch.h"
#include "sinks/SessionFacts.h"

namespace halyard {

class TraceRunner;
struct TraceParams;

// Keys that clients may put into messages; the session treats them like any other.
inline constexpr const char* HYReportingSessionBlacklistFieldsKey = "_comparison_field_blacklist";
inline constexpr const char* HYReportingSessionThrottleSecondsKey = "_throttle_seconds";

// How long an opening upload session waits for its back ends, in seconds; the
// integer part counts.
inline constexpr const char* HYReportingRelayReportingTimeOut = "9.0";

// Configuration keys of performance traces, and the kinds of trace there are.
inline constexpr const char* HYReportingTraceType = "HYReportingTraceType";
inline constexpr const char* HYReportingTraceTypeEvtap = "evtap";
inline constexpr const char* HYReportingTraceTypeArtrace = "artrace";
inline constexpr const char* HYReportingLoomisPlistFilePath = "HYReportingLoomisPlistFilePath";
// Declared for those who configure traces; the session reads none of them.
inline constexpr const char* HYReportingPerfProcesses = "HYReportingPerfProcesses";
inline constexpr const char* HYReportingDelayPerfEndSnapShot = "HYReportingPerfEndDelay";
inline constexpr const char* HYReportingTestName = "HYReportingTestName";

class HYReportingSession final : public SessionFacts,
                                 public platform::PerformanceTraceDelegate,
                                 public std::enable_shared_from_this<HYReportingSession> {
public:
    using SendReply = std::function<void(const MaybeError&)>;
    using TransactionCompleteBlock = std::function<void(const MaybeError&, bool)>;

    // The first process identifier is the owner's.
    static std::shared_ptr<HYReportingSession>
    initWithID(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers);
    ~HYReportingSession() override;

    std::string description() const;

    // Starting a started session and stopping one that is not are no-ops.
    void start();
    void stop();

    void setServiceType(AudioServiceType type);
    // Merges; null is ignored. Never removes a key.
    void setConfiguration(const Dictionary* configuration);
    // The merge for clients: also takes "VQHostApplicationDisplayID" as the
    // application's name.
    void updateConfigurationWithContentsOfConfiguration(const Dictionary& update)
        HY_EXCLUDES(stateMutex_);

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
    static void sendSingleMessage(const Dictionary& message, AudioEventCategory category,
                                  AudioEventType type, AudioServiceType serviceType,
                                  const Dictionary& userInfo, SendReply reply);

    // What the accepted messages amount to; none while the session is not
    // started. The summary is handed over: asked again it starts anew.
    std::vector<Dictionary> createVolumeMessages() const HY_EXCLUDES(batchMutex_);
    std::optional<Dictionary> createSummaryEventForSession() HY_EXCLUDES(batchMutex_);

    // On internal builds, writes the batch to a file of its own.
    void writeSummaryJson() const HY_EXCLUDES(batchMutex_);

    // Records the message in the batch unless it is redundant; true when it was.
    bool createMessageIdentifierWithCategory(AudioEventCategory category, AudioEventType type,
                                             const Dictionary& message) HY_REQUIRES(batchMutex_);

    bool started() const { return started_.load(); }
    std::int64_t reporterID() const { return reporterID_; }
    const std::vector<std::int32_t>& processIdentifiers() const { return processIdentifiers_; }
    AudioServiceType serviceType() const override { return serviceType_.load(); }
    std::string serviceName() const HY_EXCLUDES(stateMutex_);
    Dictionary configuration() const override HY_EXCLUDES(stateMutex_);
    bool relayReportingEnabled() const { return relayReportingEnabled_.load(); }
    void setRelayReportingEnabled(bool enabled) { relayReportingEnabled_.store(enabled); }
    // The flag itself, not a copy.
    const std::atomic<bool>& getRelayReportingStartedState() const {
        return relayReportingSessionStarted_;
    }
    bool hasRelayReportingSession() const HY_EXCLUDES(stateMutex_);
    bool shouldReportOrientation() const { return false; }
    // Stores the reply of a start request that is held until the session stops,
    // and returns the one held before.
    TransactionCompleteBlock exchangeTransactionCompleteBlock(TransactionCompleteBlock block);
    // Kept for the driver statistics, which report the change since; null when
    // there is none. The session itself does not read it.
    platform::DriverSnapshotRef driverSnapShot() const HY_EXCLUDES(stateMutex_);
    void setDriverSnapShot(platform::DriverSnapshotRef snapshot) HY_EXCLUDES(stateMutex_);

    // Repeats that were dropped since the session was created.
    std::uint64_t redundantMessages() const { return redundantMessages_.load(); }
    // The number of the last accepted message of a base identifier; 0 when there
    // is none or the session is not started.
    std::uint32_t messageIdentifierCount(std::string_view base) const HY_EXCLUDES(batchMutex_);
    struct BatchedMessage {
        std::string identifier;
        Dictionary message;
    };
    // A copy. Empty when the session is not started, and where no file will be
    // made of it (see MessageBatch).
    std::vector<BatchedMessage> nestedAggregatedPayloadData() const HY_EXCLUDES(batchMutex_);

    // Reads the trace parameter file and makes the runner of its traces; null is
    // logged and refused.
    void setupTracing(const std::string* fileName) HY_EXCLUDES(stateMutex_);
    std::optional<std::string> tracingFileName() const HY_EXCLUDES(stateMutex_);
    bool startedTracing() const { return startedTracing_.load(); }
    // Since when a stop waits for its trace to complete, which has no limit; none
    // while none does.
    std::optional<platform::SteadyTime> stopWaitsSince() const HY_EXCLUDES(stateMutex_);
    // Where the last performance trace lies; empty before.
    std::string getPSTraceFileURL() const HY_EXCLUDES(stateMutex_);

    void performanceTraceDidStart(const MaybeError& error) override HY_EXCLUDES(stateMutex_);
    void performanceTraceDidStop(const MaybeError& error) override HY_EXCLUDES(stateMutex_);
    void performanceTraceDidComplete(std::string_view traceURL, std::string_view token,
                                     const MaybeError& error) override HY_EXCLUDES(stateMutex_);

private:
    struct Opening;
    struct Delivery {
        Dictionary tagged;
        std::optional<Dictionary> original; // as the client sent it, where it will be logged
        AudioEventCategory category;
        AudioEventType type;
        bool wasStarted; // when the message was sent
        bool redundant;
    };

    HYReportingSession(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers);

    // Made on first use.
    std::shared_ptr<platform::SerialQueue> relayReportingQueue() HY_EXCLUDES(stateMutex_);
    std::shared_ptr<platform::RelayReporting> relayReportingSession() const
        HY_EXCLUDES(stateMutex_);

    void sendVolumeEvents();
    void sendSummaryEvent();

    // Queue what follows below.
    void startRelayReporting();
    void stopRelayReporting();
    void relay(Delivery delivery);

    // On the relay queue.
    void openRelayReporting(const Opening& opening);
    void finishOpening(bool signalled);
    void deliver(Delivery delivery);
    void closeRelayReporting();
    void dropRelayReportingSession() HY_EXCLUDES(stateMutex_);

    // On a thread of the upload framework.
    void backendsFound(const std::optional<List>& backends);

    // The trace of a session of type test, from start to stop. Stopping blocks
    // until the trace is complete.
    bool tracesPerformance() const;
    void startTracing();
    void startPerformanceTrace() HY_EXCLUDES(stateMutex_);
    void stopTracing();
    void waitForTrace();
    void stopEventTrace();
    void setStopWaitsSince(std::optional<platform::SteadyTime> since) HY_EXCLUDES(stateMutex_);
    std::shared_ptr<platform::PerformanceTraceSession> traceSession() const
        HY_EXCLUDES(stateMutex_);
    void dropTraceSession() HY_EXCLUDES(stateMutex_);

    const std::int64_t reporterID_;
    const std::vector<std::int32_t> processIdentifiers_;
    const std::shared_ptr<AsyncSemaphore> relayreportingBackendSemaphore_ =
        std::make_shared<AsyncSemaphore>();

    std::atomic<bool> started_{false};
    std::atomic<std::uint64_t> redundantMessages_{0};
    std::atomic<bool> relayReportingEnabled_{false};
    std::atomic<bool> relayReportingSessionStarted_{false};

    std::atomic<bool> startedTracing_{false};
    platform::Semaphore mTraceDispatchSemaphore_;
    // On the service queue only; there while an event trace runs.
    std::unique_ptr<TraceParams> traceParams_;
    std::unique_ptr<TraceRunner> traceRunner_;

    mutable Mutex stateMutex_;
    // Changed together with the name, but asked for by itself with every message.
    std::atomic<AudioServiceType> serviceType_{kAudioServiceTypeUnknown};
    std::string serviceName_ HY_GUARDED_BY(stateMutex_) = "unknown";
    Dictionary configuration_ HY_GUARDED_BY(stateMutex_);
    TransactionCompleteBlock transactionCompleteBlock_ HY_GUARDED_BY(stateMutex_);
    platform::DriverSnapshotRef driverSnapShot_ HY_GUARDED_BY(stateMutex_);
    std::shared_ptr<platform::SerialQueue> relayReportingQueue_ HY_GUARDED_BY(stateMutex_);
    std::shared_ptr<platform::RelayReporting> relayReportingSession_ HY_GUARDED_BY(stateMutex_);
    Value relayReportingAgentToken_ HY_GUARDED_BY(stateMutex_);

    std::optional<std::string> tracingFileName_ HY_GUARDED_BY(stateMutex_);
    std::optional<platform::PerformanceTraceConfig> traceConfig_ HY_GUARDED_BY(stateMutex_);
    std::shared_ptr<platform::PerformanceTraceSession> traceSession_ HY_GUARDED_BY(stateMutex_);
    std::string finalTraceURL_ HY_GUARDED_BY(stateMutex_);
    std::optional<platform::SteadyTime> stopWaitsSince_ HY_GUARDED_BY(stateMutex_);

    mutable Mutex batchMutex_;
    // Null while the session is not started.
    std::unique_ptr<MessageBatch> batch_ HY_GUARDED_BY(batchMutex_);
};

} // namespace halyard
