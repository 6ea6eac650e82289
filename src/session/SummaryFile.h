// The file that internal builds write when a session stops: the whole batch.
//
// Pure functions; any thread.
#pragma once

#include <chrono>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Clock.h"
#include "session/MessageBatch.h"

namespace halyard {

// The platform maps it to where this system keeps logs.
inline constexpr const char* HYReportingLogsDirectory =
    "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio/Reporting";
inline constexpr const char* HYReportingPerfProjectName = "halyard";

// "20240229-130509+0100-halyard-APPLICATION-SERVICE.json". Application and
// service become one safe path component each.
std::string summaryFileName(platform::WallTime time, std::chrono::seconds utcOffset,
                            std::string_view application, std::string_view service);

// The batch as a list of {identifier: message}.
Value summaryFileContents(const std::vector<MessageBatch::Entry>& batch);

// `text` as a file name that means nothing else to a file system: no separators,
// control characters or leading dots, at most 80 bytes, never empty.
std::string safePathComponent(std::string_view text);

} // namespace halyard
