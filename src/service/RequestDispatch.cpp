#include "service/RequestDispatch.h"

#include <atomic>
#include <chrono>

#include "platform/Device.h"
#include "platform/Operations.h"
#include "platform/Platform.h"
#include "service/HYReportingServiceDelegate.h"

namespace halyard {
namespace {

using protocol::Method;

// How long the status waits for its turn.
constexpr std::chrono::seconds kStatusPatience{1};

BoolReply boolReply(protocol::Reply reply) {
    return [reply = std::move(reply)](const MaybeError& error, bool success) {
        reply(error, success);
    };
}

// None for a notification: messages are too many for one that does nothing.
ErrorReply errorReply(protocol::Reply reply) {
    if (!reply) {
        return nullptr;
    }
    return [reply = std::move(reply)](const MaybeError& error) { reply(error, Value()); };
}

} // namespace

void RequestDispatch::handle(protocol::Request request) {
    protocol::Arguments& a = request.arguments;
    protocol::Reply& reply = request.reply;
    switch (request.method) {
    case Method::CreateReportingSession:
        return client_->createReportingSession(a.reporterID, boolReply(std::move(reply)));
    case Method::SetServiceType:
        return client_->setServiceType(a.serviceType, a.reporterID, boolReply(std::move(reply)));
    case Method::GetServiceNameForReporterID:
        return client_->getServiceNameForReporterID(
            a.reporterID,
            [reply = std::move(reply)](const MaybeError& error, AudioServiceType type) {
                reply(error, type);
            });
    case Method::SetConfiguration:
        return client_->setConfiguration(std::move(a.dictionary), a.reporterID,
                                         boolReply(std::move(reply)));
    case Method::StartReportingSessionForID:
        return client_->startReportingSessionForID(a.reporterID, boolReply(std::move(reply)));
    case Method::SendMessage:
        return client_->sendMessage(std::move(a.dictionary), a.category, a.type,
                                    std::move(a.reporterIDs), errorReply(std::move(reply)));
    case Method::StopReportingSessionForID:
        return client_->stopReportingSessionForID(a.reporterID, boolReply(std::move(reply)));
    case Method::DestroyReportingSession:
        return client_->destroyReportingSession(a.reporterID, boolReply(std::move(reply)));
    case Method::ReporterIDValid:
        return client_->reporterID(
            a.reporterID,
            [reply = std::move(reply)](const MaybeError& error, const Dictionary& valid) {
                reply(error, valid);
            });
    case Method::GetAllReporters:
        return client_->getAllReporters(
            [reply = std::move(reply)](const MaybeError& error, const List& reporters) {
                reply(error, reporters);
            });
    case Method::KillService:
        return client_->killService(boolReply(std::move(reply)));
    case Method::AdminPostNotification:
    case Method::AdminFlush:
    case Method::AdminStatus:
        return handleAdministration(std::move(request));
    }
}

void RequestDispatch::handleAdministration(protocol::Request request) {
    switch (request.method) {
    case Method::AdminPostNotification:
        platform::current().notifications->post(request.arguments.name);
        request.reply(std::nullopt, true);
        break;
    case Method::AdminFlush:
        platform::current().operations->flush(
            [reply = std::move(request.reply)] { reply(std::nullopt, true); });
        break;
    default:
        answerStatus(request.reply);
        break;
    }
}

// After the requests before it, so that they are in it; when something holds the
// service up, operators learn what, instead of waiting as well.
void RequestDispatch::answerStatus(const protocol::Reply& reply) const {
    auto answer = [reply, service = service_, given = std::make_shared<std::atomic_flag>()] {
        if (given->test_and_set()) {
            return;
        }
        Dictionary status = platform::current().operations->status();
        if (const auto alive = service.lock()) {
            status.merge(alive->status());
        }
        reply(std::nullopt, status);
    };
    serviceQueue_->async(answer);
    platform::current()
        .queues->makeSerialQueue("com.kestrel.halyard.status", platform::QueuePriority::Utility)
        ->asyncAfter(kStatusPatience, std::move(answer));
}

} // namespace halyard
