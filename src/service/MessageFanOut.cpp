#include "service/MessageFanOut.h"

#include <algorithm>
#include <fmt/format.h>

#include "platform/Device.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/TraceMarks.h"
#include "sinks/MessageSinks.h"

namespace halyard {
namespace {

using platform::MessageCount;

constexpr std::uint32_t kSendMark = 0x21044824;
constexpr std::int64_t kReportingDisabled = 1;
constexpr std::int64_t kStandaloneReporterID = 1;

void tellRest(std::vector<Value>& named, std::size_t count) {
    if (count > named.size()) {
        named.emplace_back(fmt::format("and {} more", count - named.size()));
    }
}

Value describeIDs(const std::optional<std::vector<std::int64_t>>& reporterIDs) {
    if (!reporterIDs) {
        return {};
    }
    const std::size_t named = std::min(reporterIDs->size(), kNamedInLog);
    std::vector<Value> ids(reporterIDs->begin(),
                           reporterIDs->begin() + static_cast<std::ptrdiff_t>(named));
    tellRest(ids, reporterIDs->size());
    return List(std::move(ids));
}

} // namespace

Value describeSessions(const std::vector<std::shared_ptr<HYReportingSession>>& sessions,
                       std::size_t count) {
    std::vector<Value> descriptions;
    for (std::size_t i = 0; i < sessions.size() && i < kNamedInLog; ++i) {
        descriptions.emplace_back(sessions[i]->description());
    }
    tellRest(descriptions, count);
    return List(std::move(descriptions));
}

MaybeError MessageFanOut::route(const std::optional<std::vector<std::int64_t>>& reporterIDs,
                                const Lookup& findAcrossAllClients) {
    HY_LOG_DEBUG(HYReportingClientCategory, "sending message for reporter {}",
                 describeIDs(reporterIDs));
    platform::current().traceMarks->mark(kSendMark, 0, 0, 0, 0);
    if (!delegate_.isReportingEnabled()) {
        platform::count(MessageCount::Refused);
        return Error{std::string(kReportingErrorDomain), kReportingDisabled, {}};
    }
    platform::count(MessageCount::Requests);
    if (reporterIDs) {
        sendToAddressed(*reporterIDs, findAcrossAllClients);
    } else {
        broadcast();
    }
    return std::nullopt;
}

void MessageFanOut::sendToAddressed(const std::vector<std::int64_t>& reporterIDs,
                                    const Lookup& findAcrossAllClients) {
    bool reachedOne = false;
    // Kept: an ID that stands twice is offered the message twice.
    for (const std::int64_t& reporterID : reporterIDs) {
        if (reporterID == 0) {
            continue;
        }
        if (const Session session = findAcrossAllClients(reporterID)) {
            reachedOne = true;
            offerToSinks(session);
            // The last takes it over, and may change what nobody else holds.
            const bool last = &reporterID == &reporterIDs.back();
            session->offer(last ? std::move(message_.payload) : message_.payload, message_.category,
                           message_.type);
        }
    }
    if (!reachedOne) {
        platform::count(MessageCount::Unaddressed);
    }
}

void MessageFanOut::broadcast() const {
    const auto sessions = delegate_.getAllActiveReportingSessions();
    HY_LOG_DEFAULT(HYReportingClientCategory, "active reporting sessions {} : {}", sessions.size(),
                   describeSessions(sessions));
    for (const Session& session : sessions) {
        // Kept: the session first here, last when it is addressed. Readers of the
        // store rely on either order.
        session->offer(message_.payload, message_.category, message_.type);
        offerToSinks(session);
    }
    if (sessions.empty()) {
        sendStandalone();
    }
}

void MessageFanOut::sendStandalone() const {
    // Kept: the session has our own process, not the sender's.
    const Session standalone = HYReportingSession::initWithID(
        kStandaloneReporterID, {platform::current().ownProcess->pid()});
    standalone->setServiceType(kAudioServiceTypeStandalone);
    standalone->updateConfigurationWithContentsOfConfiguration(
        Dictionary{{"HostApplicationDisplayID", "Unknown"}});
    offerToSinks(standalone);
    HY_LOG_DEFAULT(HYReportingClientCategory,
                   "no active reporting sessions found, sending as standalone");
    platform::count(MessageCount::Offered);
    HYReportingSession::sendSingleMessage(message_.payload, message_.category, message_.type,
                                          kAudioServiceTypeStandalone, delegate_.getDefaults(),
                                          nullptr);
}

void MessageFanOut::offerToSinks(const Session& session) const {
    delegate_.sinks().handleEvent(message_, session, processName_);
}

} // namespace halyard
