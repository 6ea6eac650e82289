// The shared, counted blocks behind Value. Private to common/.
#pragma once

#include <atomic>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "common/Value.h"

namespace halyard::detail {

struct Counted {
    // A block whose count is kImmortal is never freed and never written again,
    // so threads share it without passing a cache line to and fro.
    static constexpr std::uint32_t kImmortal = 0xFFFFFFFF;

    std::atomic<std::uint32_t> references{1};

    void retain() noexcept {
        if (references.load(std::memory_order_relaxed) != kImmortal) {
            references.fetch_add(1, std::memory_order_relaxed);
        }
    }
    // True when the caller held the last reference and must free the block.
    [[nodiscard]] bool release() noexcept {
        return references.load(std::memory_order_relaxed) != kImmortal &&
               references.fetch_sub(1, std::memory_order_acq_rel) == 1;
    }
    bool isShared() const noexcept { return references.load(std::memory_order_acquire) != 1; }
};

// Followed in memory by `length` bytes.
struct StringBlock : Counted {
    std::uint32_t length = 0;

    char* bytes() noexcept { return reinterpret_cast<char*>(this + 1); }
    std::string_view view() noexcept { return {bytes(), length}; }

    static StringBlock* make(std::string_view text);
    static void free(StringBlock* block) noexcept;
};

struct ListBlock : Counted {
    std::vector<Value> items;
};

struct DictionaryBlock : Counted {
    std::vector<Dictionary::Entry> entries;
    // Positions in `entries` sorted by key; kept only above kIndexedAbove.
    std::vector<std::uint32_t> order;

    const Dictionary::Entry* find(std::string_view key) const noexcept;
    // Where `key` stands in `order`, or where it would have to be inserted.
    std::size_t lowerBound(std::string_view key) const noexcept;
    // Of the first `size` entries; `size` when the key is none of theirs.
    std::size_t indexOf(std::string_view key, std::size_t size) const noexcept;
    // Requires that no key stands twice in `others`.
    void merge(std::span<const Dictionary::Entry> others);
    void removeDuplicatesAndNone();
    void rebuildOrder();
};

} // namespace halyard::detail
