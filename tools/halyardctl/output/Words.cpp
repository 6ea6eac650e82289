#include "output/Words.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <ctime>
#include <fmt/chrono.h>
#include <fmt/format.h>
#include <limits>

#include "common/HYReportingUtility.h"

namespace halyard::ctl {
namespace {

// Outside of these a year has no four digits.
constexpr double kFirstSecond = -62135596800;
constexpr double kLastSecond = 253402300799;

constexpr AudioEventCategory kGroups[] = {
    0,
    kAudioEventCategoryGroupMIDI,
    kAudioEventCategoryGroupSession,
    kAudioEventCategoryGroupDSP,
    kAudioEventCategoryGroupHAL,
    kAudioEventCategoryGroupRouting,
    kAudioEventCategoryGroupToolbox,
};

std::optional<std::tm> localTime(double seconds) {
    if (!(seconds >= kFirstSecond && seconds <= kLastSecond)) {
        return std::nullopt;
    }
    const auto whole = static_cast<std::time_t>(std::floor(seconds));
    std::tm local{};
    ::localtime_r(&whole, &local);
    return local;
}

bool sameLetters(std::string_view left, std::string_view right) {
    const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? c - 'A' + 'a' : c; };
    return std::equal(left.begin(), left.end(), right.begin(), right.end(),
                      [&](char a, char b) { return lower(a) == lower(b); });
}

std::optional<std::uint32_t> number(std::string_view text, std::uint32_t most) {
    const bool hexadecimal = text.starts_with("0x") || text.starts_with("0X");
    text.remove_prefix(hexadecimal ? 2 : 0);
    std::uint32_t value = 0;
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, value, hexadecimal ? 16 : 10);
    return result.ec == std::errc() && result.ptr == end && value <= most ? std::optional(value)
                                                                          : std::nullopt;
}

} // namespace

std::string dayAndTime(std::optional<double> seconds) {
    const auto local = seconds ? localTime(*seconds) : std::nullopt;
    return local ? fmt::format("{:%Y-%m-%d %H:%M:%S}", *local) : std::string();
}

std::string timeOfDay(double seconds) {
    // Tenths, and no carry into the next second.
    const double tenths = std::floor(seconds * 10);
    const auto local = localTime(tenths / 10);
    const auto tenth = static_cast<int>(tenths - std::floor(tenths / 10) * 10);
    return local ? fmt::format("{:%H:%M:%S}.{}", *local, tenth) : std::string();
}

std::string dayOf(double seconds) {
    const auto local = localTime(seconds);
    return local ? fmt::format("{} {:%B %Y}", local->tm_mday, *local) : std::string();
}

std::string lengthOfTime(double seconds) {
    if (!std::isfinite(seconds)) {
        return "-";
    }
    if (std::abs(seconds) < 1) {
        return fmt::format("{:.0f} ms", seconds * 1000);
    }
    if (std::abs(seconds) < 60) {
        return fmt::format("{:.1f} s", seconds);
    }
    constexpr double kMost = 1e15;
    const auto whole = static_cast<std::int64_t>(std::clamp(seconds, -kMost, kMost));
    if (whole < 3600) {
        return fmt::format("{} min {} s", whole / 60, whole % 60);
    }
    return fmt::format("{} h {} min", whole / 3600, whole / 60 % 60);
}

std::string sizeOf(std::uint64_t bytes) {
    constexpr std::array<std::string_view, 4> kUnits = {"KiB", "MiB", "GiB", "TiB"};
    if (bytes < 1024) {
        return fmt::format("{} bytes", bytes);
    }
    double size = static_cast<double>(bytes) / 1024;
    std::size_t unit = 0;
    for (; size >= 1024 && unit + 1 < kUnits.size(); ++unit) {
        size /= 1024;
    }
    return fmt::format("{:.1f} {}", size, kUnits[unit]);
}

std::string counted(std::uint64_t count, std::string_view one, std::string_view many) {
    return fmt::format("{} {}", count, count == 1 ? one : many);
}

std::optional<std::uint32_t> categoryOf(std::string_view text) {
    for (const AudioEventCategory group : kGroups) {
        for (AudioEventCategory low = 0; low <= kAudioEventCategoryHearingHealth; ++low) {
            if (sameLetters(text, HYReportingUtilityCategoryString(group | low))) {
                return group | low;
            }
        }
    }
    return number(text, std::numeric_limits<std::uint32_t>::max());
}

std::optional<std::uint16_t> typeOf(std::string_view text) {
    for (AudioEventType type = 0; type <= kAudioEventTypeState; ++type) {
        if (sameLetters(text, HYReportingUtilityTypeString(type))) {
            return static_cast<std::uint16_t>(type);
        }
    }
    if (sameLetters(text, HYReportingUtilityTypeString(kAudioEventTypeUnknown))) {
        return static_cast<std::uint16_t>(kAudioEventTypeUnknown);
    }
    const auto value = number(text, std::numeric_limits<std::uint16_t>::max());
    return value ? std::optional(static_cast<std::uint16_t>(*value)) : std::nullopt;
}

std::optional<std::uint16_t> serviceTypeOf(std::string_view text) {
    const AudioServiceType type = HYReportingUtilityGenerateServiceTypeFromServiceName(text);
    if (type != kAudioServiceTypeUnknown || text == "unknown") {
        return type;
    }
    const auto value = number(text, std::numeric_limits<std::uint16_t>::max());
    return value ? std::optional(static_cast<std::uint16_t>(*value)) : std::nullopt;
}

} // namespace halyard::ctl
