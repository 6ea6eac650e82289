// What a session derives from its batch when it stops: a volume event for each
// stretch of playback at one volume, and one summary of all that was said.
//
// Pure functions; any thread.
#pragma once

#include <optional>
#include <vector>

#include "common/HYReportingUtility.h"
#include "common/Value.h"
#include "session/MessageBatch.h"

namespace halyard {

inline constexpr const char* HYReportingMessageKeySelectedFormat = "session_selected_format";
inline constexpr const char* HYReportingMessageKeyActiveDevices = "active_devices";
inline constexpr const char* HYReportingMessageKeyVolumeProcess = "VQSessionVolumeOperationProcess";
inline constexpr const char* HYReportingMessageKeyVolume = "VQSessionVolume";
inline constexpr const char* HYReportingMessageKeyPlayingState = "VQSessionVolumePlayingState";
inline constexpr const char* HYReportingMessageKeyHYTimestamp = "hyreporting_timestamp";

// One event for each stretch that lasted longer than `minimumPlaytime` seconds.
// A stretch that still plays at the end has none: nothing says when it ended.
// Format, devices and process are those seen last before its end.
std::vector<Dictionary> createVolumeEvents(const std::vector<MessageBatch::Entry>& batch,
                                           double minimumPlaytime);

// Every key of the batch with all its values, in their order, joined by ",".
// None for an empty batch.
std::optional<Dictionary> createSummaryEvent(const std::vector<MessageBatch::Entry>& batch,
                                             AudioServiceType serviceType);

} // namespace halyard
