#include "service/HYReportingClientServerInstance.h"

#include <algorithm>
#include <utility>

#include "platform/Device.h"
#include "platform/HYReportingUtilityDevice.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/QueueCheck.h"
#include "platform/TraceMarks.h"
#include "service/MessageFanOut.h"

namespace halyard {
namespace {

constexpr std::uint32_t kCreateMark = 0x21044814;
constexpr std::uint32_t kStartMark = 0x21044818;
constexpr std::uint32_t kStopMark = 0x2104481C;
constexpr std::uint32_t kDestroyMark = 0x21044820;

// The sixth and later concurrent sessions are not uploaded, unless an operator says so.
bool mayUpload(std::int64_t activeSessions) {
    return activeSessions <= platform::current().sessionRules.uploadLimit();
}

// Kept: only a stop request uncounts. A session that is destroyed, lost or replaced while
// it runs stays counted, unless an operator says otherwise.
void uncountLost(HYReportingServiceDelegateProtocol& delegate) {
    if (platform::current().sessionRules.recount()) {
        delegate.setActiveSessionCount(delegate.activeSessionCount() - 1);
    }
}

// Of a client that has gone: how many are stopped before others have their turn.
constexpr std::size_t kLossesPerStep = 32;

void mark(std::uint32_t code) {
    platform::current().traceMarks->mark(code, 0, 0, 0, 0);
}

void answer(const ErrorReply& reply, const MaybeError& error) {
    if (reply) {
        reply(error);
    }
}

void logActiveSessions(const HYReportingServiceDelegateProtocol& delegate) {
    // Asking for the sessions writes log lines of its own, so it is done even
    // where nobody reads this one.
    const auto sessions = delegate.getAllActiveReportingSessions();
    HY_LOG_DEFAULT(HYReportingClientCategory, "{} active reporting session(s) {}",
                   delegate.activeSessionCount(), describeSessions(sessions));
}

} // namespace

std::shared_ptr<HYReportingClientServerInstance>
HYReportingClientServerInstance::initWithPID(std::int32_t pid, std::weak_ptr<Delegate> delegate,
                                             std::shared_ptr<platform::SerialQueue> serviceQueue,
                                             platform::ClientBudgetPtr budget) {
    return std::shared_ptr<HYReportingClientServerInstance>(new HYReportingClientServerInstance(
        pid, std::move(delegate), std::move(serviceQueue), std::move(budget)));
}

HYReportingClientServerInstance::HYReportingClientServerInstance(
    std::int32_t pid, std::weak_ptr<Delegate> delegate,
    std::shared_ptr<platform::SerialQueue> serviceQueue, platform::ClientBudgetPtr budget)
    : pid_(pid), delegate_(std::move(delegate)), serviceQueue_(std::move(serviceQueue)),
      budget_(std::move(budget)) {
    HY_LOG_DEFAULT(HYReportingClientCategory, "new client with pid {}", pid_);
}

HYReportingClientServerInstance::~HYReportingClientServerInstance() {
    HY_LOG_DEBUG(HYReportingClientCategory, "dealloc {} from the server client list", pid_);
}

template <class Body> platform::Task HYReportingClientServerInstance::taskOf(Body body) {
    return [weak = weak_from_this(), body = std::move(body)]() mutable {
        const auto self = weak.lock();
        const auto delegate = self != nullptr ? self->delegate_.lock() : nullptr;
        if (delegate != nullptr) {
            const platform::BudgetScope pays(self->budget_);
            body(*self, *delegate);
        }
    };
}

template <class Body> void HYReportingClientServerInstance::onServiceQueue(Body body) {
    serviceQueue_->async(taskOf(std::move(body)));
}

template <class Body> void HYReportingClientServerInstance::continueOnServiceQueue(Body body) {
    serviceQueue_->continueWith(taskOf(std::move(body)));
}

template <class Body>
void HYReportingClientServerInstance::onServiceQueueFor(std::int64_t reporterID, Body body) {
    onServiceQueue([reporterID, body = std::move(body)](auto& self, Delegate& delegate) mutable {
        const auto session = self.ownSession(reporterID);
        if (session != nullptr && session->mayTrace()) {
            self.continueOnServiceQueue(std::move(body));
        } else {
            body(self, delegate);
        }
    });
}

void HYReportingClientServerInstance::createReportingSession(std::int64_t reporterID,
                                                             BoolReply reply) {
    onServiceQueueFor(reporterID,
                      [reporterID, reply = std::move(reply)](auto& self, Delegate& delegate) {
                          const MaybeError error = self.create(delegate, reporterID);
                          reply(error, !error);
                      });
}

MaybeError HYReportingClientServerInstance::create(Delegate& delegate, std::int64_t reporterID) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    HY_LOG_DEBUG(HYReportingClientCategory, "creating session for reporter {}", reporterID);
    mark(kCreateMark);
    const auto session = HYReportingSession::initWithID(reporterID, {pid_});
    if (const auto bound = session->chargeTo(budget_)) {
        return platform::boundReached(*bound);
    }
    auto replaced = session;
    {
        const MutexLock lock(mapMutex_);
        std::swap(sessions_[reporterID], replaced);
    }
    if (replaced != nullptr) {
        if (replaced->started()) {
            uncountLost(delegate);
        }
        retire(delegate, *replaced);
    }
    session->setRelayReportingEnabled(mayUpload(delegate.activeSessionCount()));
    HY_LOG_DEFAULT(HYReportingClientCategory, "session created for reporter {}", reporterID);
    return std::nullopt;
}

