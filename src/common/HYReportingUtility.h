// The shared vocabulary of sessions, clients and sinks (service types, message
// categories and types, with their names) and the small rules that all of them
// ask about it.
//
// Free functions without state; any thread.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "common/Value.h"

namespace halyard {

// What a session reports for. Any number may come in from a client, which is why
// this is no enumeration.
using AudioServiceType = std::uint16_t;

inline constexpr AudioServiceType kAudioServiceTypeGeneric = 0;
inline constexpr AudioServiceType kAudioServiceTypeParlo = 1;
inline constexpr AudioServiceType kAudioServiceTypeTelephony = 2;
inline constexpr AudioServiceType kAudioServiceTypeHaptics = 3;
inline constexpr AudioServiceType kAudioServiceTypeAlarms = 4;
inline constexpr AudioServiceType kAudioServiceTypeStandalone = 5;
inline constexpr AudioServiceType kAudioServiceTypeSoundAutoConfig = 6;
inline constexpr AudioServiceType kAudioServiceTypeLongFormAudio = 7;
inline constexpr AudioServiceType kAudioServiceTypeNonLongFormAudio = 8;
inline constexpr AudioServiceType kAudioServiceTypeAudioDeviceUsage = 9;
inline constexpr AudioServiceType kAudioServiceTypeAlerts = 10;
inline constexpr AudioServiceType kAudioServiceTypeTest = 11;
inline constexpr AudioServiceType kAudioServiceTypeAPIUsage = 12;
inline constexpr AudioServiceType kAudioServiceTypeSystemSounds = 13;
inline constexpr AudioServiceType kAudioServiceTypeUnknown = 65535;

// The low half is the category proper, the high half an optional group.
using AudioEventCategory = std::uint32_t;

inline constexpr AudioEventCategory kAudioEventCategoryUndefined = 0;
inline constexpr AudioEventCategory kAudioEventCategoryGeneric = 1;
inline constexpr AudioEventCategory kAudioEventCategoryRecord = 2;
inline constexpr AudioEventCategory kAudioEventCategoryInput = 3;
inline constexpr AudioEventCategory kAudioEventCategoryPlayback = 4;
inline constexpr AudioEventCategory kAudioEventCategoryOutput = 5;
inline constexpr AudioEventCategory kAudioEventCategoryPlaybackAndRecord = 6;
inline constexpr AudioEventCategory kAudioEventCategoryIO = 7;
inline constexpr AudioEventCategory kAudioEventCategorySetup = 8;
inline constexpr AudioEventCategory kAudioEventCategoryClientRequest = 9;
inline constexpr AudioEventCategory kAudioEventCategoryRouteChange = 10;
inline constexpr AudioEventCategory kAudioEventCategoryError = 11;
inline constexpr AudioEventCategory kAudioEventCategoryHWReporting = 12;
inline constexpr AudioEventCategory kAudioEventCategoryPerformance = 13;
inline constexpr AudioEventCategory kAudioEventCategoryVolume = 14;
inline constexpr AudioEventCategory kAudioEventCategoryHearingHealth = 15;

inline constexpr AudioEventCategory kAudioEventCategoryGroupMask = 0xFFFF0000;
inline constexpr AudioEventCategory kAudioEventCategoryGroupMIDI = 0x04000000;
inline constexpr AudioEventCategory kAudioEventCategoryGroupSession = 0x08000000;
inline constexpr AudioEventCategory kAudioEventCategoryGroupDSP = 0x10000000;
inline constexpr AudioEventCategory kAudioEventCategoryGroupHAL = 0x20000000;
inline constexpr AudioEventCategory kAudioEventCategoryGroupRouting = 0x40000000;
inline constexpr AudioEventCategory kAudioEventCategoryGroupToolbox = 0x80000000;

using AudioEventType = std::uint32_t;

inline constexpr AudioEventType kAudioEventTypeStart = 1;
inline constexpr AudioEventType kAudioEventTypeStop = 2;
inline constexpr AudioEventType kAudioEventTypeActivate = 3;
inline constexpr AudioEventType kAudioEventTypeDeactivate = 4;
inline constexpr AudioEventType kAudioEventTypeSetup = 5;
inline constexpr AudioEventType kAudioEventTypeError = 6;
inline constexpr AudioEventType kAudioEventTypeIssueDetector = 7;
inline constexpr AudioEventType kAudioEventTypeEnergyLedger = 8;
inline constexpr AudioEventType kAudioEventTypeAudioUnitUsage = 9;
inline constexpr AudioEventType kAudioEventTypeMIDIDriver = 10;
inline constexpr AudioEventType kAudioEventTypeSummary = 11;
inline constexpr AudioEventType kAudioEventTypeHeadphoneAudioExposure = 12;
inline constexpr AudioEventType kAudioEventTypeAudioExposure = 13;
inline constexpr AudioEventType kAudioEventTypeListeningEnhancement = 14;
inline constexpr AudioEventType kAudioEventTypeGaugewell = 15;
inline constexpr AudioEventType kAudioEventTypeSimple = 16;
inline constexpr AudioEventType kAudioEventTypeHistogram = 17;
inline constexpr AudioEventType kAudioEventTypeState = 18;
inline constexpr AudioEventType kAudioEventTypeUnknown = 65535;

// An unlisted type is reported as "telephony", only 65535 as "unknown".
std::string_view HYReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType type);
// 65535 for a name that is not one of the listed ones, letter for letter.
AudioServiceType HYReportingUtilityGenerateServiceTypeFromServiceName(std::string_view name);

