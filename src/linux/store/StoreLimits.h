// How much the store keeps, for how long, and how soon. A plain value.
#pragma once

#include <chrono>
#include <cstdint>

namespace halyard::linux_ {

struct StoreLimits {
    static constexpr std::uint64_t kLeastBytes = 256 * 1024;
    static constexpr std::chrono::milliseconds kLeastSyncInterval{50};
    static constexpr std::chrono::milliseconds kLargestSyncInterval = std::chrono::minutes(10);

    std::uint64_t maxBytes = 256 * 1024 * 1024; // at least kLeastBytes
    std::chrono::seconds maxAge = std::chrono::days(7);
    // How long what was accepted may wait for the disk.
    std::chrono::milliseconds syncInterval = kLeastSyncInterval;

    bool operator==(const StoreLimits&) const = default;
};

} // namespace halyard::linux_
