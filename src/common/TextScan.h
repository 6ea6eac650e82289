// Looking for the few bytes of a text that cannot be written as they are, eight at a time.
#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace halyard {

// How many bytes stand before the first control byte (below 0x20) or one of `Special`.
// Requires that those are ASCII.
template <char... Special> std::size_t plainLength(std::string_view text) noexcept {
    constexpr std::uint64_t kEach = 0x0101010101010101U;
    constexpr std::uint64_t kHighs = 0x80 * kEach;
    // The high bit of each byte that is one; of those above the first it may be wrong.
    const auto marks = [](std::uint64_t word) {
        const auto zeros = [](std::uint64_t bytes) { return (bytes - kEach) & ~bytes; };
        std::uint64_t marked = (word - 0x20 * kEach) & ~word;
        ((marked |= zeros(word ^ (static_cast<unsigned char>(Special) * kEach))), ...);
        return marked & kHighs;
    };
    const auto first = [](std::uint64_t marked) {
        return static_cast<std::size_t>(std::countr_zero(marked)) / 8;
    };
    std::size_t at = 0;
    while (at < text.size()) {
        const std::size_t length = text.size() - at < 8 ? text.size() - at : 8;
        std::uint64_t word = 0; // What is missing at its end is found, and is the end.
        std::memcpy(&word, text.data() + at, length);
        if constexpr (std::endian::native == std::endian::big) {
            word = __builtin_bswap64(word);
        }
        if (const std::uint64_t marked = marks(word); marked != 0) {
            return at + first(marked);
        }
        at += 8;
    }
    return text.size();
}

} // namespace halyard
