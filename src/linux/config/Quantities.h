// Amounts as operators write them in a configuration file. Pure; any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string_view>

namespace halyard::linux_ {

inline constexpr std::uint64_t kKiB = 1024;
inline constexpr std::uint64_t kMiB = 1024 * kKiB;

// The longest duration that is taken: a hundred years, which every clock type
// of ours holds in nanoseconds.
inline constexpr std::chrono::seconds kMaxDuration = std::chrono::hours(24) * 36500;

// "4096", "4096B", "256MiB"; units up to TiB. None when it is no such text or
// does not fit 63 bits.
[[nodiscard]] std::optional<std::uint64_t> parseByteSize(std::string_view text);

// "7d", "12h", "30m", "45s": one whole number with its unit. None when it is no
// such text or longer than kMaxDuration.
[[nodiscard]] std::optional<std::chrono::seconds> parseDuration(std::string_view text);

// The same in milliseconds, which may be the unit as well: "50ms".
[[nodiscard]] std::optional<std::chrono::milliseconds> parseInterval(std::string_view text);

} // namespace halyard::linux_
