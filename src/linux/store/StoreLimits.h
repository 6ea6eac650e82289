// How much the store keeps, and for how long. A plain value.
#pragma once

#include <chrono>
#include <cstdint>

namespace halyard::linux_ {

struct StoreLimits {
    static constexpr std::uint64_t kLeastBytes = 256 * 1024;

    std::uint64_t maxBytes = 256 * 1024 * 1024; // at least kLeastBytes
    std::chrono::seconds maxAge = std::chrono::days(7);

    bool operator==(const StoreLimits&) const = default;
};

} // namespace halyard::linux_
