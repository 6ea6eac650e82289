#include "linux/config/Quantities.h"

#include <charconv>
#include <limits>
#include <span>

namespace halyard::linux_ {
namespace {

struct Unit {
    std::string_view name;
    std::uint64_t factor;
};

constexpr Unit kByteUnits[] = {
    {"", 1}, {"B", 1}, {"KiB", kKiB}, {"MiB", kMiB}, {"GiB", kMiB* kKiB}, {"TiB", kMiB* kMiB},
};
constexpr Unit kTimeUnits[] = {{"s", 1}, {"m", 60}, {"h", 3600}, {"d", 86400}};

std::optional<std::uint64_t> parseAmount(std::string_view text, std::span<const Unit> units,
                                         std::uint64_t most) {
    std::uint64_t number = 0;
    const char* const end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, number);
    if (error != std::errc()) {
        return std::nullopt;
    }
    const std::string_view name(rest, static_cast<std::size_t>(end - rest));
    for (const Unit& unit : units) {
        if (unit.name == name) {
            return number <= most / unit.factor ? std::optional(number * unit.factor)
                                                : std::nullopt;
        }
    }
    return std::nullopt;
}

} // namespace

std::optional<std::uint64_t> parseByteSize(std::string_view text) {
    return parseAmount(text, kByteUnits, std::numeric_limits<std::int64_t>::max());
}

std::optional<std::chrono::milliseconds> parseInterval(std::string_view text) {
    static constexpr Unit kMilliseconds[] = {{"ms", 1}};
    if (const auto fine =
            parseAmount(text, kMilliseconds, static_cast<std::uint64_t>(kMaxDuration.count()))) {
        return std::chrono::milliseconds(*fine);
    }
    const auto coarse = parseDuration(text);
    return coarse ? std::optional<std::chrono::milliseconds>(*coarse) : std::nullopt;
}

std::optional<std::chrono::seconds> parseDuration(std::string_view text) {
    const auto seconds =
        parseAmount(text, kTimeUnits, static_cast<std::uint64_t>(kMaxDuration.count()));
    if (!seconds) {
        return std::nullopt;
    }
    return std::chrono::seconds(*seconds);
}

} // namespace halyard::linux_
