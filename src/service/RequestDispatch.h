// What a connection exports: it hands each request of the wire to the method of
// the request interface that it names, and answers operators.
//
// Called on the connection's delivery thread.
#pragma once

#include <memory>

#include "platform/Listener.h"
#include "platform/WorkQueue.h"
#include "service/HYReportingServiceProtocol.h"

namespace halyard {

class HYReportingServiceDelegate;

class RequestDispatch final : public platform::ExportedObject {
public:
    RequestDispatch(std::shared_ptr<HYReportingServiceProtocol> client,
                    std::weak_ptr<HYReportingServiceDelegate> service,
                    std::shared_ptr<platform::SerialQueue> serviceQueue)
        : client_(std::move(client)), service_(std::move(service)),
          serviceQueue_(std::move(serviceQueue)) {}

    void handle(protocol::Request request) override;

private:
    void handleAdministration(protocol::Request request);
    void answerStatus(const protocol::Reply& reply) const;

    const std::shared_ptr<HYReportingServiceProtocol> client_;
    const std::weak_ptr<HYReportingServiceDelegate> service_;
    const std::shared_ptr<platform::SerialQueue> serviceQueue_;
};

} // namespace halyard
