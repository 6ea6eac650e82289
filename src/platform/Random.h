#pragma once

#include <cstdint>

namespace halyard::platform {

class Random {
public:
    virtual ~Random() = default;
    // Uniform over 0 to bound - 1. Requires bound > 0. Any thread.
    virtual std::uint32_t uniform(std::uint32_t bound) = 0;
};

} // namespace halyard::platform
