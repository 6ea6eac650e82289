#include "common/HYReportingUtility.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>
#include <vector>

namespace halyard {
namespace {

using namespace std::string_view_literals;

constexpr std::array kServiceNames = {
    "generic"sv,          "parlo"sv,         "telephony"sv,
    "haptics"sv,          "alarms"sv,        "standalone"sv,
    "soundautoconfig"sv,  "longformaudio"sv, "nonlongformaudio"sv,
    "audiodeviceusage"sv, "alerts"sv,        "test"sv,
    "apiusage"sv,         "systemsounds"sv,
};
constexpr std::string_view kUnknownServiceName = "unknown";

constexpr std::array kCategoryNames = {
    "Undefined"sv,
    "Generic"sv,
    "Record"sv,
    "Input"sv,
    "Playback"sv,
    "Output"sv,
    "PlaybackAndRecord"sv,
    "IO"sv,
    "Setup"sv,
    "ClientRequest"sv,
    "RouteChange"sv,
    "Error"sv,
    "HWReporting"sv,
    "Performance"sv,
    "Volume"sv,
    "HearingHealth"sv,
};

constexpr std::array kTypeNames = {
    "Generic"sv,
    "Start"sv,
    "Stop"sv,
    "Activate"sv,
    "Deactivate"sv,
    "Setup"sv,
    "Error"sv,
    "IssueDetector"sv,
    "EnergyLedger"sv,
    "AudioUnitUsage"sv,
    "MIDIDriver"sv,
    "Summary"sv,
    "HeadphoneAudioExposure"sv,
    "AudioExposure"sv,
    "Listeningenhancement"sv, // Kept: the small letter is in all reports out there.
    "Gaugewell"sv,
    "Simple"sv,
    "Histogram"sv,
    "State"sv,
};

std::string_view groupName(AudioEventCategory category) noexcept {
    switch (category & kAudioEventCategoryGroupMask) {
    case kAudioEventCategoryGroupMIDI:
        return "MIDI";
    case kAudioEventCategoryGroupSession:
        return "Session";
    case kAudioEventCategoryGroupDSP:
        return "DSP";
    case kAudioEventCategoryGroupHAL:
        return "HAL";
    case kAudioEventCategoryGroupRouting:
        return "Routing";
    case kAudioEventCategoryGroupToolbox:
        return "Toolbox";
    default:
        return {};
    }
}

bool isGrouped(AudioEventCategory category) noexcept {
    return category >= 0x00010000 && category <= 0xFFFFFFFE;
}

bool hasBlank(std::string_view key) noexcept {
    return key.find(' ') != std::string_view::npos;
}

std::string formatNumber(double value, std::uint32_t maximumFractionDigits) {
    constexpr std::uint32_t kMostDigits = 300; // no bucket needs more
    const std::uint32_t digits = std::min(maximumFractionDigits, kMostDigits);
    std::string text = fmt::format("{:.{}f}", value, digits);
    if (digits > 0) {
        const std::size_t shortest = text.size() - digits + 1;
        text.erase(std::max(shortest, text.find_last_not_of('0') + 1));
    }
    return text;
}

} // namespace

std::string_view HYReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType type) {
    if (type == kAudioServiceTypeUnknown) {
        return kUnknownServiceName;
    }
    // Kept: an unlisted type is called as type 2 is, by all who read the name.
    return kServiceNames[type < kServiceNames.size() ? type : kAudioServiceTypeTelephony];
}

AudioServiceType HYReportingUtilityGenerateServiceTypeFromServiceName(std::string_view name) {
    const auto found = std::find(kServiceNames.begin(), kServiceNames.end(), name);
    return found != kServiceNames.end()
               ? static_cast<AudioServiceType>(found - kServiceNames.begin())
               : kAudioServiceTypeUnknown;
}

