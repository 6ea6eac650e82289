#include "service/HYReportingServiceDelegate.h"

#include <algorithm>
#include <chrono>
#include <fmt/format.h>
#include <utility>

#include "platform/Clock.h"
#include "platform/Device.h"
#include "platform/EventServices.h"
#include "platform/HYReportingUtilityDevice.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/QueueCheck.h"
#include "service/HYReportingClientServerInstance.h"
#include "service/MessageFanOut.h"
#include "service/RequestDispatch.h"

namespace halyard {
namespace {

constexpr std::string_view kUptimeEvent = "com.kestrel.halyard.hyreportingclientuptime";

std::vector<std::shared_ptr<HYReportingSession>>
sessionsOf(const HYReportingClientServerInstance& client) {
    std::vector<std::shared_ptr<HYReportingSession>> sessions;
    for (const auto& [reporterID, session] : client.clientReportingSessionMap()) {
        sessions.push_back(session);
    }
    return sessions;
}

// The time that a client was connected; -1 when its start was never recorded.
double uptimeSeconds(std::int32_t pid, const std::optional<platform::WallTime>& startDate,
                     const std::string& nameForLog) {
    if (!startDate) {
        HY_LOG_DEFAULT(HYReportingServiceDelegateCategory,
                       "clientStartDate is nil. clientpid={} clientprocessname={}", pid,
                       nameForLog);
        return -1;
    }
    const std::chrono::duration<double> elapsed =
        platform::current().clock->wallTime() - *startDate;
    // Kept: readers of the log search for "past", though the start lies ahead.
    if (elapsed.count() < 0) {
        HY_LOG_DEFAULT(HYReportingServiceDelegateCategory,
                       "clientStartDate is in the past. clientpid={} clientprocessname={}", pid,
                       nameForLog);
    }
    return std::abs(elapsed.count());
}

} // namespace

std::shared_ptr<HYReportingServiceDelegate> HYReportingServiceDelegate::make() {
    std::shared_ptr<HYReportingServiceDelegate> delegate(new HYReportingServiceDelegate);
    delegate->listenForFeatureStateChanges();
    delegate->driverUtility_ = std::make_unique<HYReportingDriverUtility>();
    return delegate;
}

HYReportingServiceDelegate::HYReportingServiceDelegate()
    : serviceQueue_(platform::current().queues->makeSerialQueue(
          "com.kestrel.halyard.reporting.server", platform::QueuePriority::UserInteractive)),
      defaults_(HYReportingDefaults()), features_(makeFeatureRecords()) {}

void HYReportingServiceDelegate::listenForFeatureStateChanges() {
    HY_LOG_INFO(HYReportingServiceDelegateCategory, "listening for features {}",
                describeFeatures(features_));
    for (FeatureRecord& feature : features_) {
        const auto registration = platform::current().notifications->registerFor(
            feature.notification, serviceQueue_, [weak = weak_from_this()](int token) {
                if (const auto self = weak.lock()) {
                    self->featureChanged(token);
                }
            });
        feature.notifyToken = registration.token;
        HY_LOG_DEFAULT(HYReportingServiceDelegateCategory, "notify setup result {} token {}",
                       static_cast<std::int32_t>(registration.status), registration.token);
    }
}

void HYReportingServiceDelegate::featureChanged(int token) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    HY_LOG_INFO(HYReportingServiceDelegateCategory, "feature {} changes", token);
    const auto state = getFeaturesState();
    HY_LOG_INFO(HYReportingServiceDelegateCategory, "defaults {}", state ? Value(*state) : Value());
    if (!state) {
        return; // Nothing is set any more: there is no state to tell.
    }
    for (const Client& client : getAllClients()) {
        for (const Session& session : sessionsOf(*client)) {
            session->sendMessage(*state, kAudioEventCategorySetup, kAudioEventTypeSetup, nullptr);
        }
    }
}

std::optional<Dictionary> HYReportingServiceDelegate::getFeaturesState() const {
    return readFeaturesState(features_);
}

