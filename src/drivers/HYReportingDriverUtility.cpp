#include "drivers/HYReportingDriverUtility.h"

#include <algorithm>
#include <fmt/format.h>
#include <iterator>
#include <optional>

#include "drivers/OptionalText.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "sinks/HYReportingTallyhubBridge.h"

namespace halyard {
namespace {

using platform::HWReportChannel;
using platform::HWReportResult;
using platform::HWReportSamplesRef;

// The order in which the groups are subscribed, sampled and reported.
constexpr struct {
    const char* group; // null: any
    const char* subGroup;
} kDrivers[] = {{"KestrelZR4QLX", nullptr},
                {"Speaker", nullptr},
                {nullptr, "QLX"},
                {"Haptics", "Stats"},
                {"StateTransitionTimes_ms", nullptr},
                {"Rx", nullptr},
                {"Tx", nullptr},
                {nullptr, "HWAudio2"}};

std::optional<std::string> optionalText(const char* text) {
    return text != nullptr ? std::optional<std::string>(text) : std::nullopt;
}

HWReportSamplesRef sample(const HYReportingIOChannelSubscription& subscription,
                          std::optional<platform::HWReportError>& error) {
    auto result = platform::current().hwReport->createSamples(
        subscription.subscription(), subscription.subscribedChannels().get());
    error = result.error;
    return std::move(result.value);
}

// Kept: a failed delta reads the same as failed samples.
void logSamplesError(const std::optional<platform::HWReportError>& error) {
    if (error) {
        HY_LOG_ERROR(HYReportingDriverUtilityCategory, "HWReportCreateSamples error {}",
                     error->code);
    }
}

void appendCleaned(std::string& key, std::string_view text) {
    std::copy_if(text.begin(), text.end(), std::back_inserter(key),
                 [](char character) { return character != '_' && character != ' '; });
}

void send(const Dictionary& statistics, AudioEventType type,
          const std::shared_ptr<HYReportingSession>& session) {
    if (statistics.empty()) {
        return;
    }
    session->sendMessage(statistics, kAudioEventCategoryHWReporting, type, nullptr);
    HYReportingTallyhubBridge::handleEvent(&statistics, kAudioEventCategoryHWReporting, type,
                                           session);
}

} // namespace

HYReportingDriverUtility::HYReportingDriverUtility() {
    HY_LOG_INFO(HYReportingDriverUtilityCategory, "creating hwreporting driver utility");
    if (platform::current().hwReport == nullptr) {
        return;
    }
    for (const auto& [group, subGroup] : kDrivers) {
        subscribeTo(
            HYReportingDriver::driverWithGroupName(optionalText(group), optionalText(subGroup)));
    }
}

void HYReportingDriverUtility::subscribeTo(const std::shared_ptr<HYReportingDriver>& driver) {
    platform::HWReport& library = *platform::current().hwReport;
    const auto group = driver->groupName();
    const auto subGroup = driver->subGroupName();
    const auto listed = library.copyChannelsInGroup(group, subGroup);
    if (listed.error) {
        HY_LOG_ERROR(HYReportingDriverUtilityCategory, "error {} getting channels for driver {}-{}",
                     listed.error->code, orNull(group), orNull(subGroup));
    }
    if (listed.value == nullptr) {
        return;
    }
    if (library.getChannelCount(*listed.value) < 1) {
        HY_LOG_INFO(HYReportingDriverUtilityCategory,
                    "couldn't find any channels for driver group {}-{}", orNull(group),
                    orNull(subGroup));
        return;
    }
    const auto subscribed = library.createSubscription(*listed.value);
    HYReportingIOChannelSubscription subscription(driver);
    // Kept: taken unchecked; without a subscription there are no samples.
    subscription.setSubscription(subscribed.subscription);
    subscription.setSubscribedChannels(subscribed.channels);
    ioChannelSubscriptions_.push_back(std::move(subscription));
    // Kept: readers of the log search for "group group".
    HY_LOG_INFO(HYReportingDriverUtilityCategory, "subscribed to group group {}-{}", orNull(group),
                orNull(subGroup));
}

platform::DriverSnapshotRef HYReportingDriverUtility::getSnapShot() const {
    auto snapshot = std::make_shared<platform::DriverSnapshot>();
    for (const auto& subscription : ioChannelSubscriptions_) {
        const std::string description = subscription.driver()->description();
        HY_LOG_INFO(HYReportingDriverUtilityCategory, "sampling driver {}", description);
        std::optional<platform::HWReportError> error;
        if (auto samples = sample(subscription, error)) {
            (*snapshot)[description] = std::move(samples);
        } else {
            logSamplesError(error);
        }
    }
    return snapshot;
}

void HYReportingDriverUtility::sendDriverLogsForSession(
    const std::shared_ptr<HYReportingSession>& session) const {
    Statistics statistics;
    const auto snapshot = session->driverSnapShot();
    for (const auto& subscription : ioChannelSubscriptions_) {
        collect(subscription, snapshot, statistics);
    }
    send(statistics.simple, kAudioEventTypeSimple, session);
    send(statistics.histogram, kAudioEventTypeHistogram, session);
    send(statistics.state, kAudioEventTypeState, session);
}

// The sets of one driver are gone when this returns, before the next is sampled.
void HYReportingDriverUtility::collect(const HYReportingIOChannelSubscription& subscription,
                                       const platform::DriverSnapshotRef& snapshot,
                                       Statistics& statistics) {
    HY_LOG_INFO(HYReportingDriverUtilityCategory, "getting latest samples");
    std::optional<platform::HWReportError> error;
    const HWReportSamplesRef current = sample(subscription, error);
    HY_LOG_INFO(HYReportingDriverUtilityCategory, "done getting latest samples");
    if (current == nullptr) {
        logSamplesError(error);
        return;
    }
    if (snapshot == nullptr) {
        return; // Nothing to compare with.
    }
    const auto before = snapshot->find(subscription.driver()->description());
    platform::HWReport& library = *platform::current().hwReport;
    const auto delta = library.createSamplesDelta(
        before != snapshot->end() ? before->second.get() : nullptr, *current);
    if (delta.value == nullptr) {
        logSamplesError(delta.error);
        return;
    }
    library.iterate(*delta.value, [&statistics](const HWReportChannel& channel) {
        processChannel(channel, statistics);
        return 0;
    });
}

void HYReportingDriverUtility::processChannel(const HWReportChannel& channel,
                                              Statistics& statistics) {
    const unsigned format = channel.format;
    switch (format) {
    case platform::kHWReportFormatSimple:
        processSimpleData(channel, statistics.simple);
        break;
    case platform::kHWReportFormatState:
        processStateData(channel, statistics.state);
        break;
    case platform::kHWReportFormatHistogram:
        processHistogramData(channel, statistics.histogram);
        break;
    case 0:
    case platform::kHWReportFormatLast:
        HY_LOG_DEBUG(HYReportingDriverUtilityCategory,
                     "Dropping sample of type : {} for group : {} subgroup : {}", format,
                     orNull(channel.group), orNull(channel.subGroup));
        break;
    default:
        HY_LOG_ERROR(HYReportingDriverUtilityCategory,
                     "The HWReportingFormat {} is not supported group : {} subgroup : {}", format,
                     orNull(channel.group), orNull(channel.subGroup));
        break;
    }
}

void HYReportingDriverUtility::processSimpleData(const HWReportChannel& channel,
                                                 Dictionary& driverStats) {
    if (channel.value >= 1) {
        driverStats.set(getDriverStatsKey(channel, "Simple"), channel.value);
    }
}

void HYReportingDriverUtility::processHistogramData(const HWReportChannel& channel,
                                                    Dictionary& driverStats) {
    // From 0, so bounds that are all positive still report a lower end of 0.
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    // Those of the bucket before, where a bucket's own cannot be told.
    std::int64_t bucketLower = 0;
    std::int64_t bucketUpper = 0;
    fmt::memory_buffer buckets;
    for (const auto& bucket : channel.buckets) {
        if (bucket.boundsError != 0) {
            HY_LOG_INFO(HYReportingDriverUtilityCategory, "Error in getting the bucket bounds : {}",
                        bucket.boundsError);
        } else {
            bucketLower = bucket.lower;
            bucketUpper = bucket.upper;
        }
        lower = std::min(lower, bucketLower);
        upper = std::max(upper, bucketUpper);
        if (bucket.hits != 0) {
            fmt::format_to(std::back_inserter(buckets), "{}-{}:{};", bucketLower, bucketUpper,
                           bucket.hits);
        }
    }
    if (buckets.size() == 0) {
        return;
    }
    driverStats.set(getDriverStatsKey(channel, "Histogram"),
                    fmt::format("count={},lower={},upper={},min={},max={},unit={}::{}",
                                channel.buckets.size(), lower, upper, channel.min, channel.max,
                                orNull(channel.unit),
                                std::string_view(buckets.data(), buckets.size() - 1)));
}

void HYReportingDriverUtility::processStateData(const HWReportChannel& channel,
                                                Dictionary& driverStats) {
    std::string text;
    for (const auto& state : channel.states) {
        if (state.residency != 0) {
            fmt::format_to(std::back_inserter(text),
                           "name:{},transition:{},residency:{},duty_cycle:{:f};",
                           orNull(state.name), state.transitions, state.residency, state.dutyCycle);
        }
    }
    HY_LOG_DEBUG(HYReportingDriverUtilityCategory, "the current reported data is : {}", text);
    // Kept: also without a resident state, unlike the other formats. That the channel
    // was there is told as well.
    driverStats.set(getDriverStatsKey(channel, "State"), text);
}

std::string HYReportingDriverUtility::getDriverStatsKey(const HWReportChannel& channel,
                                                        std::string_view type) {
    std::string key;
    if (channel.driver) {
        appendCleaned(key, channel.driver->substr(0, channel.driver->find('<')));
        key += '_';
    }
    for (const auto& part : {channel.group, channel.subGroup}) {
        if (part) {
            appendCleaned(key, *part);
            key += '_';
        }
    }
    key.append(type).append("_");
    appendCleaned(key, channel.name.value_or(""));
    return key;
}

} // namespace halyard
