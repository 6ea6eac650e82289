#include "common/Value.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <charconv>
#include <cmath>
#include <cstring>
#include <new>
#include <optional>

#include "common/ValueBlocks.h"

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
    wide_.string = StringBlock::make(text);
    wide_.kind = Kind::String;
    wide_.inlineLength = kOnHeap;
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

void Value::retainBlock() const noexcept {
    switch (kind()) {
    case Kind::String:
        wide_.string->retain();
        break;
    case Kind::List:
        wide_.list->retain();
        break;
    default:
        wide_.dictionary->retain();
        break;
    }
}

void Value::releaseBlock() noexcept {
    switch (kind()) {
    case Kind::String:
        if (wide_.string->release()) {
            StringBlock::free(wide_.string);
        }
        break;
    case Kind::List:
        if (wide_.list->release()) {
            delete wide_.list;
        }
        break;
    default:
        if (wide_.dictionary->release()) {
            delete wide_.dictionary;
        }
        break;
    }
}

std::string_view Value::text() const noexcept {
    if (!isString()) {
        return {};
    }
    if (onHeap()) {
        return wide_.string->view();
    }
    return {small_.text, small_.inlineLength};
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

// Null stands for an empty dictionary.
static bool equalBlocks(const DictionaryBlock* left, const DictionaryBlock* right) noexcept {
    const std::size_t size = left != nullptr ? left->entries.size() : 0;
    if (size != (right != nullptr ? right->entries.size() : 0)) {
        return false;
    }
    for (std::size_t i = 0; i < size; ++i) {
        const Dictionary::Entry& entry = left->entries[i];
        // Messages of one kind carry their keys in one order: try that first.
        const Dictionary::Entry* counterpart =
            right->entries[i].key == entry.key ? &right->entries[i] : right->find(entry.key.text());
        if (counterpart == nullptr || !(entry.value == counterpart->value)) {
            return false;
        }
    }
    return true;
}

bool operator==(const Value& left, const Value& right) noexcept {
    if (left.isNumber()) {
        return right.isNumber() && numbersEqual(left, right);
    }
    if (left.kind() != right.kind()) {
        return false;
    }
    switch (left.kind()) {
    case Value::Kind::String:
        if (left.onHeap() && right.onHeap() && left.wide_.string == right.wide_.string) {
            return true;
        }
        return left.text() == right.text();
    case Value::Kind::Date:
        return left.date() == right.date();
    case Value::Kind::List:
        return std::ranges::equal(List::itemsOf(left), List::itemsOf(right));
    case Value::Kind::Dictionary:
        return equalBlocks(left.onHeap() ? left.wide_.dictionary : nullptr,
                           right.onHeap() ? right.wide_.dictionary : nullptr);
    default:
        return true;
    }
}

// List

List::List(std::initializer_list<Value> values) : List(std::vector<Value>(values)) {}

List::List(std::vector<Value> values) {
    if (values.empty()) {
        return;
    }
    auto* block = new ListBlock;
    block->items = std::move(values);
    holder_.wide_.kind = Value::Kind::List;
    holder_.wide_.inlineLength = Value::kOnHeap;
    holder_.wide_.list = block;
}

std::size_t List::size() const noexcept {
    return holder_.onHeap() ? holder_.wide_.list->items.size() : 0;
}

const Value& List::operator[](std::size_t index) const noexcept {
    assert(index < size());
    return holder_.wide_.list->items[index];
}

const Value* List::begin() const noexcept {
    return holder_.onHeap() ? holder_.wide_.list->items.data() : nullptr;
}

const Value* List::end() const noexcept {
    return begin() + size();
}

void List::append(Value value) {
    if (!holder_.onHeap()) {
        std::vector<Value> first;
        first.push_back(std::move(value));
        *this = List(std::move(first));
        return;
    }
    if (holder_.wide_.list->isShared()) {
        std::vector<Value> copy;
        copy.reserve(size() + 1);
        copy.assign(begin(), end());
        *this = List(std::move(copy));
    }
    holder_.wide_.list->items.push_back(std::move(value));
}

std::span<const Value> List::itemsOf(const Value& value) noexcept {
    if (!value.isList() || !value.onHeap()) {
        return {};
    }
    return value.wide_.list->items;
}

bool operator==(const List& left, const List& right) noexcept {
    return std::equal(left.begin(), left.end(), right.begin(), right.end());
}

// Dictionary

namespace detail {

std::size_t DictionaryBlock::lowerBound(std::string_view key) const noexcept {
    const auto at = std::lower_bound(order.begin(), order.end(), key,
                                     [this](std::uint32_t index, std::string_view wanted) {
                                         return entries[index].key.text() < wanted;
                                     });
    return static_cast<std::size_t>(at - order.begin());
}

const Dictionary::Entry* DictionaryBlock::find(std::string_view key) const noexcept {
    if (order.empty()) {
        for (const auto& entry : entries) {
            if (entry.key.text() == key) {
                return &entry;
            }
        }
        return nullptr;
    }
    const std::size_t at = lowerBound(key);
    if (at < order.size() && entries[order[at]].key.text() == key) {
        return &entries[order[at]];
    }
    return nullptr;
}

void DictionaryBlock::rebuildOrder() {
    order.clear();
    if (entries.size() <= Dictionary::kIndexedAbove) {
        return;
    }
    order.resize(entries.size());
    for (std::uint32_t i = 0; i < order.size(); ++i) {
        order[i] = i;
    }
    std::stable_sort(order.begin(), order.end(), [this](std::uint32_t a, std::uint32_t b) {
        return entries[a].key.text() < entries[b].key.text();
    });
}

void DictionaryBlock::removeDuplicatesAndNone() {
    rebuildOrder();
    if (order.empty()) {
        std::array<std::string_view, Dictionary::kIndexedAbove> keys;
        for (std::size_t i = 0; i < entries.size(); ++i) {
            keys[i] = entries[i].key.text();
            for (std::size_t j = 0; j < i; ++j) {
                if (keys[j] == keys[i]) {
                    entries[j].value = Value(); // The later one wins.
                }
            }
        }
    } else {
        for (std::size_t i = 1; i < order.size(); ++i) {
            if (entries[order[i - 1]].key == entries[order[i]].key) {
                entries[order[i - 1]].value = Value();
            }
        }
    }
    const std::size_t removed =
        std::erase_if(entries, [](const auto& entry) { return entry.value.isNone(); });
    if (removed > 0) {
        rebuildOrder();
    }
}

// Key by key, each new one would move those behind it in `order`.
void DictionaryBlock::merge(std::span<const Dictionary::Entry> others) {
    const std::size_t before = entries.size();
    for (const Dictionary::Entry& other : others) {
        const auto at = indexOf(other.key.text(), before);
        if (at < before) {
            entries[at].value = other.value;
        } else {
            entries.push_back(other);
        }
    }
    if (order.empty()) {
        rebuildOrder();
        return;
    }
    for (std::size_t i = before; i < entries.size(); ++i) {
        order.push_back(static_cast<std::uint32_t>(i));
    }
    const auto earlier = [this](std::uint32_t a, std::uint32_t b) {
        return entries[a].key.text() < entries[b].key.text();
    };
    const auto added = order.begin() + static_cast<std::ptrdiff_t>(before);
    std::sort(added, order.end(), earlier);
    std::inplace_merge(order.begin(), added, order.end(), earlier);
}

std::size_t DictionaryBlock::indexOf(std::string_view key, std::size_t size) const noexcept {
    if (order.empty()) {
        const auto end = entries.begin() + static_cast<std::ptrdiff_t>(size);
        const auto at = std::find_if(entries.begin(), end,
                                     [&](const auto& entry) { return entry.key.text() == key; });
        return static_cast<std::size_t>(at - entries.begin());
    }
    const std::size_t at = lowerBound(key);
    const bool known = at < order.size() && entries[order[at]].key.text() == key;
    return known ? order[at] : size;
}

} // namespace detail

Dictionary::Dictionary(std::initializer_list<Entry> entries)
    : Dictionary(std::vector<Entry>(entries)) {}

Dictionary::Dictionary(std::vector<Entry> entries) {
    if (entries.empty()) {
        return;
    }
    auto* block = new DictionaryBlock;
    block->entries = std::move(entries);
    block->removeDuplicatesAndNone();
    holder_.wide_.kind = Value::Kind::Dictionary;
    holder_.wide_.inlineLength = Value::kOnHeap;
    holder_.wide_.dictionary = block;
}

DictionaryBlock* Dictionary::block() const noexcept {
    return holder_.onHeap() ? holder_.wide_.dictionary : nullptr;
}

DictionaryBlock& Dictionary::ownBlock() {
    DictionaryBlock* current = block();
    if (current != nullptr && !current->isShared()) {
        return *current;
    }
    auto* copy = new DictionaryBlock;
    if (current != nullptr) {
        copy->entries.reserve(current->entries.size() + 1);
        copy->entries.assign(current->entries.begin(), current->entries.end());
        copy->order = current->order;
    }
    holder_ = Value();
    holder_.wide_.kind = Value::Kind::Dictionary;
    holder_.wide_.inlineLength = Value::kOnHeap;
    holder_.wide_.dictionary = copy;
    return *copy;
}

std::size_t Dictionary::size() const noexcept {
    return block() != nullptr ? block()->entries.size() : 0;
}

const Dictionary::Entry* Dictionary::begin() const noexcept {
    return block() != nullptr ? block()->entries.data() : nullptr;
}

const Dictionary::Entry* Dictionary::end() const noexcept {
    return begin() + size();
}

const Value* Dictionary::find(std::string_view key) const noexcept {
    if (block() == nullptr) {
        return nullptr;
    }
    const Entry* entry = block()->find(key);
    return entry != nullptr ? &entry->value : nullptr;
}

const Value& Dictionary::operator[](std::string_view key) const noexcept {
    static const Value none;
    const Value* found = find(key);
    return found != nullptr ? *found : none;
}

void Dictionary::set(Value key, Value value) {
    assert(key.isString());
    if (value.isNone()) {
        erase(key.text());
        return;
    }
    DictionaryBlock& own = ownBlock();
    if (const Entry* present = own.find(key.text())) {
        own.entries[static_cast<std::size_t>(present - own.entries.data())].value =
            std::move(value);
        return;
    }
    if (!own.order.empty()) {
        const auto at = own.order.begin() + static_cast<std::ptrdiff_t>(own.lowerBound(key.text()));
        own.order.insert(at, static_cast<std::uint32_t>(own.entries.size()));
        own.entries.push_back({std::move(key), std::move(value)});
        return;
    }
    own.entries.push_back({std::move(key), std::move(value)});
    if (own.entries.size() > kIndexedAbove) {
        own.rebuildOrder();
    }
}

void Dictionary::erase(std::string_view key) {
    const Entry* present = block() != nullptr ? block()->find(key) : nullptr;
    if (present == nullptr) {
        return;
    }
    // `key` may lie in the entries, which do not outlive the next line.
    const std::ptrdiff_t index = present - begin();
    DictionaryBlock& own = ownBlock();
    own.entries.erase(own.entries.begin() + index);
    own.rebuildOrder();
}

void Dictionary::merge(const Dictionary& other) {
    if (empty() || other.empty()) {
        *this = empty() ? other : *this;
        return;
    }
    const Dictionary kept = other; // It may be this very one.
    ownBlock().merge(kept.block()->entries);
}

bool operator==(const Dictionary& left, const Dictionary& right) noexcept {
    return equalBlocks(left.block(), right.block());
}

std::span<const Dictionary::Entry> Dictionary::entriesOf(const Value& value) noexcept {
    if (!value.isDictionary() || !value.onHeap()) {
        return {};
    }
    return value.wide_.dictionary->entries;
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