void HYReportingClientServerInstance::setServiceType(AudioServiceType type, std::int64_t reporterID,
                                                     BoolReply reply) {
    onServiceQueue([type, reporterID, reply = std::move(reply)](auto& self, Delegate& delegate) {
        HY_LOG_DEBUG(HYReportingClientCategory, "setting service type {} for reporter {}", type,
                     reporterID);
        if (const auto session = self.findReportingSessionForID(delegate, reporterID, false)) {
            session->setServiceType(type);
            // Kept: readers of the log search for the two blanks.
            HY_LOG_DEFAULT(HYReportingClientCategory, "service type {} set for reporter  {}", type,
                           reporterID);
        }
        reply(std::nullopt, true);
    });
}

void HYReportingClientServerInstance::getServiceNameForReporterID(std::int64_t reporterID,
                                                                  ServiceTypeReply reply) {
    onServiceQueue([reporterID, reply = std::move(reply)](auto& self, Delegate& delegate) {
        // Kept: readers of the log search for these letters, and below for the blanks.
        HY_LOG_DEBUG(HYReportingClientCategory, "fetching seviceType");
        if (reporterID == 0) {
            reply(std::nullopt, kAudioServiceTypeUnknown);
            return;
        }
        const auto session = self.findReportingSessionForID(delegate, reporterID, true);
        const AudioServiceType type =
            session != nullptr ? session->serviceType() : kAudioServiceTypeUnknown;
        reply(std::nullopt, type);
        HY_LOG_DEFAULT(HYReportingClientCategory, "returning service type {} for reporter  {}",
                       type, reporterID);
    });
}

void HYReportingClientServerInstance::setConfiguration(Dictionary configuration,
                                                       std::int64_t reporterID, BoolReply reply) {
    onServiceQueue([configuration = std::move(configuration), reporterID,
                    reply = std::move(reply)](auto& self, Delegate& delegate) {
        HY_LOG_DEBUG(HYReportingClientCategory, "setting configuration");
        MaybeError error;
        if (const auto session = self.findReportingSessionForID(delegate, reporterID, false)) {
            const auto bound =
                session->updateConfigurationWithContentsOfConfiguration(configuration);
            error = bound ? MaybeError(platform::boundReached(*bound)) : std::nullopt;
        }
        reply(error, !error);
    });
}

void HYReportingClientServerInstance::startReportingSessionForID(std::int64_t reporterID,
                                                                 BoolReply reply) {
    onServiceQueueFor(reporterID,
                      [reporterID, reply = std::move(reply)](auto& self, Delegate& delegate) {
                          self.start(delegate, reporterID, reply);
                      });
}

