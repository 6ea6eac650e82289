// Glitches summed up: by application, device, cause or hour.
//
// However many names there are, what is kept is bounded: beyond the first names, all
// others count as one. Not thread-safe.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "reading/Glitches.h"

namespace halyard::reading {

struct GlitchSum {
    std::uint64_t glitches = 0;
    double seconds = 0; // silent, all together
    double longest = 0;

    void add(const Glitch& glitch);
};

enum class GlitchKey : std::uint8_t { Application, Device, Cause, Hour };

class GlitchTally {
public:
    struct Entry {
        std::optional<std::string> name; // none: not known; empty for hours
        bool isOthers = false;
        double hour = 0; // when it began, of GlitchKey::Hour
        GlitchSum sum;
    };

    explicit GlitchTally(GlitchKey by) : by_(by) {}

    void add(const Glitch& glitch);
    // Hours in their order, everything else by falling numbers.
    std::vector<Entry> entries() const;

private:
    static constexpr std::size_t kMostNames = 5000;

    std::string keyOf(const Glitch& glitch) const;

    const GlitchKey by_;
    std::unordered_map<std::string, Entry> sums_;
};

// The beginning of its hour on the device's clock, as seconds since 1970.
double hourOf(double seconds);

} // namespace halyard::reading