bool HYReportingServiceDelegate::shouldAcceptNewConnection(
    const std::shared_ptr<platform::Connection>& connection) {
    const std::int32_t pid = connection->processIdentifier();
    HY_LOG_DEFAULT(HYReportingServiceDelegateCategory, "newConnection: {}",
                   connection->description());
    Client client;
    {
        const MutexLock lock(monitor_);
        client = HYReportingClientServerInstance::initWithPID(pid, weak_from_this(), serviceQueue_,
                                                              connection->budget());
    }
    // The dispatcher is the client object's owner until the connection goes.
    connection->setExportedObject(
        std::make_shared<RequestDispatch>(client, weak_from_this(), serviceQueue_));
    serviceQueue_->async([self = shared_from_this(), client] {
        self->addClient(client);
        client->setIdentity(platform::current().clock->wallTime(),
                            HYReportingUtilityProcessNameForPID(client->processIdentifier()));
    });
    const std::weak_ptr<HYReportingClientServerInstance> weak = client;
    connection->setInterruptionHandler([weak] {
        HY_LOG_DEFAULT(HYReportingServiceDelegateCategory,
                       "interruptionHandler: connection exited");
        if (const auto interrupted = weak.lock()) {
            interrupted->handleConnectionError();
        }
    });
    connection->setInvalidationHandler([weak, pid] {
        const auto invalidated = weak.lock();
        if (invalidated != nullptr) {
            invalidated->handleConnectionError();
        }
        reportUptime(pid, invalidated.get());
    });
    connection->resume();
    return true;
}

void HYReportingServiceDelegate::reportUptime(std::int32_t pid,
                                              const HYReportingClientServerInstance* client) {
    const auto name = client != nullptr ? client->clientProcessName() : std::nullopt;
    const std::string nameForLog = name.value_or("unknown");
    const double seconds = uptimeSeconds(
        pid, client != nullptr ? client->clientStartDate() : std::nullopt, nameForLog);
    HY_LOG_DEFAULT(HYReportingServiceDelegateCategory,
                   "invalidationHandler: connection exited process={} uptime_sec={}", nameForLog,
                   static_cast<std::int64_t>(seconds));
    if (!name) {
        HY_LOG_DEFAULT(HYReportingServiceDelegateCategory, "clientProcessName is nil. clientpid={}",
                       pid);
        return;
    }
    platform::AnalyticsService& analytics = *platform::current().analytics;
    if (analytics.isEventUsed(kUptimeEvent)) {
        analytics.sendEventLazily(kUptimeEvent, [processName = *name, seconds] {
            return Dictionary{{"processName", processName}, {"seconds", seconds}};
        });
    }
}

std::vector<HYReportingServiceDelegate::Client> HYReportingServiceDelegate::getAllClients() const {
    const MutexLock lock(monitor_);
    return clients_;
}

void HYReportingServiceDelegate::sessionRetired(const HYReportingSession& session) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    repeatsOfRetiredSessions_ += session.redundantMessages();
}

void HYReportingServiceDelegate::addClient(const Client& client) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    const MutexLock lock(monitor_);
    clients_.push_back(client);
}

void HYReportingServiceDelegate::removeClient(const HYReportingClientServerInstance& client) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    const MutexLock lock(monitor_);
    std::erase_if(clients_, [&](const Client& each) { return each.get() == &client; });
}

HYReportingServiceDelegate::Session
HYReportingServiceDelegate::findReportingSessionForID(std::int64_t reporterID) const {
    SessionLookups lookups;
    Session session = findReportingSessionForID(reporterID, lookups);
    tell(lookups);
    return session;
}

HYReportingServiceDelegate::Session
HYReportingServiceDelegate::findReportingSessionForID(std::int64_t reporterID,
                                                      SessionLookups& lookups) const {
    if (reporterID == 0 || !reportingEnabled_) {
        return nullptr;
    }
    const MutexLock lock(monitor_);
    for (const Client& client : clients_) {
        if (auto session = client->ownSession(reporterID)) {
            lookups.addFound(reporterID, client->processIdentifier());
            return session;
        }
    }
    lookups.addFailed(reporterID);
    return nullptr;
}

// A line for each, or one for many.
void HYReportingServiceDelegate::tell(const SessionLookups& lookups) const {
    if (lookups.foundCount > kNamedInLog) {
        HY_LOG_INFO(HYReportingServiceDelegateCategory,
                    "found reporting session {} for client {} and {} more",
                    lookups.found.front().reporterID, lookups.found.front().pid,
                    lookups.foundCount - 1);
    } else {
        for (const auto& [reporterID, pid] : lookups.found) {
            HY_LOG_INFO(HYReportingServiceDelegateCategory,
                        "found reporting session {} for client {}", reporterID, pid);
        }
    }
    if (lookups.failedCount > kNamedInLog) {
        HY_LOG_ERROR(HYReportingServiceDelegateCategory,
                     "failed to find reporting session {} and {} more",
                     fmt::join(lookups.failed, ", "), lookups.failedCount - lookups.failed.size());
    } else {
        for (const std::int64_t reporterID : lookups.failed) {
            HY_LOG_ERROR(HYReportingServiceDelegateCategory, "failed to find reporting session {}",
                         reporterID);
        }
    }
}

