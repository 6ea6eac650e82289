#include "session/Upload.h"

#include <chrono>
#include <cstdlib>
#include <string>
#include <utility>

#include "platform/Log.h"
#include "platform/Platform.h"
#include "session/RelayClient.h"
#include "session/SingleMessage.h"

namespace halyard {
namespace {

using namespace platform; // The many kRelayReporting... names.

constexpr const char* kHostApplicationKey = "HostApplicationDisplayID";

Dictionary makeSessionInfo(std::int64_t reporterID, AudioServiceType type, const Value& token,
                           const Dictionary& configuration) {
    const bool batch = HYReportingUtilityShouldBatchRelayReportingEventsForServiceType(type);
    Dictionary info{{kRelayReportingSessionInfoClientType, kRelayClientType},
                    {kRelayReportingSessionInfoClientVersion, relayClientVersion()},
                    {kRelayReportingSessionInfoSessionID,
                     HYReportingUtilityExtractSessionIDFromReporterID(reporterID)},
                    {kRelayReportingSessionInfoBatchEvent, batch},
                    {kRelayReportingSessionInfoHierarchyToken, token},
                    {kRelayReportingSessionInfoContainsRealtimeEvents, !batch}};
    info.set(kRelayReportingSessionInfoClientBundleID, configuration[kHostApplicationKey]);
    return info;
}

// Kept: configuration keys may overwrite the two entries, a client's own wish.
Dictionary makeUserInfo(std::string_view serviceName, const Dictionary& configuration) {
    Dictionary info{{kRelayReportingUserInfoClientName, kRelayClientName},
                    {kRelayReportingUserInfoServiceName, std::string(serviceName) + "_session"}};
    info.merge(configuration);
    return info;
}

} // namespace

// The service type that counts: an upload session is what its session was when it
// was started, so the opening is handed copies of that. Deliveries and the closing
// are handed nothing and ask for the type of the moment in which they run: a
// session that turns into a test neither delivers nor closes from then on.
struct Upload::Opening {
    Dictionary configuration;
    AudioServiceType serviceType;
};

std::shared_ptr<SerialQueue> Upload::relayReportingQueue() {
    const MutexLock lock(mutex_);
    if (relayReportingQueue_ == nullptr) {
        relayReportingQueue_ = current().queues->makeSerialQueue(
            "com.kestrel.halyard.session.relayreporting", QueuePriority::Utility);
    }
    return relayReportingQueue_;
}

void Upload::start(Session session) {
    relayReportingQueue()->async(
        [self = kept(std::move(session)),
         opening = Opening{session_.configuration(), session_.serviceType()}] {
            self->openRelayReporting(self, opening);
        });
}

void Upload::openRelayReporting(const std::shared_ptr<Upload>& self, const Opening& opening) {
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "entering relayreporting {}", __func__);
    if (!HYReportingUtilityAllowSessionTransactions() ||
        opening.serviceType == kAudioServiceTypeTest) {
        return;
    }
    RelayReportingFramework& framework = *current().relayReporting;
    const Value token = framework.newSecureHierarchyTokenFromParentToken(Value());
    auto upload = framework.initWithSessionInfo(
        makeSessionInfo(reporterID_, opening.serviceType, token, opening.configuration),
        makeUserInfo(HYReportingUtilityGenerateServiceNameFromServiceType(opening.serviceType),
                     opening.configuration),
        List());
    {
        const MutexLock lock(mutex_);
        relayReportingAgentToken_ = token;
        relayReportingSession_ = upload;
    }
    upload->startConfigurationWithCompletionHandler(
        [weak = std::weak_ptr(self)](std::optional<List> backends) {
            if (const auto alive = weak.lock()) {
                alive->backendsFound(backends);
            }
        });
    HY_LOG_DEFAULT(HYReportingSessionRelayReportingCategory, "waiting to find backends");
    const std::chrono::seconds limit{std::atoi(HYReportingRelayReportingTimeOut)};
    relayreportingBackendSemaphore_->wait(
        relayReportingQueue(), limit, [self](bool signalled) { self->finishOpening(signalled); });
}

