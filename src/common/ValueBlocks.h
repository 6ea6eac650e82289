// The shared, counted blocks behind Value, and what of Value, List and Dictionary is so
// short that a call would cost more. Included by Value.h, and private to common/.
//
// Each block is one allocation: its items or entries follow it in memory.
#pragma once

#include <atomic>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "common/Value.h"

namespace halyard {
namespace detail {

// Followed by `length` bytes.
struct StringBlock : Counted {
    std::uint32_t length = 0;

    char* bytes() noexcept { return reinterpret_cast<char*>(this + 1); }
    std::string_view view() noexcept { return {bytes(), length}; }

    static StringBlock* make(std::string_view text);
    static void free(StringBlock* block) noexcept;
};

struct alignas(Value) ListBlock : Counted {
    std::uint32_t size = 0;
    const std::uint32_t capacity;

    explicit ListBlock(std::uint32_t room) noexcept : capacity(room) {}
    Value* items() noexcept { return reinterpret_cast<Value*>(this + 1); }
    // Requires room.
    void add(Value&& item) noexcept { new (items() + size++) Value(std::move(item)); }

    static ListBlock* make(std::size_t capacity);
    static void free(ListBlock* block) noexcept;
};

// A dictionary sees the first entries of its block, as many as it knows of. So one that is
// shared may be given another entry behind them, once, where there is room for it: those
// who share it do not see that.
struct alignas(Value) DictionaryBlock : Counted {
    using Entry = Dictionary::Entry;

    const std::uint32_t capacity;
    std::atomic<std::uint32_t> used{0};
    // As many of the first entries are as they are for good: what they hold is a part of
    // this block, and not counted.
    std::uint32_t fixed = 0;
    // What ValueSize.h says of the first entries: how many (the upper 16 bits), bytes.
    std::atomic<std::uint64_t> measured{0};
    // Positions of the entries sorted by key; kept only above kIndexedAbove, and then
    // whoever shares the block sees all of them.
    std::vector<std::uint32_t> order;

    explicit DictionaryBlock(std::uint32_t room) noexcept : capacity(room) {}
    std::uint32_t size() const noexcept { return used.load(std::memory_order_relaxed); }
    Entry* entries() noexcept { return reinterpret_cast<Entry*>(this + 1); }
    const Entry* entries() const noexcept { return reinterpret_cast<const Entry*>(this + 1); }

    // Among the first `count`.
    const Entry* find(std::string_view key, std::size_t count) const noexcept;
    // Where `key` stands in `order`, or where it would have to be inserted.
    std::size_t lowerBound(std::string_view key) const noexcept;

    // The rest requires that nobody shares the block.
    // Requires room. Without a place in `order`.
    void add(Entry&& entry) noexcept;
    void add(Value key, Value value) noexcept { add(Entry{std::move(key), std::move(value)}); }
    void truncate(std::size_t count) noexcept;
    void forgetMeasure() noexcept { measured.store(0, std::memory_order_relaxed); }
    void removeDuplicatesAndNone();
    void rebuildOrder();
    void orderFrom(std::size_t first);

    static DictionaryBlock* make(std::size_t capacity);
    static void free(DictionaryBlock* block) noexcept;
};

struct BlockOf {
    // Null when it has none.
    static DictionaryBlock* dictionary(const Value& value) noexcept {
        return value.onHeap() ? static_cast<DictionaryBlock*>(value.wide_.block) : nullptr;
    }
    static DictionaryBlock* dictionary(const Dictionary& dictionary) noexcept {
        return dictionary.block();
    }
};

// The right ones are those of `block`, which is not looked at when they are none.
bool areEqual(std::span<const Dictionary::Entry> left, std::span<const Dictionary::Entry> right,
              const DictionaryBlock* block) noexcept;

} // namespace detail

inline std::string_view Value::text() const noexcept {
    if (!isString()) {
        return {};
    }
    if (onHeap()) {
        return static_cast<detail::StringBlock*>(wide_.block)->view();
    }
    return {small_.text, small_.inlineLength};
}

inline std::span<const Value> List::itemsOf(const Value& value) noexcept {
    if (!value.isList() || !value.onHeap()) {
        return {};
    }
    auto* const block = static_cast<detail::ListBlock*>(value.wide_.block);
    return {block->items(), block->size};
}

inline std::size_t List::size() const noexcept {
    return itemsOf(holder_).size();
}
inline const Value* List::begin() const noexcept {
    return itemsOf(holder_).data();
}
inline const Value* List::end() const noexcept {
    return begin() + size();
}

inline std::span<const Dictionary::Entry> Dictionary::entriesOf(const Value& value) noexcept {
    if (!value.isDictionary() || !value.onHeap()) {
        return {};
    }
    return {static_cast<const detail::DictionaryBlock*>(value.wide_.block)->entries(),
            value.wide_.extra};
}

inline detail::DictionaryBlock* Dictionary::block() const noexcept {
    return holder_.onHeap() ? static_cast<detail::DictionaryBlock*>(holder_.wide_.block) : nullptr;
}
inline std::size_t Dictionary::size() const noexcept {
    return holder_.wide_.extra;
}
inline const Dictionary::Entry* Dictionary::begin() const noexcept {
    return block() != nullptr ? block()->entries() : nullptr;
}
inline const Dictionary::Entry* Dictionary::end() const noexcept {
    return begin() + size();
}

} // namespace halyard