void HYReportingServiceDelegate::setActiveSessionCount(std::int64_t count) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    activeSessionCount_.store(count);
    const std::int64_t limit = platform::current().sessionRules.uploadLimit();
    if (!std::exchange(withholdsUploads_, count > limit) && withholdsUploads_) {
        HY_LOG_DEFAULT(HYReportingServiceDelegateCategory,
                       "{} sessions count as active: those started beyond {} are not uploaded",
                       count, limit);
    }
}

std::vector<HYReportingServiceDelegate::Session>
HYReportingServiceDelegate::getAllActiveReportingSessions() const {
    std::vector<Session> active;
    std::size_t clients = 0;
    std::size_t sessionsLeftOut = 0;
    for (const Client& client : getAllClients()) {
        std::vector<Session> named;
        std::size_t sessions = 0;
        client->forEachSession([&](std::int64_t /*reporterID*/, const Session& session) {
            if (++sessions <= kNamedInLog) {
                named.push_back(session);
            }
            if (session->started()) {
                active.push_back(session);
            }
        });
        if (++clients > kNamedInLog) {
            sessionsLeftOut += sessions;
            continue;
        }
        const std::int32_t pid = client->processIdentifier();
        HY_LOG_KEPT(clientLines_[clients - 1], LogLevel::Default,
                    HYReportingServiceDelegateCategory, tellSessions(pid, named, sessions),
                    "sessions for client {} : {}", pid, describeSessions(named, sessions));
    }
    if (clients > kNamedInLog) {
        HY_LOG_DEFAULT(HYReportingServiceDelegateCategory, "sessions for {} more clients : {}",
                       clients - kNamedInLog, sessionsLeftOut);
    }
    return active;
}

platform::DriverSnapshotRef HYReportingServiceDelegate::getSnapShot() {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    return driverUtility_->getSnapShot();
}

void HYReportingServiceDelegate::sendDriverLogsForSession(const Session& session) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    driverUtility_->sendDriverLogsForSession(session);
}

void HYReportingServiceDelegate::handleEventForIBX(const Dictionary& message,
                                                   AudioEventCategory category, AudioEventType type,
                                                   const Session& session,
                                                   const std::optional<std::string>& processName) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    sinks_.captureIssue({message, category, type}, session, processName);
}

bool HYReportingServiceDelegate::isStopWaiting() const {
    const auto clients = getAllClients();
    return std::any_of(clients.begin(), clients.end(), [](const Client& client) {
        const auto sessions = sessionsOf(*client);
        return std::any_of(sessions.begin(), sessions.end(), [](const Session& session) {
            return session->stopWaitsSince().has_value();
        });
    });
}

Dictionary HYReportingServiceDelegate::status() const {
    std::int64_t sessions = 0;
    std::int64_t started = 0;
    std::int64_t notUploaded = 0;
    std::uint64_t repeats = repeatsOfRetiredSessions_.load();
    List waiting;
    const auto now = platform::current().clock->steadyTime();
    const auto clients = getAllClients();
    for (const Client& client : clients) {
        for (const Session& session : sessionsOf(*client)) {
            ++sessions;
            started += session->started() ? 1 : 0;
            notUploaded += session->started() && !session->relayReportingEnabled() ? 1 : 0;
            repeats += session->redundantMessages();
            if (const auto since = session->stopWaitsSince()) {
                waiting.append(
                    Dictionary{{"pid", client->processIdentifier()},
                               {"session", session->reporterID()},
                               {"seconds", std::chrono::duration<double>(now - *since).count()}});
            }
        }
    }
    return Dictionary{{"connections", clients.size()},
                      {"sessions", sessions},
                      {"sessions_started", started},
                      {"active_session_count", activeSessionCount_.load()},
                      {"sessions_not_uploaded", notUploaded},
                      {"upload_limit", platform::current().sessionRules.uploadLimit()},
                      {"stops_waiting", waiting},
                      {"repeats_dropped", repeats}};
}

} // namespace halyard