void Upload::finishOpening(bool signalled) {
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

void Upload::backendsFound(const std::optional<List>& backends) {
    if (backends) {
        HY_LOG_DEFAULT(HYReportingSessionRelayReportingCategory, "list of backends {}",
                       Value(*backends));
        relayReportingSessionStarted_.store(true);
    } else {
        HY_LOG_ERROR(HYReportingSessionRelayReportingCategory,
                     "no backends found, this session won't get sent to the server");
        relayReportingSessionStarted_.store(false);
    }
    // Kept: also when nobody waits any more. Those who send look for the upload
    // session as well as for the flag.
    relayreportingBackendSemaphore_->signal();
}

void Upload::dropRelayReportingSession() {
    std::shared_ptr<RelayReporting> dropped; // Closes after the lock.
    const MutexLock lock(mutex_);
    dropped = std::move(relayReportingSession_);
    relayReportingSession_ = nullptr;
    relayReportingAgentToken_ = Value();
}

bool Upload::hasSession() const {
    const MutexLock lock(mutex_);
    return relayReportingSession_ != nullptr;
}

void Upload::stop(Session session, UploadEnding ending) {
    relayReportingQueue()->async(
        [self = kept(std::move(session)), ending] { self->closeRelayReporting(ending); });
}

void Upload::closeRelayReporting(UploadEnding ending) {
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "entering relayreporting {}", __func__);
    const auto upload = relayReportingSession();
    if (upload != nullptr) {
        upload->noteEnding(ending); // Whoever closes it.
    }
    if (!HYReportingUtilityAllowSessionTransactions() ||
        session_.serviceType() == kAudioServiceTypeTest) {
        return;
    }
    if (upload != nullptr) {
        upload->flushMessages();
    }
    dropRelayReportingSession();
    relayReportingSessionStarted_.store(false);
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "stopping and setting session to nil");
}

void Upload::relay(Session session, Delivery delivery) {
    relayReportingQueue()->async(
        [self = kept(std::move(session)), delivery = std::move(delivery)]() mutable {
            self->deliver(std::move(delivery));
        });
}

void Upload::relay(Session session, const Repeats& repeats) {
    relayReportingQueue()->async([self = kept(std::move(session)), repeats] {
        const auto upload = self->relayReportingSession();
        if (upload != nullptr && self->relayReportingSessionStarted_.load()) {
            upload->noteRepeats(repeats);
        }
    });
}

std::optional<MessageCount> Upload::ruleAgainst(const RelayReporting* upload) const {
    if (!HYReportingUtilityAllowSessionTransactions()) {
        return MessageCount::Transactions;
    }
    if (session_.serviceType() == kAudioServiceTypeTest) {
        return MessageCount::Test;
    }
    if (upload == nullptr || !relayReportingSessionStarted_.load()) {
        return MessageCount::NoBackend;
    }
    return std::nullopt;
}

void Upload::deliver(Delivery delivery) {
    HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory, "entering relayreporting {}", __func__);
    if (!delivery.wasStarted) {
        HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory,
                     "session not started, will send as a single message");
        sendSingleMessage(std::move(delivery.tagged), session_.serviceType(), nullptr);
        return;
    }
    if (delivery.redundant) {
        return;
    }
    const auto upload = relayReportingSession();
    if (const auto rule = ruleAgainst(upload.get())) {
        return count(*rule);
    }
    auto& [payload, category, type] = delivery.tagged;
    const MaybeError error = upload->sendMessageWithCategory(
        HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(category), type,
        std::move(payload));
    if (!error && delivery.original) { // Kept: a failure is silent, the framework counts it.
        HY_LOG_DEBUG(HYReportingSessionRelayReportingCategory,
                     "RelayReportingAgent {} : message {} : category {} : type {}",
                     upload->description(), Value(*delivery.original), shownInLog(category),
                     shownInLog(type));
    }
}

std::shared_ptr<RelayReporting> Upload::relayReportingSession() const {
    const MutexLock lock(mutex_);
    return relayReportingSession_;
}

} // namespace halyard
