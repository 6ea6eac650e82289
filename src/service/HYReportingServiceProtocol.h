// The request interface that a connection exports to its client.
//
// Every method may be called on any delivery thread; the work runs later on the
// service work queue, in the order of the calls, and the reply is called from
// there. A reply is called once at most.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <vector>

#include "common/Error.h"
#include "common/HYReportingUtility.h"
#include "common/Value.h"

namespace halyard {

using BoolReply = std::function<void(const MaybeError&, bool)>;
using ServiceTypeReply = std::function<void(const MaybeError&, AudioServiceType)>;
using DictionaryReply = std::function<void(const MaybeError&, const Dictionary&)>;
using ListReply = std::function<void(const MaybeError&, const List&)>;
using ErrorReply = std::function<void(const MaybeError&)>;

class HYReportingServiceProtocol {
public:
    virtual ~HYReportingServiceProtocol() = default;

    virtual void createReportingSession(std::int64_t reporterID, BoolReply reply) = 0;
    virtual void setServiceType(AudioServiceType type, std::int64_t reporterID,
                                BoolReply reply) = 0;
    // Answers the numeric type; its name is the client's affair.
    virtual void getServiceNameForReporterID(std::int64_t reporterID, ServiceTypeReply reply) = 0;
    virtual void setConfiguration(Dictionary configuration, std::int64_t reporterID,
                                  BoolReply reply) = 0;
    // Answered when the session stops or is started again.
    virtual void startReportingSessionForID(std::int64_t reporterID, BoolReply reply) = 0;
    // No list at all broadcasts; an empty list sends nothing. The reply may be null.
    virtual void sendMessage(Dictionary message, AudioEventCategory category, std::uint16_t type,
                             std::optional<std::vector<std::int64_t>> reporterIDs,
                             ErrorReply reply) = 0;
    virtual void stopReportingSessionForID(std::int64_t reporterID, BoolReply reply) = 0;
    virtual void destroyReportingSession(std::int64_t reporterID, BoolReply reply) = 0;
    // {"reporterID", "serviceType"}; 0 and 65535 for an ID that nobody holds.
    virtual void reporterID(std::int64_t reporterID, DictionaryReply valid) = 0;
    virtual void getAllReporters(ListReply reply) = 0;
    // Ends the process; never answered.
    virtual void killService(BoolReply reply) = 0;
};

} // namespace halyard
