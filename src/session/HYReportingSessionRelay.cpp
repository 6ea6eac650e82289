// The upload side of a session: what runs on its relay queue, and the one-off
// messages of sessions that are not started.

#include <cstdlib>
#include <utility>

#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/Random.h"
#include "platform/TraceMarks.h"
#include "session/HYReportingSession.h"

namespace halyard {
namespace {

using namespace platform; // The many kRelayReporting... names.

constexpr int kClientType = 19;
constexpr const char* kClientVersion = "2.1";
constexpr std::int64_t kSingleMessageSessionID = -1;
constexpr const char* kClientName = "com.kestrel.halyard";
constexpr const char* kHostApplicationKey = "HostApplicationDisplayID";
constexpr std::uint32_t kMessageMark = 0x21044838;
constexpr std::uint32_t kAlarmSpreadSeconds = 60;
constexpr std::chrono::nanoseconds kSingleMessageDelay{1'000'000'000};

// Log lines show categories and types as signed numbers: a summary's category is -1.
std::int32_t shown(std::uint32_t number) {
    return static_cast<std::int32_t>(number);
}

Value clientVersion() {
    return Value(std::strtof(kClientVersion, nullptr));
}

Dictionary makeSessionInfo(std::int64_t reporterID, AudioServiceType type, const Value& token,
                           const Dictionary& configuration) {
    const bool batch = HYReportingUtilityShouldBatchRelayReportingEventsForServiceType(type);
    Dictionary info{{kRelayReportingSessionInfoClientType, kClientType},
                    {kRelayReportingSessionInfoClientVersion, clientVersion()},
                    {kRelayReportingSessionInfoSessionID,
                     HYReportingUtilityExtractSessionIDFromReporterID(reporterID)},
                    {kRelayReportingSessionInfoBatchEvent, batch},
                    {kRelayReportingSessionInfoHierarchyToken, token},
                    {kRelayReportingSessionInfoContainsRealtimeEvents, !batch}};
    info.set(kRelayReportingSessionInfoClientBundleID, configuration[kHostApplicationKey]);
    return info;
}

// Configuration keys may overwrite the two entries: a client's own wish.
Dictionary makeUserInfo(const std::string& serviceName, const Dictionary& configuration) {
    Dictionary info{{kRelayReportingUserInfoClientName, kClientName},
                    {kRelayReportingUserInfoServiceName, serviceName + "_session"}};
    info.merge(configuration);
    return info;
}

void deliverSingleMessage(const Dictionary& message, AudioEventCategory category,
                          AudioEventType type, AudioServiceType serviceType,
                          const HYReportingSession::SendReply& reply) {
    current().traceMarks->mark(kMessageMark, 0, 0, 0, 0);
    HY_LOG_DEBUG(HYReportingSessionCategory, "sending single message");
    const Dictionary sessionInfo{{kRelayReportingSessionInfoClientType, kClientType},
                                 {kRelayReportingSessionInfoClientVersion, clientVersion()},
                                 {kRelayReportingSessionInfoSessionID, kSingleMessageSessionID}};
    const Dictionary userInfo{
        {kRelayReportingUserInfoClientName, kClientName},
        {kRelayReportingUserInfoServiceName,
         Value(HYReportingUtilityGenerateServiceNameFromServiceType(serviceType))}};
    const Dictionary payload = HYReportingUtilityRemoveWhiteSpaceFromKeys(message);
    MaybeError error;
    if (!HYReportingUtilityShouldSendMessage()) {
        HY_LOG_INFO(HYReportingSessionCategory, "event sampled {}", Value(message));
    } else {
        error = current().relayReporting->sendOneMessageWithSessionInfo(
            sessionInfo, userInfo,
            HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(category), type, payload);
        if (error) {
            HY_LOG_ERROR(HYReportingSessionCategory, "sendOneMessageWithSessionInfo {}",
                         error->message);
        } else {
            HY_LOG_DEBUG(HYReportingSessionCategory, "message {} : category {} : type {}",
                         Value(message), shown(category), shown(type));
        }
    }
    if (reply) {
        reply(error);
    }
}

} // namespace

// The service type that counts: an upload session is what its session was when it
// was started, so the opening is handed copies of that. Deliveries and the closing
// are handed nothing and ask for the type of the moment in which they run: a
// session that turns into a test neither delivers nor closes from then on.
struct HYReportingSession::Opening {
    Dictionary configuration;
    std::string serviceName;
    AudioServiceType serviceType;
};

std::shared_ptr<SerialQueue> HYReportingSession::relayReportingQueue() {
    const MutexLock lock(stateMutex_);
    if (relayReportingQueue_ == nullptr) {
        relayReportingQueue_ = current().queues->makeSerialQueue(
            "com.kestrel.halyard.session.relayreporting", QueuePriority::Utility);
    }
    return relayReportingQueue_;
}

void HYReportingSession::startRelayReporting() {
    relayReportingQueue()->async(
        [self = shared_from_this(),
         opening = Opening{configuration(), serviceName(), serviceType()}] {
            self->openRelayReporting(opening);
        });
}

void HYReportingSession::openRelayReporting(const Opening& opening) {
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "entering relayreporting {}", __func__);
    if (!HYReportingUtilityAllowSessionTransactions() ||
        opening.serviceType == kAudioServiceTypeTest) {
        return;
    }
    RelayReportingFramework& framework = *current().relayReporting;
    const Value token = framework.newSecureHierarchyTokenFromParentToken(Value());
    auto upload = framework.initWithSessionInfo(
        makeSessionInfo(reporterID_, opening.serviceType, token, opening.configuration),
        makeUserInfo(opening.serviceName, opening.configuration), List());
    {
        const MutexLock lock(stateMutex_);
        relayReportingAgentToken_ = token;
        relayReportingSession_ = upload;
    }
    upload->startConfigurationWithCompletionHandler(
        [weak = weak_from_this()](std::optional<List> backends) {
            if (const auto self = weak.lock()) {
                self->backendsFound(backends);
            }
        });
    HY_LOG_DEFAULT(HYReportingSessionRelayReportingCategory, "waiting to find backends");
    const std::chrono::seconds limit{std::atoi(HYReportingRelayReportingTimeOut)};
    relayreportingBackendSemaphore_->wait(
        relayReportingQueue(), limit,
        [self = shared_from_this()](bool signalled) { self->finishOpening(signalled); });
}

void HYReportingSession::finishOpening(bool signalled) {
    if (!signalled) {
        HY_LOG_DEFAULT(HYReportingSessionRelayReportingCategory, "timed out waiting for backends");
        dropRelayReportingSession();
    } else if (!relayReportingSessionStarted_.load()) {
        HY_LOG_DEFAULT(HYReportingSessionRelayReportingCategory, "failed to find backend");
        dropRelayReportingSession();
    } else {
        HY_LOG_DEFAULT(HYReportingSessionRelayReportingCategory, "continuing with backends!");
    }
}

void HYReportingSession::backendsFound(const std::optional<List>& backends) {
    if (backends) {
        HY_LOG_DEFAULT(HYReportingSessionRelayReportingCategory, "list of backends {}",
                       Value(*backends));
        relayReportingSessionStarted_.store(true);
    } else {
        HY_LOG_ERROR(HYReportingSessionRelayReportingCategory,
                     "no backends found, this session won't get sent to the server");
        relayReportingSessionStarted_.store(false);
    }
    relayreportingBackendSemaphore_->signal();
}

void HYReportingSession::dropRelayReportingSession() {
    std::shared_ptr<RelayReporting> dropped; // Closes after the lock.
    const MutexLock lock(stateMutex_);
    dropped = std::move(relayReportingSession_);
    relayReportingSession_ = nullptr;
    relayReportingAgentToken_ = Value();
}

bool HYReportingSession::hasRelayReportingSession() const {
    const MutexLock lock(stateMutex_);
    return relayReportingSession_ != nullptr;
}

void HYReportingSession::stopRelayReporting() {
    relayReportingQueue()->async([self = shared_from_this()] { self->closeRelayReporting(); });
}

void HYReportingSession::closeRelayReporting() {
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "entering relayreporting {}", __func__);
    if (!HYReportingUtilityAllowSessionTransactions() || serviceType() == kAudioServiceTypeTest) {
        return;
    }
    if (const auto upload = relayReportingSession()) {
        upload->flushMessages();
    }
    dropRelayReportingSession();
    relayReportingSessionStarted_.store(false);
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "stopping and setting session to nil");
}

