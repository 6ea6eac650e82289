#include "session/HYReportingSession.h"

#include <cstdlib>
#include <fmt/format.h>
#include <utility>

#include "common/Json.h"
#include "platform/Clock.h"
#include "platform/Files.h"
#include "platform/HYReportingUtilityDevice.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/TraceMarks.h"
#include "session/SummaryFile.h"
#include "sinks/HYReportingTallyhubBridge.h"
#include "tracing/TraceRunner.h"

namespace halyard {
namespace {

constexpr std::uint32_t kCreatedMark = 0x21044828;
constexpr std::uint32_t kStartMark = 0x2104482C;
constexpr std::uint32_t kStopMark = 0x21044830;
constexpr std::uint32_t kDestroyedMark = 0x21044834;
constexpr std::uint32_t kMessageMark = 0x21044838;

constexpr std::uint32_t kLogsMode = 0777;
constexpr AudioEventCategory kSummaryCategory = 0xFFFFFFFF;
constexpr const char* kHostApplicationKey = "HostApplicationDisplayID";
constexpr const char* kClientApplicationKey = "VQHostApplicationDisplayID";

void mark(std::uint32_t code) {
    platform::current().traceMarks->mark(code, 0, 0, 0, 0);
}

} // namespace

std::shared_ptr<HYReportingSession>
HYReportingSession::initWithID(std::int64_t reporterID,
                               std::vector<std::int32_t> processIdentifiers) {
    return std::shared_ptr<HYReportingSession>(
        new HYReportingSession(reporterID, std::move(processIdentifiers)));
}

HYReportingSession::HYReportingSession(std::int64_t reporterID,
                                       std::vector<std::int32_t> processIdentifiers)
    : reporterID_(reporterID), processIdentifiers_(std::move(processIdentifiers)) {
    HY_LOG_INFO(HYReportingSessionCategory, "created reporting session for ID: {}", reporterID_);
    mark(kCreatedMark);
}

HYReportingSession::~HYReportingSession() {
    mark(kDestroyedMark);
    HY_LOG_INFO(HYReportingSessionCategory, "deallocing this session {}", reporterID_);
}

std::string HYReportingSession::description() const {
    const MutexLock lock(stateMutex_);
    return fmt::format(
        "reporterID={},serviceName={},ownerPid={},HostApplicationDisplayID={},started={}",
        reporterID_, serviceName_, processIdentifiers_.empty() ? 0 : processIdentifiers_.front(),
        describe(HYReportingUtilityRetrieveAppName(configuration_)), started() ? 1 : 0);
}

std::string HYReportingSession::serviceName() const {
    const MutexLock lock(stateMutex_);
    return serviceName_;
}

void HYReportingSession::setServiceType(AudioServiceType type) {
    const std::string_view name = HYReportingUtilityGenerateServiceNameFromServiceType(type);
    {
        const MutexLock lock(stateMutex_);
        serviceType_ = type;
        serviceName_ = name;
    }
    HY_LOG_INFO(HYReportingSessionCategory, "setting service type {}", name);
}

Dictionary HYReportingSession::configuration() const {
    const MutexLock lock(stateMutex_);
    return configuration_;
}

void HYReportingSession::setConfiguration(const Dictionary* configuration) {
    if (configuration != nullptr) {
        const MutexLock lock(stateMutex_);
        configuration_.merge(*configuration);
    }
}

void HYReportingSession::updateConfigurationWithContentsOfConfiguration(const Dictionary& update) {
    const MutexLock lock(stateMutex_);
    if (const Value* application = update.find(kClientApplicationKey)) {
        configuration_.set(kHostApplicationKey, *application);
    }
    configuration_.merge(update);
}

HYReportingSession::TransactionCompleteBlock
HYReportingSession::exchangeTransactionCompleteBlock(TransactionCompleteBlock block) {
    const MutexLock lock(stateMutex_);
    return std::exchange(transactionCompleteBlock_, std::move(block));
}

platform::DriverSnapshotRef HYReportingSession::driverSnapShot() const {
    const MutexLock lock(stateMutex_);
    return driverSnapShot_;
}

void HYReportingSession::setDriverSnapShot(platform::DriverSnapshotRef snapshot) {
    const MutexLock lock(stateMutex_);
    driverSnapShot_.swap(snapshot); // The old one goes once the lock is released.
}

void HYReportingSession::start() {
    HY_LOG_DEBUG(HYReportingSessionCategory, "starting session owned by {}", reporterID_);
    if (started()) {
        HY_LOG_INFO(HYReportingSessionCategory, "{} is already started", reporterID_);
        return;
    }
    {
        const MessageBatch::Options options{
            .keepsMessages = HYReportingUtilityIsInternalBuild(),
            .minimumPlaytime = HYReportingUtilityVolumeMinimumPlayingTime(serviceType())};
        const MutexLock lock(batchMutex_);
        batch_ = std::make_unique<MessageBatch>(options);
        started_.store(true);
    }
    mark(kStartMark);
    if (relayReportingEnabled()) {
        startRelayReporting();
    }
    startTracing();
}

void HYReportingSession::stop() {
    HY_LOG_DEBUG(HYReportingSessionCategory, "ending session {}", reporterID_);
    if (!started()) {
        return;
    }
    HY_LOG_DEBUG(HYReportingSessionCategory, "ending session {}", reporterID_);
    mark(kStopMark);
    sendVolumeEvents();
    writeSummaryJson();
    sendSummaryEvent();
    if (relayReportingEnabled()) {
        stopRelayReporting();
    }
    stopTracing();
    std::unique_ptr<MessageBatch> finished; // Freed after the lock.
    {
        const MutexLock lock(batchMutex_);
        finished = std::move(batch_);
        started_.store(false);
    }
}

std::vector<Dictionary> HYReportingSession::createVolumeMessages() const {
    const MutexLock lock(batchMutex_);
    return batch_ != nullptr ? batch_->volumeEvents() : std::vector<Dictionary>();
}

std::optional<Dictionary> HYReportingSession::createSummaryEventForSession() {
    const AudioServiceType type = serviceType();
    const MutexLock lock(batchMutex_);
    return batch_ != nullptr ? batch_->takeSummary(type) : std::nullopt;
}

void HYReportingSession::sendVolumeEvents() {
    const auto events = createVolumeMessages();
    if (events.empty()) {
        return;
    }
    HY_LOG_DEFAULT(HYReportingSessionCategory, "sending volume event for reporter {}", reporterID_);
    for (const Dictionary& event : events) {
        sendMessage(event, kAudioEventCategoryVolume, kAudioEventTypeSummary, true, nullptr);
        HYReportingTallyhubBridge::handleEvent(&event, kAudioEventCategoryVolume,
                                               kAudioEventTypeSummary, shared_from_this());
    }
}

void HYReportingSession::writeSummaryJson() const {
    if (!HYReportingUtilityIsInternalBuild()) {
        return;
    }
    std::string text;
    {
        const MutexLock lock(batchMutex_);
        if (batch_ == nullptr || batch_->empty()) {
            return;
        }
        text = toPrettyJson(summaryFileContents(batch_->entries()));
    }
    platform::Files& files = *platform::current().files;
    if (const auto error = files.createDirectories(HYReportingLogsDirectory, kLogsMode)) {
        HY_LOG_ERROR(HYReportingSessionCategory, "can't create logging directory at {}: {}",
                     files.located(HYReportingLogsDirectory), error->message);
    }
    const platform::Clock& clock = *platform::current().clock;
    const std::string path =
        std::string(HYReportingLogsDirectory) + '/' +
        summaryFileName(clock.wallTime(), clock.utcOffset(clock.wallTime()),
                        describe(HYReportingUtilityRetrieveAppName(configuration())),
                        HYReportingUtilityGenerateServiceNameFromServiceType(serviceType()));
    if (const auto error = files.writeFileAtomically(path, text)) {
        HY_LOG_ERROR(HYReportingSessionCategory, "jsonOutput writeToURL: {}", error->message);
    } else {
        HY_LOG_INFO(HYReportingSessionCategory, "jsonOutput writeToURL: {}", files.located(path));
    }
}

void HYReportingSession::sendSummaryEvent() {
    if (const auto summary = createSummaryEventForSession()) {
        HY_LOG_DEFAULT(HYReportingSessionCategory, "sending summary event for reporter {}",
                       reporterID_);
        sendMessage(*summary, kSummaryCategory, kAudioEventTypeUnknown, true, nullptr);
    }
}

bool HYReportingSession::createMessageIdentifierWithCategory(AudioEventCategory category,
                                                             AudioEventType type,
                                                             const Dictionary& message) {
    if (batch_ == nullptr) {
        return false; // Not started: nothing is recorded, nothing is a repeat.
    }
    const bool redundant = batch_->addUnlessRedundant(category, type, message);
    if (redundant) {
        redundantMessages_.fetch_add(1, std::memory_order_relaxed);
        HY_LOG_DEBUG(HYReportingSessionCategory, "dropping redundant event");
    }
    return redundant;
}

void HYReportingSession::sendMessage(Dictionary message, AudioEventCategory category,
                                     AudioEventType type, bool /*sync*/, const SendReply& reply) {
    HY_LOG_DEBUG(HYReportingSessionCategory, "sending message for session owned by {}",
                 reporterID_);
    auto original = platform::logEnabled(LogLevel::Debug) ? std::optional(message) : std::nullopt;
    Dictionary tagged = HYReportingUtilityAddAudioMessageTag(
        HYReportingUtilityRemoveWhiteSpaceFromKeys(std::move(message)), category, type);
    bool redundant = false;
    {
        const MutexLock lock(batchMutex_);
        redundant = createMessageIdentifierWithCategory(category, type, tagged);
    }
    mark(kMessageMark);
    const bool wasStarted = started();
    if (relayReportingEnabled()) {
        relay({std::move(tagged), std::move(original), category, type, wasStarted, redundant});
    }
    if (reply) {
        reply(std::nullopt);
    }
}

std::uint32_t HYReportingSession::messageIdentifierCount(std::string_view base) const {
    const MutexLock lock(batchMutex_);
    return batch_ != nullptr ? batch_->countFor(base) : 0;
}

std::vector<HYReportingSession::BatchedMessage>
HYReportingSession::nestedAggregatedPayloadData() const {
    const MutexLock lock(batchMutex_);
    std::vector<BatchedMessage> messages;
    if (batch_ != nullptr) {
        for (const MessageBatch::Entry& entry : batch_->entries()) {
            messages.push_back({entry.identifier(), entry.message});
        }
    }
    return messages;
}

} // namespace halyard
