#include "session/SingleMessage.h"

#include <chrono>
#include <memory>
#include <utility>

#include "common/ValueSize.h"
#include "platform/ClientBudget.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/Random.h"
#include "platform/RelayReporting.h"
#include "platform/TraceMarks.h"
#include "platform/WorkQueue.h"
#include "session/RelayClient.h"

namespace halyard {
namespace {

using namespace platform; // The many kRelayReporting... names.

constexpr std::uint32_t kMessageMark = 0x21044838;
constexpr std::int64_t kSingleMessageSessionID = -1;
// Kept: the spread of alarms stands in their log line only; the delay is the same for all.
constexpr std::uint32_t kAlarmSpreadSeconds = 60;
constexpr std::size_t kWaitingBytes = 512; // beside the message
constexpr std::chrono::nanoseconds kSingleMessageDelay{1'000'000'000};

MaybeError upload(const Message& message, AudioServiceType serviceType) {
    const Dictionary sessionInfo{{kRelayReportingSessionInfoClientType, kRelayClientType},
                                 {kRelayReportingSessionInfoClientVersion, relayClientVersion()},
                                 {kRelayReportingSessionInfoSessionID, kSingleMessageSessionID}};
    const Dictionary userInfo{
        {kRelayReportingUserInfoClientName, kRelayClientName},
        {kRelayReportingUserInfoServiceName,
         Value(HYReportingUtilityGenerateServiceNameFromServiceType(serviceType))}};
    const Dictionary payload = HYReportingUtilityRemoveWhiteSpaceFromKeys(message.payload);
    if (!HYReportingUtilityShouldSendMessage()) {
        count(MessageCount::Sampled);
        HY_LOG_INFO(HYReportingSessionCategory, "event sampled {}", Value(message.payload));
        return std::nullopt;
    }
    MaybeError error = current().relayReporting->sendOneMessageWithSessionInfo(
        sessionInfo, userInfo,
        HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(message.category),
        message.type, payload);
    if (error) {
        if (error->code == kRelayReportingNoBackend) {
            count(MessageCount::NoBackend);
        }
        HY_LOG_ERROR(HYReportingSessionCategory, "sendOneMessageWithSessionInfo {}",
                     error->message);
    } else {
        HY_LOG_DEBUG(HYReportingSessionCategory, "message {} : category {} : type {}",
                     Value(message.payload), shownInLog(message.category),
                     shownInLog(message.type));
    }
    return error;
}

// A message that waits for its second counts among what its client has on its way, and
// is the client's when it is delivered.
class Waiting {
public:
    explicit Waiting(const Message& message)
        : client_(ClientBudget::current()), bytes_(bytesOf(message.payload) + kWaitingBytes) {
        if (client_ != nullptr) {
            client_->begin(ClientBudget::Work::Singles, bytes_);
        }
    }
    ~Waiting() {
        if (client_ != nullptr) {
            client_->end(ClientBudget::Work::Singles, 1, bytes_);
        }
    }
    Waiting(const Waiting&) = delete;
    Waiting& operator=(const Waiting&) = delete;

    const ClientBudgetPtr& client() const { return client_; }

private:
    const ClientBudgetPtr client_;
    const std::size_t bytes_;
};

void deliver(const Message& message, AudioServiceType serviceType, const SendReply& reply) {
    current().traceMarks->mark(kMessageMark, 0, 0, 0, 0);
    HY_LOG_DEBUG(HYReportingSessionCategory, "sending single message");
    const MaybeError error = upload(message, serviceType);
    if (reply) {
        reply(error);
    }
}

} // namespace

void sendSingleMessage(Message message, AudioServiceType serviceType, SendReply reply) {
    // The delay of an alarm's message is drawn and told, but not applied.
    const std::uint32_t delta =
        serviceType == kAudioServiceTypeAlarms ? current().random->uniform(kAlarmSpreadSeconds) : 0;
    HY_LOG_DEBUG(HYReportingSessionCategory, "sending single message after delta {} for service {}",
                 delta, serviceType);
    const auto waiting = std::make_shared<const Waiting>(message);
    current().queues->backgroundQueue().asyncAfter(
        kSingleMessageDelay,
        [message = std::move(message), serviceType, reply = std::move(reply), waiting] {
            const BudgetScope pays(waiting->client());
            deliver(message, serviceType, reply);
        });
}

} // namespace halyard
