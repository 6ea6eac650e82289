// The values that messages, configurations and records are made of.
//
// A message is decoded once and then shared by sessions, sinks, batch and
// store, so values are immutable once shared and counted by reference: a copy
// of a Value costs at most one atomic increment, and changing one key of a
// shared dictionary copies its entries, never what they refer to. Strings of up
// to 14 bytes live inside the Value; message keys that are longer can be
// interned (see KeyTable.h), which makes copying them free.
//
// Threads: distinct Value, List and Dictionary objects may be used from
// different threads at once, also when they share contents. One object is not
// to be changed while another thread uses that same object.
#pragma once

#include <atomic>
#include <compare>
#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <limits>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

namespace halyard {

class Dictionary;
class List;
class ValueArena;

// A moment in UTC: seconds since 1970 (may be negative) and, counted forward
// from there, 0 to 999,999,999 nanoseconds.
struct Date {
    std::int64_t seconds = 0;
    std::uint32_t nanoseconds = 0;

    auto operator<=>(const Date&) const = default;
};

namespace detail {

struct Counted {
    // A block whose count is kImmortal is never freed and never written again,
    // so threads share it without passing a cache line to and fro.
    static constexpr std::uint32_t kImmortal = 0xFFFFFFFF;

    std::atomic<std::uint32_t> references{1};
    // How far before this the block begins that it is a part of, which is counted in its
    // stead: see ValueArena.h. 0: none.
    std::uint32_t offset = 0;

    Counted* whole() noexcept {
        return reinterpret_cast<Counted*>(reinterpret_cast<char*>(this) - offset);
    }
    bool isPart() const noexcept { return offset != 0; }
    bool isImmortal() const noexcept {
        return references.load(std::memory_order_relaxed) == kImmortal;
    }
    void retain() noexcept {
        if (!isImmortal()) {
            whole()->references.fetch_add(1, std::memory_order_relaxed);
        }
    }
    // True when the caller held the last reference and must free the whole.
    [[nodiscard]] bool release() noexcept {
        return !isImmortal() && whole()->references.fetch_sub(1, std::memory_order_acq_rel) == 1;
    }
    bool isShared() const noexcept {
        return isPart() || references.load(std::memory_order_acquire) != 1;
    }
};

struct BlockOf;
struct StringBlock;
struct ListBlock;
struct DictionaryBlock;

} // namespace detail

class Value {
public:
    enum class Kind : std::uint8_t {
        None,
        Bool,
        Int,  // Any integer that fits 64 signed bits.
        UInt, // Only integers above the signed range.
        Float,
        Double,
        String,
        Date,
        List,
        Dictionary,
    };

    Value() noexcept { wide_ = Wide{}; }
    Value(const Value& other) noexcept : wide_(other.wide_) { retain(); }
    Value(Value&& other) noexcept : wide_(other.wide_) { other.wide_ = Wide{}; }
    Value& operator=(const Value& other) noexcept;
    Value& operator=(Value&& other) noexcept;
    ~Value() { release(); }

    Value(bool value) noexcept;
    template <std::integral T>
    requires(!std::same_as<T, bool>) Value(T value)
    noexcept {
        if constexpr (std::is_unsigned_v<T>) {
            setUnsigned(value);
        } else {
            setSigned(value);
        }
    }
    Value(float value) noexcept;
    Value(double value) noexcept;
    Value(std::string_view text);
    Value(const std::string& text) : Value(std::string_view(text)) {}
    Value(const char* text) : Value(std::string_view(text)) {}
    Value(Date date) noexcept;
    Value(List list) noexcept;
    Value(Dictionary dictionary) noexcept;
    // A pointer is no truth value.
    template <class T> Value(T*) = delete;

    Kind kind() const noexcept { return wide_.kind; }
    bool isNone() const noexcept { return kind() == Kind::None; }
    bool isString() const noexcept { return kind() == Kind::String; }
    bool isDictionary() const noexcept { return kind() == Kind::Dictionary; }
    bool isList() const noexcept { return kind() == Kind::List; }
    bool isInteger() const noexcept { return kind() == Kind::Int || kind() == Kind::UInt; }
    bool isReal() const noexcept { return kind() == Kind::Float || kind() == Kind::Double; }
    // Bool, integer or real.
    bool isNumber() const noexcept { return isInteger() || isReal() || kind() == Kind::Bool; }

    // The bytes of a string, empty for every other kind. Valid as long as this
    // Value is neither changed nor destroyed.
    std::string_view text() const noexcept;

    // The integer value: a real truncates toward zero (saturating, NaN is 0), a
    // string gives its leading decimal number, everything else is 0. Integers
    // above the signed range wrap.
    std::int64_t integerValue() const noexcept;
    // The real value: a string gives its leading decimal number; 0 for the rest.
    double doubleValue() const noexcept;
    bool boolValue() const noexcept { return doubleValue() != 0; }
    // Requires kind() == Kind::UInt or a non-negative Int.
    std::uint64_t unsignedValue() const noexcept { return wide_.uint64; }
    // Requires kind() == Kind::Float.
    float floatValue() const noexcept { return wide_.float32; }

    // One that keeps nothing alive of what this is a part of: for who keeps a piece of a
    // message for long.
    Value detached() const;

    Date date() const noexcept { return {wide_.int64, wide_.extra}; }
    // Empty for every other kind.
    List list() const noexcept;
    Dictionary dictionary() const noexcept;

    // Deep equality. Numbers (bool counts as 0 or 1) compare by exact numeric
    // value across kinds; NaN equals nothing, and so does what contains it.
    friend bool operator==(const Value& left, const Value& right) noexcept;

private:
    friend class List;
    friend class Dictionary;
    friend class KeyTable;
    friend class ValueArena;
    friend struct detail::BlockOf;