void HYReportingSession::relay(Delivery delivery) {
    relayReportingQueue()->async(
        [self = shared_from_this(), delivery = std::move(delivery)]() mutable {
            self->deliver(std::move(delivery));
        });
}

void HYReportingSession::deliver(Delivery delivery) {
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "entering relayreporting {}", __func__);
    if (!delivery.wasStarted) {
        HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory,
                     "session not started, will send as a single message");
        sendSingleMessage(delivery.tagged, delivery.category, delivery.type, serviceType(),
                          configuration(), nullptr);
        return;
    }
    if (!HYReportingUtilityAllowSessionTransactions() || serviceType() == kAudioServiceTypeTest ||
        delivery.redundant || !relayReportingSessionStarted_.load()) {
        return;
    }
    const auto upload = relayReportingSession();
    if (upload == nullptr) {
        return;
    }
    const MaybeError error = upload->sendMessageWithCategory(
        HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(delivery.category),
        delivery.type, std::move(delivery.tagged));
    if (!error && delivery.original) { // A failure stays silent: the framework counts it.
        HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory,
                     "RelayReportingAgent {} : message {} : category {} : type {}",
                     upload->description(), Value(*delivery.original), shown(delivery.category),
                     shown(delivery.type));
    }
}

std::shared_ptr<RelayReporting> HYReportingSession::relayReportingSession() const {
    const MutexLock lock(stateMutex_);
    return relayReportingSession_;
}

void HYReportingSession::sendSingleMessage(const Dictionary& message, AudioEventCategory category,
                                           AudioEventType type, AudioServiceType serviceType,
                                           const Dictionary& /*userInfo*/, SendReply reply) {
    // The delay of an alarm's message is drawn and told, but not applied.
    const std::uint32_t delta =
        serviceType == kAudioServiceTypeAlarms ? current().random->uniform(kAlarmSpreadSeconds) : 0;
    HY_LOG_DEBUG(HYReportingSessionCategory, "sending single message after delta {} for service {}",
                 delta, serviceType);
    current().queues->backgroundQueue().asyncAfter(
        kSingleMessageDelay, [message, category, type, serviceType, reply = std::move(reply)] {
            deliverSingleMessage(message, category, type, serviceType, reply);
        });
}

} // namespace halyard
