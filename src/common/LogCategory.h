// The log areas of the service and the levels of a line.
#pragma once

#include <cstdint>
#include <string_view>

namespace halyard {

inline constexpr std::string_view kLogSubsystem = "com.kestrel.halyard";

// What `journalctl CATEGORY=` filters by.
using LogCategory = std::string_view;

inline constexpr LogCategory HYReportingClientCategory = "hyrc";
inline constexpr LogCategory HYReportingServiceDelegateCategory = "hyrs";
inline constexpr LogCategory HYReportingSessionCategory = "hyrr";
inline constexpr LogCategory HYReportingSessionRelayReportingCategory = "hyri";
inline constexpr LogCategory HYReportingDriverUtilityCategory = "hyrd";
inline constexpr LogCategory HYReportingTraceCategory = "hyrt";
inline constexpr LogCategory HYReportingEnergyLedgerCategory = "hyrp";
inline constexpr LogCategory HYReportingTMXLogCategory = "hyra";
inline constexpr LogCategory HYReportingIBXLogCategory = "hyrb";
// The adapters' own lines: socket, store, configuration.
inline constexpr LogCategory HYReportingPlatformCategory = "hyrx";

enum class LogLevel : std::uint8_t { Debug, Info, Default, Error };

} // namespace halyard
