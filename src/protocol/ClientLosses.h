// Why a message got no further than its client: the reasons that client.dropped counts.
#pragma once

#include <array>
#include <cstdint>
#include <string_view>

namespace halyard::protocol {

enum class ClientLoss : std::uint8_t {
    QueueFull, // There was no room for it.
    Discarded, // It had room, and was given up for want of a daemon.
    TooLarge,
    Invalid,
};

// In their order.
inline constexpr std::array<std::string_view, 4> kClientLossNames = {"queue_full", "discarded",
                                                                     "too_large", "invalid"};

} // namespace halyard::protocol
