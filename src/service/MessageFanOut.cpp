#include "service/MessageFanOut.h"

#include <algorithm>
#include <fmt/format.h>

#include "common/ValueSize.h"
#include "platform/ClientBudget.h"
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
// What a step takes, about a millisecond's worth: look-ups; bytes of the messages that
// are copied and written, each of which costs something even if it is small.
constexpr std::size_t kLookupsPerStep = 2048;
constexpr std::size_t kEffortPerStep = std::size_t{256} * 1024;
constexpr std::size_t kEffortOfOffer = 2048;

void tellRest(std::vector<Value>& named, std::size_t count) {
    if (count > named.size()) {
        named.emplace_back(fmt::format("and {} more", count - named.size()));
    }
}

std::vector<Value>
descriptionsOf(const std::vector<std::shared_ptr<HYReportingSession>>& sessions) {
    constexpr std::size_t kBeside = 2; // what is told with them
    const std::size_t named = std::min(sessions.size(), kNamedInLog);
    std::vector<Value> descriptions;
    descriptions.reserve(named + kBeside);
    for (std::size_t i = 0; i < named; ++i) {
        descriptions.emplace_back(sessions[i]->sharedDescription());
    }
    return descriptions;
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
    std::vector<Value> descriptions = descriptionsOf(sessions);
    tellRest(descriptions, count);
    return List(std::move(descriptions));
}

std::vector<Value> tellSessions(std::int64_t number,
                                const std::vector<std::shared_ptr<HYReportingSession>>& sessions,
                                std::size_t count) {
    std::vector<Value> told = descriptionsOf(sessions);
    told.emplace_back(number);
    told.emplace_back(count);
    return told;
}

bool MessageFanOut::advance(Delegate& delegate, const OwnLookup& findOwn) {
    if (stage_ == Stage::Begin && begin(delegate)) {
        return true;
    }
    if (stage_ == Stage::FindSessions && !findSessions(delegate, findOwn)) {
        return false;
    }
    return error_.has_value() || offerToSome(delegate);
}

bool MessageFanOut::begin(Delegate& delegate) {
    HY_LOG_DEBUG(HYReportingClientCategory, "sending message for reporter {}",
                 describeIDs(reporterIDs_));
    platform::current().traceMarks->mark(kSendMark, 0, 0, 0, 0);
    if (!delegate.isReportingEnabled()) {
        platform::count(MessageCount::Refused);
        error_ = Error{std::string(kReportingErrorDomain), kReportingDisabled, {}};
        return true;
    }
    stage_ = Stage::FindSessions;
    bytes_ = bytesOf(message_.payload);
    return false;
}

// True when all are found, and whether they may be offered the message is known.
bool MessageFanOut::findSessions(Delegate& delegate, const OwnLookup& findOwn) {
    if (reporterIDs_) {
        const std::size_t end = std::min(reporterIDs_->size(), next_ + kLookupsPerStep);
        // Kept: an ID that stands twice is offered the message twice.
        for (; next_ < end; ++next_) {
            if (auto session = find((*reporterIDs_)[next_], delegate, findOwn)) {
                sessions_.push_back(std::move(session));
            }
        }
        if (next_ < reporterIDs_->size()) {
            return false;
        }
        delegate.tell(lookups_);
    } else {
        sessions_ = delegate.getAllActiveReportingSessions();
        const std::size_t count = sessions_.size();
        HY_LOG_KEPT(delegate.activeSessionsLine(), LogLevel::Default, HYReportingClientCategory,
                    tellSessions(static_cast<std::int64_t>(count), sessions_, count),
                    "active reporting sessions {} : {}", count, describeSessions(sessions_));
    }
    next_ = 0;
    stage_ = Stage::Offer;
    if (!isAllowed()) {
        platform::count(MessageCount::Bounded);
        return true;
    }
    platform::count(MessageCount::Requests);
    if (reporterIDs_ && sessions_.empty()) {
        platform::count(MessageCount::Unaddressed);
    }
    return true;
}

MessageFanOut::Session MessageFanOut::find(std::int64_t reporterID, const Delegate& delegate,
                                           const OwnLookup& findOwn) {
    if (reporterID == 0) {
        return nullptr;
    }
    if (!sessions_.empty() && sessions_.back()->reporterID() == reporterID &&
        lookups_.foundCount == 0) {
        return sessions_.back(); // The sender's own, once more.
    }
    Session session = findOwn(reporterID);
    return session != nullptr ? session : delegate.findReportingSessionForID(reporterID, lookups_);
}

bool MessageFanOut::isAllowed() {
    const auto& sender = platform::ClientBudget::current();
    if (sender == nullptr) {
        return true;
    }
    std::size_t growth = sessions_.size() * (bytes_ + kEffortOfOffer);
    if (!sender->fits(growth)) { // Which is seldom so: worth looking closer.
        growth = 0;
        for (const Session& session : sessions_) {
            growth += session->growthBy(message_.category, message_.type, bytes_);
        }
    }
    if (sessions_.size() > 1 && sessions_.size() * bytes_ > sender->limits().copies) {
        error_ = platform::boundReached(platform::ClientBound::Copies);
    } else if (growth > 0 && !sender->fits(growth)) {
        error_ = platform::boundReached(platform::ClientBound::Memory);
    }
    return !error_;
}

bool MessageFanOut::offerToSome(Delegate& delegate) {
    if (!reporterIDs_ && sessions_.empty()) {
        sendStandalone(delegate);
        return true;
    }
    for (std::size_t effort = 0; next_ < sessions_.size() && effort < kEffortPerStep;
         effort += bytes_ + kEffortOfOffer) {
        // Let go of here: the last holder of a session may be this.
        const Session session = std::move(sessions_[next_]);
        ++next_;
        offer(delegate, session, next_ == sessions_.size());
    }
    return next_ == sessions_.size();
}

void MessageFanOut::offer(Delegate& delegate, const Session& session, bool last) {
    // The last takes it over, and may change what nobody else holds.
    if (reporterIDs_) {
        offerToSinks(delegate, session);
        session->offer(last ? std::move(message_.payload) : message_.payload, message_.category,
                       message_.type);
    } else if (session->started()) { // Others had their turn since it was found.
        // Kept: the session first here, last when it is addressed. Readers of the
        // store rely on either order.
        session->offer(message_.payload, message_.category, message_.type);
        offerToSinks(delegate, session);
    }
}

void MessageFanOut::sendStandalone(Delegate& delegate) const {
    // Kept: the session has our own process, not the sender's.
    const Session standalone = HYReportingSession::initWithID(
        kStandaloneReporterID, {platform::current().ownProcess->pid()});
    standalone->setServiceType(kAudioServiceTypeStandalone);
    standalone->updateConfigurationWithContentsOfConfiguration(
        Dictionary{{"HostApplicationDisplayID", "Unknown"}});
    offerToSinks(delegate, standalone);
    HY_LOG_DEFAULT(HYReportingClientCategory,
                   "no active reporting sessions found, sending as standalone");
    platform::count(MessageCount::Offered);
    HYReportingSession::sendSingleMessage(message_.payload, message_.category, message_.type,
                                          kAudioServiceTypeStandalone, delegate.getDefaults(),
                                          nullptr);
}

void MessageFanOut::offerToSinks(Delegate& delegate, const Session& session) const {
    delegate.sinks().handleEvent(message_, session, processName_);
}

} // namespace halyard
