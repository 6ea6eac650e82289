// The object behind one connection: it takes the client's requests and owns the
// sessions that they create.
//
// A request captures its arguments and this object weakly and queues its work on
// the service work queue; everything below "on the service work queue" needs no
// further lock for that reason. A client that has gone turns what it left queued
// into no-ops.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "common/Message.h"
#include "common/Mutex.h"
#include "platform/Clock.h"
#include "platform/WorkQueue.h"
#include "service/HYReportingServiceDelegateProtocol.h"
#include "service/HYReportingServiceProtocol.h"
#include "session/HYReportingSession.h"

namespace halyard {

class MessageFanOut;

class HYReportingClientServerInstance final
    : public HYReportingServiceProtocol,
      public std::enable_shared_from_this<HYReportingClientServerInstance> {
public:
    using SessionMap = std::map<std::int64_t, std::shared_ptr<HYReportingSession>>;

    // The service object is held weakly, the queue and the process's budget shared.
    static std::shared_ptr<HYReportingClientServerInstance>
    initWithPID(std::int32_t pid, std::weak_ptr<HYReportingServiceDelegateProtocol> delegate,
                std::shared_ptr<platform::SerialQueue> serviceQueue,
                platform::ClientBudgetPtr budget);
    ~HYReportingClientServerInstance() override;

    void createReportingSession(std::int64_t reporterID, BoolReply reply) override;
    void setServiceType(AudioServiceType type, std::int64_t reporterID, BoolReply reply) override;
    void getServiceNameForReporterID(std::int64_t reporterID, ServiceTypeReply reply) override;
    void setConfiguration(Dictionary configuration, std::int64_t reporterID,
                          BoolReply reply) override;
    void startReportingSessionForID(std::int64_t reporterID, BoolReply reply) override;
    void sendMessage(Dictionary message, AudioEventCategory category, std::uint16_t type,
                     std::optional<std::vector<std::int64_t>> reporterIDs,
                     ErrorReply reply) override;
    void stopReportingSessionForID(std::int64_t reporterID, BoolReply reply) override;
    void destroyReportingSession(std::int64_t reporterID, BoolReply reply) override;
    void reporterID(std::int64_t reporterID, DictionaryReply valid) override;
    void getAllReporters(ListReply reply) override;
    void killService(BoolReply reply) override;

    // Any thread. Stops the sessions and leaves the service's client list; does
    // nothing for a client that has left it already.
    void handleConnectionError();

    std::int32_t processIdentifier() const { return pid_; }
    // Any thread.
    std::optional<platform::WallTime> clientStartDate() const HY_EXCLUDES(identityMutex_);
    std::optional<std::string> clientProcessName() const HY_EXCLUDES(identityMutex_);
    void setIdentity(platform::WallTime startDate, std::optional<std::string> processName)
        HY_EXCLUDES(identityMutex_);

    // Any thread. Null when this client holds no such session.
    std::shared_ptr<HYReportingSession> ownSession(std::int64_t reporterID) const
        HY_EXCLUDES(mapMutex_);
    SessionMap clientReportingSessionMap() const HY_EXCLUDES(mapMutex_);
    // Calls visit(reporterID, session) for each in the map's order, under its lock: for
    // those who would otherwise copy the map of a client with many.
    template <class Visit> void forEachSession(Visit visit) const HY_EXCLUDES(mapMutex_) {
        const MutexLock lock(mapMutex_);
        for (const auto& [reporterID, session] : sessions_) {
            visit(reporterID, session);
        }
    }

private:
    using Delegate = HYReportingServiceDelegateProtocol;

    HYReportingClientServerInstance(std::int32_t pid, std::weak_ptr<Delegate> delegate,
                                    std::shared_ptr<platform::SerialQueue> serviceQueue,
                                    platform::ClientBudgetPtr budget);

    // body(*this, delegate) as a task of the service work queue; queues it there; has
    // it go on with what the task at hand has left, once others had their turn.
    template <class Body> platform::Task taskOf(Body body);
    template <class Body> void onServiceQueue(Body body);
    template <class Body> void continueOnServiceQueue(Body body);
    // As onServiceQueue(), for what begins or ends the session: where it may wait for a
    // trace, it is done on the queue's own thread.
    template <class Body> void onServiceQueueFor(std::int64_t reporterID, Body body);

    // The bodies of the requests, on the service work queue.
    MaybeError create(Delegate& delegate, std::int64_t reporterID);
    void start(Delegate& delegate, std::int64_t reporterID, const BoolReply& reply);
    void stop(Delegate& delegate, std::int64_t reporterID);
    void destroy(Delegate& delegate, std::int64_t reporterID);
    // Takes a step; true when it was the last.
    bool send(Delegate& delegate, MessageFanOut& fanOut) const;
    void sendRest(std::shared_ptr<MessageFanOut> fanOut, ErrorReply reply);
    // In steps, since there may be many.
    void leave(Delegate& delegate);
    std::shared_ptr<HYReportingSession> takeFirstSession() HY_EXCLUDES(mapMutex_);
    bool hasSessions() const HY_EXCLUDES(mapMutex_);
    // For a session that leaves the map: answers the start that it holds.
    static void retire(Delegate& delegate, HYReportingSession& session);

    std::shared_ptr<HYReportingSession> findReportingSessionForID(const Delegate& delegate,
                                                                  std::int64_t reporterID,
                                                                  bool acrossAllClients) const;

    const std::int32_t pid_;
    const std::weak_ptr<Delegate> delegate_;
    const std::shared_ptr<platform::SerialQueue> serviceQueue_;
    const platform::ClientBudgetPtr budget_;

    mutable Mutex identityMutex_;
    std::optional<platform::WallTime> startDate_ HY_GUARDED_BY(identityMutex_);
    std::optional<std::string> processName_ HY_GUARDED_BY(identityMutex_);

    // Changed on the service work queue only; lookups of other threads lock it.
    mutable Mutex mapMutex_;
    SessionMap sessions_ HY_GUARDED_BY(mapMutex_);
};

} // namespace halyard
