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

// How long the status waits for its turn before it looks for the reason.
constexpr std::chrono::seconds kStatusPatience{1};

// An answer with the status. It comes after the requests before it, which are in
// it then; but a stop that waits for its trace holds up the service, and what it
// waits for is what operators want to know, so then it is given at once.
class PendingStatus : public std::enable_shared_from_this<PendingStatus> {
public:
    PendingStatus(protocol::Reply reply, std::weak_ptr<HYReportingServiceDelegate> service)
        : reply_(std::move(reply)), service_(std::move(service)) {}

    void answer() {
        const auto service = service_.lock();
        if (given_.test_and_set()) {
            return;
        }
        Dictionary status = platform::current().operations->status();
        if (service != nullptr) {
            status.merge(service->status());
        }
        reply_(std::nullopt, status);
    }
    // Looks for such a stop every now and then until the answer is given.
    void watch() {
        queue_->asyncAfter(kStatusPatience, [self = shared_from_this()] {
            const auto service = self->service_.lock();
            if (service != nullptr && service->isStopWaiting()) {
                self->answer();
            } else if (!self->given_.test()) {
                self->watch();
            }
        });
    }

private:
    const protocol::Reply reply_;
    const std::weak_ptr<HYReportingServiceDelegate> service_;
    const std::shared_ptr<platform::SerialQueue> queue_ =
        platform::current().queues->makeSerialQueue("com.kestrel.halyard.status",
                                                    platform::QueuePriority::Utility);
    std::atomic_flag given_;
};

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
    case Method::ClientDropped:
        platform::current().messageAccounts.addLostInClient(a.dictionary);
        return reply(std::nullopt, true);
    case Method::AdminPostNotification:
    case Method::AdminFlush:
    case Method::AdminStatus:
    case Method::AdminPurge:
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
    case Method::AdminPurge:
        platform::current().operations->purge(
            [reply = std::move(request.reply)](const MaybeError& error, std::uint64_t rows) {
                reply(error, rows);
            });
        break;
    default:
        answerStatus(request.reply);
        break;
    }
}

void RequestDispatch::answerStatus(const protocol::Reply& reply) const {
    const auto pending = std::make_shared<PendingStatus>(reply, service_);
    serviceQueue_->async([pending] { pending->answer(); });
    pending->watch();
}

} // namespace halyard
