#include "sinks/HYReportingTMXBridge.h"

#include <string_view>

#include "common/Description.h"
#include "platform/EventServices.h"
#include "platform/Log.h"
#include "platform/Platform.h"

namespace halyard {
namespace {

constexpr std::uint32_t kAudioIssueMetric = 0x5B0003;

// Kept: a missing key has its line, and the metric is posted all the same.
const Value* require(const Dictionary& message, std::string_view key) {
    const Value* value = message.find(key);
    if (value == nullptr) {
        HY_LOG_ERROR(HYReportingTMXLogCategory, "Failed to get {} for AudioIssueDetected", key);
    }
    return value;
}

std::string requiredText(const Dictionary& message, std::string_view key) {
    const Value* value = require(message, key);
    return value != nullptr ? describe(*value) : std::string();
}

} // namespace

void HYReportingTMXBridge::handleEvent(const Dictionary* message, AudioEventCategory,
                                       AudioEventType type,
                                       const std::shared_ptr<const SessionFacts>&) {
    if (message == nullptr || type != kAudioEventTypeIssueDetector) {
        return;
    }
    platform::current().metrics->postMetric(kAudioIssueMetric, issueOf(*message).encoded());
}

tmxmetrics::AudioIssueDetected HYReportingTMXBridge::issueOf(const Dictionary& message) {
    tmxmetrics::AudioIssueDetected issue;
    issue.issuetype = requiredText(message, "issue_type");
    issue.rtaidclient = requiredText(message, "rtaid_client");
    issue.node = requiredText(message, "node");
    if (const Value* seconds = require(message, "any_channel_silence_seconds")) {
        issue.duration = static_cast<std::int32_t>(seconds->integerValue());
    }
    return issue;
}

} // namespace halyard
