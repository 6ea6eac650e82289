// A statistics channel as an operator orders it: what it is called, and where its
// numbers come from. A plain value.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace halyard::linux_ {

enum class ChannelFormat : std::uint8_t { Simple, State, Histogram };
inline constexpr std::pair<std::string_view, ChannelFormat> kChannelFormats[] = {
    {"simple", ChannelFormat::Simple},
    {"state", ChannelFormat::State},
    {"histogram", ChannelFormat::Histogram}};

// Beside the built-in ones. At least one of group and subgroup is there.
struct DriverChannel {
    std::optional<std::string> group;
    std::optional<std::string> subgroup;
    std::string driver;
    std::string name; // not empty
    std::string unit;
    ChannelFormat format = ChannelFormat::Simple;
    std::string source; // "SCHEME:REST", neither part empty

    bool operator==(const DriverChannel&) const = default;
};

inline constexpr std::size_t kMaxDriverChannels = 1024;

// What is left of a name where statistics are reported: "Pad 2" and "Pad2" are one
// there.
inline std::string asInKeys(std::string name) {
    std::erase_if(name, [](char character) { return character == ' ' || character == '_'; });
    return name;
}

} // namespace halyard::linux_
