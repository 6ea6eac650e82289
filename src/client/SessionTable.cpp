#include "client/SessionTable.h"

#include "client/Frames.h"
#include "client/Replies.h"
#include "protocol/Wire.h"

namespace halyard::client {
namespace {

using protocol::Method;

constexpr std::string_view kHostApplication = "HostApplicationDisplayID";
constexpr std::string_view kAliasOfHostApplication = "VQHostApplicationDisplayID";

// As the daemon merges: the alias also sets the key that it stands for, unless
// the same update has that one too.
void mergeConfiguration(Dictionary& configuration, const Dictionary& update) {
    if (const Value* alias = update.find(kAliasOfHostApplication)) {
        configuration.set(kHostApplication, *alias);
    }
    configuration.merge(update);
}

} // namespace

SessionTable::Session* SessionTable::find(std::int64_t reporterID) {
    const auto order = orders_.find(reporterID);
    return order != orders_.end() ? &sessions_[order->second] : nullptr;
}

void SessionTable::erase(std::int64_t reporterID) {
    const auto order = orders_.find(reporterID);
    if (order != orders_.end()) {
        sessions_.erase(order->second);
        orders_.erase(order);
    }
}

void SessionTable::create(std::int64_t reporterID) {
    erase(reporterID); // A second one of the same ID takes the place of the first.
    orders_[reporterID] = nextOrder_;
    sessions_[nextOrder_].reporterID = reporterID;
    ++nextOrder_;
}

bool SessionTable::apply(const Record& record) {
    if (record.method == Method::CreateReportingSession) {
        create(record.reporterID);
        return false;
    }
    Session* const session = find(record.reporterID);
    if (session == nullptr) {
        return false;
    }
    switch (record.method) {
    case Method::SetServiceType:
        session->serviceType = record.type;
        return false;
    case Method::SetConfiguration:
        mergeConfiguration(session->configuration, dictionaryOf(record));
        return false;
    case Method::StartReportingSessionForID:
        return !std::exchange(session->started, true);
    case Method::StopReportingSessionForID:
        session->started = false;
        return false;
    case Method::DestroyReportingSession:
        erase(record.reporterID);
        return false;
    default:
        return false;
    }
}

void SessionTable::keepStartReply(std::int64_t reporterID, const Callback& stopped) {
    Session* const session = find(reporterID);
    if (session != nullptr && session->started) {
        session->stopped = stopped;
    } else {
        fail(stopped, HALYARD_ERROR_CONNECTION_LOST);
    }
}

Callback SessionTable::takeStartReply(std::int64_t reporterID) {
    Session* const session = find(reporterID);
    return session != nullptr ? std::exchange(session->stopped, {}) : Callback();
}

std::vector<Callback> SessionTable::takeAllStartReplies() {
    std::vector<Callback> result;
    for (auto& [order, session] : sessions_) {
        if (session.stopped) {
            result.push_back(std::exchange(session.stopped, {}));
        }
    }
    return result;
}

void appendRecreation(std::string& out, const SessionTable::Session& session) {
    protocol::Arguments arguments;
    arguments.reporterID = session.reporterID;
    protocol::appendCall(out, std::nullopt, Method::CreateReportingSession, arguments);
    if (session.serviceType) {
        arguments.serviceType = *session.serviceType;
        protocol::appendCall(out, std::nullopt, Method::SetServiceType, arguments);
    }
    if (!session.configuration.empty()) {
        arguments.dictionary = session.configuration;
        protocol::appendCall(out, std::nullopt, Method::SetConfiguration, arguments);
    }
}

} // namespace halyard::client