CategoryName categoryName(AudioEventCategory category) noexcept {
    const AudioEventCategory low = category & ~kAudioEventCategoryGroupMask;
    const std::string_view name = kCategoryNames[low < kCategoryNames.size() ? low : 0];
    if (!isGrouped(category)) {
        return {{}, {}, name};
    }
    // Kept: the "_" also stands where the group has no name.
    return {groupName(category), "_", name};
}

void appendCategoryString(std::string& out, AudioEventCategory category) {
    const CategoryName parts = categoryName(category);
    out.append(parts.group).append(parts.separator).append(parts.name);
}

std::string HYReportingUtilityCategoryString(AudioEventCategory category) {
    std::string text;
    appendCategoryString(text, category);
    return text;
}

std::string_view HYReportingUtilityTypeString(AudioEventType type) {
    if (type == kAudioEventTypeUnknown) {
        return "Unknown";
    }
    return kTypeNames[type < kTypeNames.size() ? type : 0];
}

bool HYReportingUtilityIsABTestModeOn(AudioEventCategory category) {
    return isGrouped(category);
}

std::uint16_t
HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(AudioEventCategory category) {
    return static_cast<std::uint16_t>(category & 0xFFFF);
}

bool HYReportingUtilityShouldBatchRelayReportingEventsForServiceType(AudioServiceType type) {
    return type != kAudioServiceTypeAPIUsage;
}

double HYReportingUtilityVolumeMinimumPlayingTime(AudioServiceType) {
    return 0.5;
}

std::int64_t HYReportingUtilityExtractSessionIDFromReporterID(std::int64_t reporterID) {
    return reporterID;
}

bool HYReportingUtilityShouldSendMessage() {
    return true;
}

bool HYReportingUtilityAllowSessionTransactions() {
    return true;
}

Value HYReportingUtilityRetrieveAppName(const Dictionary& configuration) {
    const Value* name = configuration.find("HostApplicationDisplayID");
    return name != nullptr ? *name : Value("Unknown");
}

Dictionary HYReportingUtilityAddAudioMessageTag(Dictionary message, AudioEventCategory category,
                                                AudioEventType type) {
    fmt::basic_memory_buffer<char, 64> tag;
    const CategoryName parts = categoryName(category);
    for (const std::string_view part :
         {parts.group, parts.separator, parts.name, HYReportingUtilityTypeString(type)}) {
        tag.append(part);
    }
    message.set("audiotag", std::string_view(tag.data(), tag.size()));
    return message;
}

Dictionary HYReportingUtilityRemoveWhiteSpaceFromKeys(Dictionary dictionary) {
    if (std::none_of(dictionary.begin(), dictionary.end(),
                     [](const auto& entry) { return hasBlank(entry.key.text()); })) {
        return dictionary;
    }
    std::vector<Dictionary::Entry> entries(dictionary.begin(), dictionary.end());
    for (auto& entry : entries) {
        if (hasBlank(entry.key.text())) {
            std::string key(entry.key.text());
            std::replace(key.begin(), key.end(), ' ', '_');
            entry.key = key;
        }
    }
    return Dictionary(std::move(entries));
}

double HYReportingUtilityRoundWithPlaces(double value, std::int32_t places) {
    const double power = std::pow(10.0, places);
    return std::round(value * power) / power;
}

std::optional<std::string> HYReportingUtilityBucketNumberToString(double value,
                                                                  std::span<const double> buckets,
                                                                  std::uint32_t fractionDigits) {
    double previousDistance = -1;
    std::optional<double> chosen;
    for (const double bucket : buckets) {
        const double distance = std::abs(value - bucket);
        // Kept: an equal distance does not stop, so of two the larger bucket counts.
        if (previousDistance >= 0 && distance > previousDistance) {
            break;
        }
        chosen = bucket;
        previousDistance = distance;
    }
    if (!chosen) {
        return std::nullopt;
    }
    return formatNumber(*chosen, fractionDigits);
}

} // namespace halyard
