// Times, lengths and sizes as people say them; names as the daemon prints them.
//
// Free functions; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace halyard::ctl {

// "2026-11-22 14:03:12", local time; empty for none.
std::string dayAndTime(std::optional<double> seconds);
// "14:03:12.4", local time.
std::string timeOfDay(double seconds);
// "22 November 2026", local.
std::string dayOf(double seconds);

// "320 ms", "4.2 s", "12 min 5 s", "3 h 20 min".
std::string lengthOfTime(double seconds);
// "12.3 MiB"
std::string sizeOf(std::uint64_t bytes);
// "1 glitch", "2 glitches".
std::string counted(std::uint64_t count, std::string_view one, std::string_view many);

// The number of a category or type, or of one by its printed name, whatever the case
// of its letters. None for what is neither.
std::optional<std::uint32_t> categoryOf(std::string_view text);
std::optional<std::uint16_t> typeOf(std::string_view text);
std::optional<std::uint16_t> serviceTypeOf(std::string_view text);

} // namespace halyard::ctl
