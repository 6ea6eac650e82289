#include "platform/HYReportingUtilityDevice.h"

#include "common/Utf8.h"
#include "platform/Log.h"
#include "platform/Platform.h"

namespace halyard {
namespace {

std::chrono::nanoseconds nanosecondsOf(double seconds) {
    // Far beyond any wait, far inside the range of the clock's arithmetic.
    constexpr double kLongest = 1e9;
    if (!(seconds > 0)) {
        return std::chrono::nanoseconds(0);
    }
    return std::chrono::duration_cast<std::chrono::nanoseconds>(
        std::chrono::duration<double>(seconds < kLongest ? seconds : kLongest));
}

} // namespace

std::optional<std::string> HYReportingUtilityProcessNameForPID(std::int32_t pid) {
    const auto& own = *platform::current().ownProcess;
    if (pid == own.pid()) {
        return own.name();
    }
    platform::ProcessInfo info;
    if (pid < 1 || !HYReportingUtilityProcessInfoForPID(pid, info)) {
        return std::nullopt;
    }
    // The kernel cuts names by bytes, and so perhaps inside a character.
    return replaceInvalidUtf8(info.shortCommandName);
}

bool HYReportingUtilityProcessInfoForPID(std::int32_t pid, platform::ProcessInfo& info) {
    auto found = platform::current().processTable->infoForPID(pid);
    if (found) {
        info = std::move(*found);
    }
    return found.has_value();
}

bool HYReportingUtilityIsInternalBuild() {
    const platform::Platform& system = platform::current();
    return system.buildKind.isInternal(*system.deviceProperties);
}

bool HYReportingUtilityWait(platform::Condition& condition, double timeout, const bool* done,
                            std::string_view waitMessage, std::string_view timeoutMessage,
                            LogCategory category) {
    const std::lock_guard lock(condition);
    while (!*done) {
        HY_LOG_INFO(category, "{}", waitMessage);
        // Kept: each wake-up grants the whole time again.
        if (!condition.waitFor(nanosecondsOf(timeout))) {
            HY_LOG_ERROR(category, "{}", timeoutMessage);
            return false;
        }
        HY_LOG_INFO(category, "continuing");
    }
    return true;
}

void HYReportingUtilitySignal(platform::Condition& condition, bool* done) {
    const std::lock_guard lock(condition);
    *done = true;
    condition.signal();
}

} // namespace halyard
