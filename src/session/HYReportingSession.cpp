#include "session/HYReportingSession.h"

#include <fmt/format.h>
#include <utility>

#include "common/ValueSize.h"
#include "platform/Clock.h"
#include "platform/Files.h"
#include "platform/HYReportingUtilityDevice.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/TraceMarks.h"
#include "session/SummaryFile.h"
#include "sinks/HYReportingTallyhubBridge.h"

namespace halyard {
namespace {

using platform::MessageCount;

constexpr std::uint32_t kCreatedMark = 0x21044828;
constexpr std::uint32_t kStartMark = 0x2104482C;
constexpr std::uint32_t kStopMark = 0x21044830;
constexpr std::uint32_t kDestroyedMark = 0x21044834;
constexpr std::uint32_t kMessageMark = 0x21044838;

constexpr std::uint32_t kLogsMode = 0777;
constexpr AudioEventCategory kSummaryCategory = 0xFFFFFFFF;
// What a session takes without its configuration and its messages.
constexpr std::size_t kSessionBytes = 1536;
// Of an application's name, where lines of the log describe a session.
constexpr std::size_t kLongestName = 256;
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
    : reporterID_(reporterID), processIdentifiers_(std::move(processIdentifiers)),
      upload_(reporterID, *this), trace_(std::make_shared<TraceControl>(*this)) {
    HY_LOG_INFO(HYReportingSessionCategory, "created reporting session for ID: {}", reporterID_);
    mark(kCreatedMark);
}

std::optional<platform::ClientBound> HYReportingSession::chargeTo(platform::ClientBudgetPtr owner) {
    if (!owner->addSession()) {
        return platform::ClientBound::Sessions;
    }
    owner_ = std::move(owner);
    hasPlace_ = true;
    ownBytes_ = platform::Allotment(owner_);
    {
        const MutexLock lock(mutex_);
        configurationBytes_ = platform::Allotment(owner_);
    }
    return ownBytes_.resize(kSessionBytes) ? std::nullopt
                                           : std::optional(platform::ClientBound::Memory);
}

HYReportingSession::~HYReportingSession() {
    if (hasPlace_) {
        owner_->removeSession();
    }
    mark(kDestroyedMark);
    HY_LOG_INFO(HYReportingSessionCategory, "deallocing this session {}", reporterID_);
}

Value HYReportingSession::sharedDescription() const {
    const MutexLock lock(mutex_);
    const AudioServiceType type = serviceType();
    const bool isStarted = started();
    const Value name = HYReportingUtilityRetrieveAppName(configuration_);
    // Only of strings is it certain that equal ones look the same.
    if (described_.text.isNone() || described_.type != type || described_.started != isStarted ||
        !name.isString() || !(described_.name == name)) {
        described_ = {type, isStarted, name, describedBy(type, isStarted, name)};
    }
    return described_.text;
}

std::string HYReportingSession::describedBy(AudioServiceType type, bool isStarted,
                                            const Value& name) const {
    return fmt::format(
        "reporterID={},serviceName={},ownerPid={},HostApplicationDisplayID={},started={}",
        reporterID_, HYReportingUtilityGenerateServiceNameFromServiceType(type),
        processIdentifiers_.empty() ? 0 : processIdentifiers_.front(),
        shortened(describe(name), kLongestName), isStarted ? 1 : 0);
}

std::string HYReportingSession::serviceName() const {
    return std::string(HYReportingUtilityGenerateServiceNameFromServiceType(serviceType()));
}

void HYReportingSession::setServiceType(AudioServiceType type) {
    serviceType_.store(type);
    HY_LOG_INFO(HYReportingSessionCategory, "setting service type {}",
                HYReportingUtilityGenerateServiceNameFromServiceType(type));
}

Dictionary HYReportingSession::configuration() const {
    const MutexLock lock(mutex_);
    return configuration_;
}

void HYReportingSession::setConfiguration(const Dictionary* configuration) {
    if (configuration != nullptr) {
        const MutexLock lock(mutex_);
        configuration_.merge(*configuration);
    }
}

std::optional<platform::ClientBound>
HYReportingSession::updateConfigurationWithContentsOfConfiguration(const Dictionary& update) {
    const MutexLock lock(mutex_);
    Dictionary merged = configuration_;
    if (const Value* application = update.find(kClientApplicationKey)) {
        merged.set(kHostApplicationKey, *application);
    }
    merged.merge(update); // Kept: the client's own key stays as well.
    const std::size_t bytes = bytesOf(merged);
    if (owner_ != nullptr && bytes > owner_->limits().configuration) {
        return platform::ClientBound::Configuration;
    }
    if (!configurationBytes_.resize(bytes)) {
        return platform::ClientBound::Memory;
    }
    configuration_ = std::move(merged);
    return std::nullopt;
}

HYReportingSession::TransactionCompleteBlock
HYReportingSession::exchangeTransactionCompleteBlock(TransactionCompleteBlock block) {
    const MutexLock lock(mutex_);
    return std::exchange(transactionCompleteBlock_, std::move(block));
}

platform::DriverSnapshotRef HYReportingSession::driverSnapShot() const {
    const MutexLock lock(mutex_);
    return driverSnapShot_;
}

void HYReportingSession::setDriverSnapShot(platform::DriverSnapshotRef snapshot) {
    const MutexLock lock(mutex_);
    driverSnapShot_.swap(snapshot); // The old one goes once the lock is released.
}

void HYReportingSession::start() {
    onServiceQueue_.check();
    HY_LOG_DEBUG(HYReportingSessionCategory, "starting session owned by {}", reporterID_);
    if (started()) {
        HY_LOG_INFO(HYReportingSessionCategory, "{} is already started", reporterID_);
        return;
    }
    batch_.start(
        {.keepsMessages = HYReportingUtilityIsInternalBuild(),
         .minimumPlaytime = HYReportingUtilityVolumeMinimumPlayingTime(serviceType()),
         .summaryBytes = (owner_ != nullptr ? owner_->limits() : platform::ClientLimits{}).summary,
         .owner = owner_});
    mark(kStartMark);
    if (relayReportingEnabled()) {
        upload_.start(shared_from_this());
    }
    trace_->start();
}

void HYReportingSession::stop(platform::UploadEnding ending) {
    onServiceQueue_.check();
    HY_LOG_DEBUG(HYReportingSessionCategory, "ending session {}", reporterID_);
    if (!started()) {
        return;
    }
    // Kept: the second line tells the stop of a session that ran.
    HY_LOG_DEBUG(HYReportingSessionCategory, "ending session {}", reporterID_);
    mark(kStopMark);
    sendVolumeEvents();
    writeSummaryJson();
    sendSummaryEvent();
    relayRepeats();
    if (relayReportingEnabled()) {
        upload_.stop(shared_from_this(), ending);
    }
    trace_->stop();
    batch_.stop();
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
    const auto text = batch_.summaryFileText();
    if (!text) {
        return;
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
    const auto added = files.addFile(path, *text);
    if (const auto* const error = std::get_if<Error>(&added)) {
        HY_LOG_ERROR(HYReportingSessionCategory, "jsonOutput writeToURL: {}", error->message);
    } else {
        HY_LOG_INFO(HYReportingSessionCategory, "jsonOutput writeToURL: {}",
                    files.located(std::get<std::string>(added)));
    }
}

void HYReportingSession::sendSummaryEvent() {
    if (const auto summary = createSummaryEventForSession()) {
        HY_LOG_DEFAULT(HYReportingSessionCategory, "sending summary event for reporter {}",
                       reporterID_);
        sendMessage(*summary, kSummaryCategory, kAudioEventTypeUnknown, true, nullptr);
    }
}

void HYReportingSession::relayRepeats() {
    if (relayReportingEnabled()) {
        for (const platform::Repeats& repeats : batch_.takeAllRepeats()) {
            upload_.relay(shared_from_this(), repeats);
        }
    }
}

void HYReportingSession::offer(Dictionary message, AudioEventCategory category,
                               AudioEventType type) {
    platform::count(MessageCount::Offered);
    take(std::move(message), category, type);
}

void HYReportingSession::sendMessage(Dictionary message, AudioEventCategory category,
                                     AudioEventType type, bool /*sync*/, const SendReply& reply) {
    platform::count(MessageCount::Own);
    take(std::move(message), category, type);
    if (reply) {
        reply(std::nullopt);
    }
}

void HYReportingSession::take(Dictionary message, AudioEventCategory category,
                              AudioEventType type) {
    onServiceQueue_.check();
    HY_LOG_DEBUG(HYReportingSessionCategory, "sending message for session owned by {}",
                 reporterID_);
    auto original = platform::logEnabled(LogLevel::Debug) ? std::optional(message) : std::nullopt;
    Message tagged{
        HYReportingUtilityAddAudioMessageTag(
            HYReportingUtilityRemoveWhiteSpaceFromKeys(std::move(message)), category, type),
        category, type};
    const auto [redundant, repeats] =
        batch_.createMessageIdentifierWithCategory(category, type, tagged.payload);
    mark(kMessageMark);
    const bool wasStarted = started();
    if (redundant) {
        platform::count(MessageCount::Repeats);
    } else if (!relayReportingEnabled()) {
        platform::count(MessageCount::Limit);
    }
    if (relayReportingEnabled()) {
        if (repeats) {
            upload_.relay(shared_from_this(), *repeats);
        }
        upload_.relay(shared_from_this(),
                      {std::move(tagged), std::move(original), wasStarted, redundant});
    }
}

void HYReportingSession::sendSingleMessage(Dictionary message, AudioEventCategory category,
                                           AudioEventType type, AudioServiceType serviceType,
                                           const Dictionary& /*userInfo*/, SendReply reply) {
    halyard::sendSingleMessage({std::move(message), category, type}, serviceType, std::move(reply));
}

} // namespace halyard
