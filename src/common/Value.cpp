#include "common/Value.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <charconv>
#include <cmath>
#include <cstring>
#include <new>
#include <optional>

namespace halyard {

using detail::DictionaryBlock;
using detail::ListBlock;
using detail::StringBlock;

namespace detail {

StringBlock* StringBlock::make(std::string_view text) {
    void* memory = ::operator new(sizeof(StringBlock) + text.size());
    auto* block = new (memory) StringBlock;
    block->length = static_cast<std::uint32_t>(text.size());
    std::memcpy(block->bytes(), text.data(), text.size());
    return block;
}

void StringBlock::free(StringBlock* block) noexcept {
    block->~StringBlock();
    ::operator delete(block);
}

} // namespace detail

Value& Value::operator=(const Value& other) noexcept {
    if (this != &other) {
        other.retain();
        release();
        wide_ = other.wide_;
    }
    return *this;
}

Value& Value::operator=(Value&& other) noexcept {
    if (this != &other) {
        const Wide taken = other.wide_;
        other.wide_ = Wide{};
        release();
        wide_ = taken;
    }
    return *this;
}

Value::Value(bool value) noexcept {
    wide_ = Wide{};
    wide_.kind = Kind::Bool;
    wide_.int64 = value ? 1 : 0;
}

Value::Value(float value) noexcept {
    wide_ = Wide{};
    wide_.kind = Kind::Float;
    wide_.float32 = value;
}

Value::Value(double value) noexcept {
    wide_ = Wide{};
    wide_.kind = Kind::Double;
    wide_.float64 = value;
}

Value::Value(std::string_view text) {
    wide_ = Wide{};
    if (text.size() <= kMaxInline) {
        small_.kind = Kind::String;
        small_.inlineLength = static_cast<std::uint8_t>(text.size());
        if (!text.empty()) {
            std::memcpy(small_.text, text.data(), text.size());
        }
        return;
    }
    setBlock(Kind::String, StringBlock::make(text));
}

Value::Value(Date date) noexcept {
    wide_ = Wide{};
    wide_.kind = Kind::Date;
    wide_.extra = date.nanoseconds;
    wide_.int64 = date.seconds;
}

Value::Value(List list) noexcept : Value(std::move(list.holder_)) {
    wide_.kind = Kind::List;
}

Value::Value(Dictionary dictionary) noexcept : Value(std::move(dictionary.holder_)) {
    wide_.kind = Kind::Dictionary;
}

Value Value::detached() const {
    if (!onHeap() || !wide_.block->isPart()) {
        return *this;
    }
    if (isString()) {
        return Value(text());
    }
    if (isList()) {
        List copy;
        for (const Value& item : List::itemsOf(*this)) {
            copy.append(item.detached());
        }
        return copy;
    }
    Dictionary copy;
    for (const auto& [key, value] : Dictionary::entriesOf(*this)) {
        copy.set(key.detached(), value.detached());
    }
    return copy;
}

void Value::freeBlock() noexcept {
    if (wide_.block->isPart()) {
        DictionaryBlock::free(static_cast<DictionaryBlock*>(wide_.block->whole()));
        return;
    }
    switch (kind()) {
    case Kind::String:
        StringBlock::free(static_cast<StringBlock*>(wide_.block));
        break;
    case Kind::List:
        ListBlock::free(static_cast<ListBlock*>(wide_.block));
        break;
    default:
        DictionaryBlock::free(static_cast<DictionaryBlock*>(wide_.block));
        break;
    }
}

namespace {

// The longest decimal number at the start of `text`, after blanks and a sign.
template <class Number> Number leadingNumber(std::string_view text) noexcept {
    const std::size_t start = text.find_first_not_of(" \t\r\n");
    if (start == std::string_view::npos) {
        return 0;
    }
    text.remove_prefix(start);
    if (text.starts_with('+')) {
        text.remove_prefix(1);
        if (text.starts_with('-')) {
            return 0;
        }
    }
    const std::size_t digit = text.find_first_not_of("-.");
    if (digit == std::string_view::npos || text[digit] < '0' || text[digit] > '9') {
        return 0; // No "inf" or "nan" either.
    }
    Number number = 0;
    const auto result = std::from_chars(text.data(), text.data() + text.size(), number);
    if (result.ec == std::errc::result_out_of_range) {
        const std::string_view taken =
            text.substr(0, static_cast<std::size_t>(result.ptr - text.data()));
        if (taken.find("e-") != std::string_view::npos ||
            taken.find("E-") != std::string_view::npos) {
            return 0; // Too small rather than too large.
        }
        return text.front() == '-' ? std::numeric_limits<Number>::lowest()
                                   : std::numeric_limits<Number>::max();
    }
    return result.ec == std::errc{} ? number : 0;
}

std::int64_t truncated(double value) noexcept {
    constexpr double kLimit = 9223372036854775808.0; // 2^63
    if (std::isnan(value)) {
        return 0;
    }
    if (value >= kLimit) {
        return std::numeric_limits<std::int64_t>::max();
    }
    if (value < -kLimit) {
        return std::numeric_limits<std::int64_t>::min();
    }
    return static_cast<std::int64_t>(value);
}

} // namespace

std::int64_t Value::integerValue() const noexcept {
    switch (kind()) {
    case Kind::Bool:
    case Kind::Int:
    case Kind::UInt:
        return wide_.int64;
    case Kind::Float:
        return truncated(wide_.float32);
    case Kind::Double:
        return truncated(wide_.float64);
    case Kind::String:
        return leadingNumber<std::int64_t>(text());
    default:
        return 0;
    }
}

double Value::doubleValue() const noexcept {
    switch (kind()) {
    case Kind::Bool:
    case Kind::Int:
        return static_cast<double>(wide_.int64);
    case Kind::UInt:
        return static_cast<double>(wide_.uint64);
    case Kind::Float:
        return wide_.float32;
    case Kind::Double:
        return wide_.float64;
    case Kind::String:
        return leadingNumber<double>(text());
    default:
        return 0;
    }
}

List Value::list() const noexcept {
    List result;
    if (isList() && onHeap()) {
        result.holder_ = *this;
    }
    return result;
}

Dictionary Value::dictionary() const noexcept {
    Dictionary result;
    if (isDictionary() && onHeap()) {
        result.holder_ = *this;
    }
    return result;
}

namespace {

// Exact: no rounding of the integer through double.
bool integerEqualsReal(const Value& integer, double real) noexcept {
    if (std::isnan(real) || std::trunc(real) != real) {
        return false;
    }
    if (integer.kind() == Value::Kind::UInt) {
        constexpr double kTwoTo64 = 18446744073709551616.0;
        return real >= 0 && real < kTwoTo64 &&
               static_cast<std::uint64_t>(real) == integer.unsignedValue();
    }
    constexpr double kTwoTo63 = 9223372036854775808.0;
    return real >= -kTwoTo63 && real < kTwoTo63 &&
           static_cast<std::int64_t>(real) == integer.integerValue();
}

bool numbersEqual(const Value& left, const Value& right) noexcept {
    if (left.isReal()) {
        return right.isReal() ? left.doubleValue() == right.doubleValue()
                              : integerEqualsReal(right, left.doubleValue());
    }
    if (right.isReal()) {
        return integerEqualsReal(left, right.doubleValue());
    }
    const bool leftLarge = left.kind() == Value::Kind::UInt;
    const bool rightLarge = right.kind() == Value::Kind::UInt;
    return leftLarge == rightLarge && left.integerValue() == right.integerValue();
}

} // namespace

bool operator==(const Value& left, const Value& right) noexcept {
    if (left.isNumber()) {
        return right.isNumber() && numbersEqual(left, right);
    }
    if (left.kind() != right.kind()) {
        return false;
    }
    switch (left.kind()) {
    case Value::Kind::String:
        if (left.onHeap() && right.onHeap() && left.wide_.block == right.wide_.block) {
            return true;
        }
        return left.text() == right.text();
    case Value::Kind::Date:
        return left.date() == right.date();
    case Value::Kind::List:
        return std::ranges::equal(List::itemsOf(left), List::itemsOf(right));
    case Value::Kind::Dictionary:
        return detail::areEqual(Dictionary::entriesOf(left), Dictionary::entriesOf(right),
                                static_cast<DictionaryBlock*>(right.wide_.block));
    default:
        return true;
    }
}

std::vector<const Dictionary::Entry*> sortedEntries(std::span<const Dictionary::Entry> entries) {
    std::vector<const Dictionary::Entry*> sorted;
    sorted.reserve(entries.size());
    for (const auto& entry : entries) {
        sorted.push_back(&entry);
    }
    std::sort(sorted.begin(), sorted.end(),
              [](const auto* a, const auto* b) { return a->key.text() < b->key.text(); });
    return sorted;
}

} // namespace halyard
