// The shared helpers that ask the platform: process names, the kind of build,
// and waiting for an asynchronous completion. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "common/LogCategory.h"
#include "platform/Condition.h"
#include "platform/Device.h"

namespace halyard {

// The daemon's own name for its own pid, the kernel's short command name for
// another process, none when there is no such process.
std::optional<std::string> HYReportingUtilityProcessNameForPID(std::int32_t pid);
// False, and `info` untouched, when there is no such process.
[[nodiscard]] bool HYReportingUtilityProcessInfoForPID(std::int32_t pid,
                                                       platform::ProcessInfo& info);

// The device property "InternalBuild"; what the device answered first stays.
bool HYReportingUtilityIsInternalBuild();

// Waits until *done is set. Each wake-up without the flag grants a fresh
// `timeout` (in seconds). False when one ran out. *done is read under the
// condition's lock only.
[[nodiscard]] bool HYReportingUtilityWait(platform::Condition& condition, double timeout,
                                          const bool* done, std::string_view waitMessage,
                                          std::string_view timeoutMessage, LogCategory category);
// Sets *done and wakes one waiter.
void HYReportingUtilitySignal(platform::Condition& condition, bool* done);

} // namespace halyard
