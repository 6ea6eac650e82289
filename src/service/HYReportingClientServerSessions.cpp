// What a client is known by, and the sessions that it holds.
#include "service/HYReportingClientServerInstance.h"

namespace halyard {

std::shared_ptr<HYReportingSession> HYReportingClientServerInstance::takeFirstSession() {
    const MutexLock lock(mapMutex_);
    if (sessions_.empty()) {
        return nullptr;
    }
    auto session = std::move(sessions_.begin()->second);
    sessions_.erase(sessions_.begin());
    return session;
}

bool HYReportingClientServerInstance::hasSessions() const {
    const MutexLock lock(mapMutex_);
    return !sessions_.empty();
}

std::optional<platform::WallTime> HYReportingClientServerInstance::clientStartDate() const {
    const MutexLock lock(identityMutex_);
    return startDate_;
}

std::optional<std::string> HYReportingClientServerInstance::clientProcessName() const {
    const MutexLock lock(identityMutex_);
    return processName_;
}

void HYReportingClientServerInstance::setIdentity(platform::WallTime startDate,
                                                  std::optional<std::string> processName) {
    const MutexLock lock(identityMutex_);
    startDate_ = startDate;
    processName_ = std::move(processName);
}

std::shared_ptr<HYReportingSession>
HYReportingClientServerInstance::ownSession(std::int64_t reporterID) const {
    const MutexLock lock(mapMutex_);
    const auto at = sessions_.find(reporterID);
    return at != sessions_.end() ? at->second : nullptr;
}

HYReportingClientServerInstance::SessionMap
HYReportingClientServerInstance::clientReportingSessionMap() const {
    const MutexLock lock(mapMutex_);
    return sessions_;
}

std::shared_ptr<HYReportingSession> HYReportingClientServerInstance::findReportingSessionForID(
    const Delegate& delegate, std::int64_t reporterID, bool acrossAllClients) const {
    if (reporterID == 0) {
        return nullptr; // ID 0 means no session, even where a client created it.
    }
    auto session = ownSession(reporterID);
    if (session == nullptr && acrossAllClients) {
        session = delegate.findReportingSessionForID(reporterID);
    }
    return session;
}

} // namespace halyard