// "Playback", "DSP_IO"; a grouped category of no known group has the "_" alone.
std::string HYReportingUtilityCategoryString(AudioEventCategory category);
// The same text in its three parts, for callers that must not allocate.
struct CategoryName {
    std::string_view group;     // may be empty
    std::string_view separator; // "_" or empty
    std::string_view name;
};
CategoryName categoryName(AudioEventCategory category) noexcept;
// Appends the category's text to `out`.
void appendCategoryString(std::string& out, AudioEventCategory category);

std::string_view HYReportingUtilityTypeString(AudioEventType type);

// Whether the category is grouped, which marks the message of an A/B test.
bool HYReportingUtilityIsABTestModeOn(AudioEventCategory category);
std::uint16_t HYReportingUtilityRetrieveRelayReportingCategoryFromCategory(AudioEventCategory);
bool HYReportingUtilityShouldBatchRelayReportingEventsForServiceType(AudioServiceType type);
// Seconds.
double HYReportingUtilityVolumeMinimumPlayingTime(AudioServiceType type);
// A reporter ID is the session ID; asking here keeps callers from assuming it.
std::int64_t HYReportingUtilityExtractSessionIDFromReporterID(std::int64_t reporterID);
bool HYReportingUtilityShouldSendMessage();
bool HYReportingUtilityAllowSessionTransactions();

// The value under "HostApplicationDisplayID", or "Unknown".
Value HYReportingUtilityRetrieveAppName(const Dictionary& configuration);
// `message` with "audiotag" set to the category's and the type's text. Copies
// the entries, not what they refer to.
Dictionary HYReportingUtilityAddAudioMessageTag(Dictionary message, AudioEventCategory category,
                                                AudioEventType type);
// Every blank in a key becomes "_"; of keys that become equal the later one
// wins. Returns the same shared dictionary when no key holds a blank.
Dictionary HYReportingUtilityRemoveWhiteSpaceFromKeys(Dictionary dictionary);

// Half away from zero; negative places round to tens, hundreds and so on.
double HYReportingUtilityRoundWithPlaces(double value, std::int32_t places);

// Seconds.
inline constexpr std::array<double, 11> HYReportingUtilityBucketNumberToStringTimes = {
    0, 1, 5, 10, 30, 60, 300, 1800, 3600, 7200, 18000};
inline constexpr std::array<double, 17> HYReportingUtilityBucketNumberToStringVolumes = {
    0.0,    0.0625, 0.125,  0.1875, 0.25,   0.3125, 0.375,  0.4375, 0.5,
    0.5625, 0.625,  0.6875, 0.75,   0.8125, 0.875,  0.9375, 1.0};

// The nearest bucket as text with up to `fractionDigits` digits (half-even, "."
// in every locale), at least one where any are allowed. The larger bucket wins a
// tie. None without buckets. Requires ascending buckets.
std::optional<std::string> HYReportingUtilityBucketNumberToString(double value,
                                                                  std::span<const double> buckets,
                                                                  std::uint32_t fractionDigits);

} // namespace halyard