void HYReportingClientServerInstance::start(Delegate& delegate, std::int64_t reporterID,
                                            const BoolReply& reply) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    HY_LOG_DEBUG(HYReportingClientCategory, "starting session for reporter {}", reporterID);
    mark(kStartMark);
    const auto session = findReportingSessionForID(delegate, reporterID, false);
    if (session == nullptr || session->started()) {
        reply(std::nullopt, true);
        return;
    }
    delegate.setActiveSessionCount(delegate.activeSessionCount() + 1);
    session->setRelayReportingEnabled(mayUpload(delegate.activeSessionCount()));
    session->start();
    session->setDriverSnapShot(delegate.getSnapShot());
    if (const auto earlier = session->exchangeTransactionCompleteBlock(reply)) {
        earlier(std::nullopt, true);
    }
    if (const auto features = delegate.getFeaturesState()) {
        session->sendMessage(*features, kAudioEventCategorySetup, kAudioEventTypeSetup, nullptr);
    }
    if (platform::current().featureFlags->isEnabled("AudioAnalytics", "Tracing") &&
        session->serviceType() == kAudioServiceTypeTest) {
        reply(std::nullopt, true);
    }
    logActiveSessions(delegate);
}

void HYReportingClientServerInstance::sendMessage(
    Dictionary message, AudioEventCategory category, std::uint16_t type,
    std::optional<std::vector<std::int64_t>> reporterIDs, ErrorReply reply) {
    // Only issue capture looks at the sender's name, and it costs a file.
    auto processName = HYReportingUtilityIsInternalBuild()
                           ? HYReportingUtilityProcessNameForPID(pid_)
                           : std::nullopt;
    MessageFanOut fanOut({std::move(message), category, type}, std::move(reporterIDs),
                         std::move(processName));
    onServiceQueue([fanOut = std::move(fanOut),
                    reply = std::move(reply)](auto& self, Delegate& delegate) mutable {
        if (self.send(delegate, fanOut)) {
            answer(reply, fanOut.error());
        } else {
            self.sendRest(std::make_shared<MessageFanOut>(std::move(fanOut)), std::move(reply));
        }
    });
}

bool HYReportingClientServerInstance::send(Delegate& delegate, MessageFanOut& fanOut) const {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    return fanOut.advance(delegate,
                          [this](std::int64_t reporterID) { return ownSession(reporterID); });
}

void HYReportingClientServerInstance::sendRest(std::shared_ptr<MessageFanOut> fanOut,
                                               ErrorReply reply) {
    continueOnServiceQueue(
        [fanOut = std::move(fanOut), reply = std::move(reply)](auto& self, Delegate& delegate) {
            if (self.send(delegate, *fanOut)) {
                answer(reply, fanOut->error());
            } else {
                self.sendRest(fanOut, reply);
            }
        });
}

void HYReportingClientServerInstance::stopReportingSessionForID(std::int64_t reporterID,
                                                                BoolReply reply) {
    onServiceQueueFor(reporterID,
                      [reporterID, reply = std::move(reply)](auto& self, Delegate& delegate) {
                          self.stop(delegate, reporterID);
                          reply(std::nullopt, true);
                      });
}

void HYReportingClientServerInstance::stop(Delegate& delegate, std::int64_t reporterID) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    HY_LOG_DEBUG(HYReportingClientCategory, "stopping session for reporter {}", reporterID);
    mark(kStopMark);
    if (reporterID == 0) {
        return;
    }
    const auto session = findReportingSessionForID(delegate, reporterID, false);
    if (session != nullptr && session->started()) {
        delegate.sendDriverLogsForSession(session);
        session->setDriverSnapShot(delegate.getSnapShot());
        session->stop();
        delegate.setActiveSessionCount(delegate.activeSessionCount() - 1);
        if (const auto held = session->exchangeTransactionCompleteBlock(nullptr)) {
            held(std::nullopt, true);
        }
        logActiveSessions(delegate);
    }
    HY_LOG_DEFAULT(HYReportingClientCategory, "stopping {}", reporterID);
}

