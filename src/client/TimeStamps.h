// The three time stamps that every message carries.
//
// They are written straight as MessagePack entries into the record of a message,
// at the moment of the call: two clock reads and some 80 bytes, no allocation.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace halyard::client {

// Where the client's time comes from. Any thread; must not block.
class Clock {
public:
    virtual ~Clock() = default;
    virtual std::int64_t realNanoseconds() const noexcept = 0; // since 1970
    virtual std::int64_t bootNanoseconds() const noexcept = 0; // since boot, sleep included
    // The value of bootNanoseconds() at the start of this process.
    virtual std::int64_t processStartNanoseconds() const noexcept = 0;
};

// The system's clocks; lives as long as the process.
const Clock& systemClock();

// A set of the three stamps, as bits.
using StampSet = std::uint8_t;
inline constexpr StampSet kNoStamps = 0;
inline constexpr StampSet kAllStamps = 7;
inline constexpr std::size_t kMaxStampBytes = 96;

// The bit of the stamp named `key`; kNoStamps for every other key.
StampSet stampNamed(std::string_view key) noexcept;

struct Stamps {
    std::size_t bytes = 0;
    std::uint32_t entries = 0;
};
// Writes the entries that are not in `present`. Requires kMaxStampBytes of room.
Stamps writeMissingStamps(char* out, StampSet present, const Clock& clock) noexcept;

} // namespace halyard::client