    static constexpr std::uint8_t kMaxInline = 14;
    static constexpr std::uint8_t kOnHeap = 0xFF;

    // Both structs begin with the same two members, so either may be used to
    // read them.
    struct Wide {
        Kind kind = Kind::None;
        std::uint8_t inlineLength = 0;
        std::uint32_t extra = 0; // nanoseconds of a date, entries of a dictionary
        union {
            std::int64_t int64 = 0;
            std::uint64_t uint64;
            float float32;
            double float64;
            detail::Counted* block; // of the kind
        };
    };
    struct Small {
        Kind kind;
        std::uint8_t inlineLength;
        char text[kMaxInline];
    };

    void setSigned(std::int64_t value) noexcept {
        wide_.kind = Kind::Int;
        wide_.inlineLength = 0;
        wide_.extra = 0;
        wide_.int64 = value;
    }
    void setUnsigned(std::uint64_t value) noexcept {
        setSigned(static_cast<std::int64_t>(value));
        if (value > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
            wide_.kind = Kind::UInt;
        }
    }
    void setBlock(Kind kind, detail::Counted* block, std::uint32_t extra = 0) noexcept {
        wide_.kind = kind;
        wide_.inlineLength = kOnHeap;
        wide_.extra = extra;
        wide_.block = block;
    }
    bool onHeap() const noexcept { return wide_.inlineLength == kOnHeap; }
    void retain() const noexcept {
        if (onHeap()) {
            wide_.block->retain();
        }
    }
    void release() noexcept {
        if (onHeap() && wide_.block->release()) {
            freeBlock();
        }
    }
    void freeBlock() noexcept;

    union {
        Wide wide_;
        Small small_;
    };
};

// An ordered list of values. Copies share their contents; append() copies them
// first when they are shared.
class List {
public:
    class Builder;

    List() noexcept = default;
    List(std::initializer_list<Value> values);
    explicit List(std::vector<Value> values);

    std::size_t size() const noexcept;
    bool empty() const noexcept { return size() == 0; }
    // Requires index < size().
    const Value& operator[](std::size_t index) const noexcept;
    const Value* begin() const noexcept;
    const Value* end() const noexcept;

    void append(Value value);

    // The items of a value, borrowed from it: walking what other threads share
    // without touching its reference count. Empty unless it is a list.
    static std::span<const Value> itemsOf(const Value& value) noexcept;

    friend bool operator==(const List& left, const List& right) noexcept;

private:
    friend class Value;
    detail::ListBlock* block() const noexcept;
    Value holder_; // none while empty, else of kind List
};

// Makes a list of so many items at most in one piece.
class List::Builder {
public:
    explicit Builder(std::size_t capacity);
    ~Builder();
    Builder(const Builder&) = delete;
    Builder& operator=(const Builder&) = delete;

    void add(Value item) noexcept;
    List finish() noexcept;

private:
    detail::ListBlock* block_;
};

// String keys to values, iterated in the order of insertion. An entry never
// holds none: setting none removes the key.
//
// Lookup is linear up to kIndexedAbove entries and binary over a sorted index
// above, so that hostile key sets cost no more than friendly ones.
class Dictionary {
public:
    struct Entry {
        Value key; // always a string
        Value value;
    };

    static constexpr std::size_t kIndexedAbove = 16;

    class Builder;

    Dictionary() noexcept = default;
    Dictionary(std::initializer_list<Entry> entries);
    // Takes the entries as they come; of equal keys the last one wins.
    explicit Dictionary(std::vector<Entry> entries);

    std::size_t size() const noexcept;
    bool empty() const noexcept { return size() == 0; }
    const Entry* begin() const noexcept;
    const Entry* end() const noexcept;

    // Null when absent. The pointer lives until this dictionary is changed.
    const Value* find(std::string_view key) const noexcept;
    bool contains(std::string_view key) const noexcept { return find(key) != nullptr; }
    // None when absent.
    const Value& operator[](std::string_view key) const noexcept;

    // Replaces in place or appends, the latter without a copy also of what is shared,
    // where a builder has left room; a value of none erases. Requires that `key` is a
    // string.
    void set(Value key, Value value);
    void erase(std::string_view key);
    // Sets every entry of `other` here, in its order.
    void merge(const Dictionary& other);

    // As List::itemsOf, in the order of insertion.
    static std::span<const Entry> entriesOf(const Value& value) noexcept;

    friend bool operator==(const Dictionary& left, const Dictionary& right) noexcept;

private:
    friend class Value;
    friend class ValueArena;
    friend struct detail::BlockOf;
    detail::DictionaryBlock* block() const noexcept;
    // Of nobody else, with room for so many entries.
    detail::DictionaryBlock& ownBlock(std::size_t capacity);
    void append(Value&& key, Value&& value);
    bool appendShared(Value& key, Value& value) noexcept;
    void hold(detail::DictionaryBlock* block) noexcept;
    Value holder_; // none while empty, else of kind Dictionary
};

// Makes a dictionary of so many entries at most in one piece. Its capacity beyond what is
// added is room for entries that are set later.
class Dictionary::Builder {
public:
    explicit Builder(std::size_t capacity);
    ~Builder();
    Builder(const Builder&) = delete;
    Builder& operator=(const Builder&) = delete;

    // Requires that `key` is a string.
    void add(Value key, Value value) noexcept;
    // Of equal keys the last one wins.
    Dictionary finish();

private:
    detail::DictionaryBlock* block_;
};

// Sorted pairs, for the writers whose output must not depend on insertion order.
std::vector<const Dictionary::Entry*> sortedEntries(std::span<const Dictionary::Entry> entries);

} // namespace halyard

#include "common/ValueBlocks.h"