void HYReportingClientServerInstance::destroyReportingSession(std::int64_t reporterID,
                                                              BoolReply reply) {
    onServiceQueueFor(reporterID,
                      [reporterID, reply = std::move(reply)](auto& self, Delegate& delegate) {
                          self.destroy(delegate, reporterID);
                          reply(std::nullopt, true);
                      });
}

void HYReportingClientServerInstance::destroy(Delegate& delegate, std::int64_t reporterID) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    HY_LOG_DEBUG(HYReportingClientCategory, "destroying session for reporter {}", reporterID);
    mark(kDestroyMark);
    if (reporterID == 0) {
        return;
    }
    if (const auto session = ownSession(reporterID)) {
        if (session->started()) {
            session->stop();
            uncountLost(delegate);
        }
        retire(delegate, *session);
        const MutexLock lock(mapMutex_);
        sessions_.erase(reporterID);
    }
    HY_LOG_DEFAULT(HYReportingClientCategory, "destroying {}", reporterID);
}

// A reply that is let go answers that nobody will. Left to the session, that
// would happen wherever its last holder lets go of it, which may be its upload,
// on another thread and any time later.
void HYReportingClientServerInstance::retire(Delegate& delegate, HYReportingSession& session) {
    session.exchangeTransactionCompleteBlock(nullptr);
    session.relayRepeats(); // Of one that was replaced while it ran.
    delegate.sessionRetired(session);
}

void HYReportingClientServerInstance::reporterID(std::int64_t reporterID, DictionaryReply valid) {
    onServiceQueue([reporterID, reply = std::move(valid)](auto& self, Delegate& delegate) {
        HY_LOG_DEBUG(HYReportingClientCategory, "validating reporter {}", reporterID);
        Dictionary result{{"reporterID", 0}, {"serviceType", kAudioServiceTypeUnknown}};
        if (const auto session = self.findReportingSessionForID(delegate, reporterID, true)) {
            result.set("reporterID", reporterID);
            result.set("serviceType", session->serviceType());
        }
        HY_LOG_DEFAULT(HYReportingClientCategory, "validating reporter {}", reporterID);
        reply(std::nullopt, result);
    });
}

void HYReportingClientServerInstance::getAllReporters(ListReply reply) {
    onServiceQueue([reply = std::move(reply)](auto&, Delegate& delegate) {
        std::vector<Value> reporters;
        for (const auto& client : delegate.getAllClients()) {
            client->forEachSession([&](std::int64_t reporterID, const auto& /*session*/) {
                reporters.emplace_back(reporterID);
            });
        }
        reply(std::nullopt, List(std::move(reporters)));
    });
}

void HYReportingClientServerInstance::killService(BoolReply reply) {
    onServiceQueue([reply = std::move(reply)](auto&, Delegate&) {
        HY_LOG_DEFAULT(HYReportingClientCategory, "DESTROYING SERVICE");
        platform::current().ownProcess->terminate(2);
    });
}

void HYReportingClientServerInstance::handleConnectionError() {
    onServiceQueue([](auto& self, Delegate& delegate) { self.leave(delegate); });
}

void HYReportingClientServerInstance::leave(Delegate& delegate) {
    HY_ASSERT_ON_QUEUE(serviceQueue_);
    const auto clients = delegate.getAllClients();
    if (std::none_of(clients.begin(), clients.end(),
                     [this](const auto& client) { return client.get() == this; })) {
        return;
    }
    for (std::size_t i = 0; i < kLossesPerStep; ++i) {
        const auto session = takeFirstSession();
        if (session == nullptr) {
            break;
        }
        if (session->started()) {
            session->stop(platform::UploadEnding::Disconnected);
            uncountLost(delegate);
        }
        retire(delegate, *session);
    }
    if (hasSessions()) {
        continueOnServiceQueue([](auto& self, Delegate& again) { self.leave(again); });
        return;
    }
    delegate.removeClient(*this);
    HY_LOG_DEFAULT(HYReportingClientCategory, "removing {} from the server client list", pid_);
}

} // namespace halyard
