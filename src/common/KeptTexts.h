// Texts that will be asked for again soon, by the address of what they say: as many as
// find room, until all are forgotten.
//
// Whoever keeps a text sees to it that nothing else comes to lie at that address before.
//
// Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

namespace halyard {

class KeptTexts {
public:
    static constexpr std::size_t kMostTexts = 2048;
    static constexpr std::size_t kMostBytes = std::size_t{1024} * 1024;

    // Empty when there is none. Valid until the next is kept.
    std::string_view find(const void* of) const noexcept;
    // Requires that there is none. It is not kept when there is no room.
    void keep(const void* of, std::string_view text);
    // Room for many goes with the first few that need less.
    void forget();

private:
    // As small as can be: looking for one is a cache miss.
    struct Slot {
        const void* of = nullptr;
        std::uint32_t at = 0;    // of the length, and the text behind it
        std::uint32_t round = 0; // A slot of an earlier one is empty.
    };

    std::size_t slotOf(const void* of) const noexcept;

    std::vector<Slot> slots_;
    std::vector<char> texts_;
    std::size_t count_ = 0;
    std::uint32_t round_ = 1;
};

} // namespace halyard
