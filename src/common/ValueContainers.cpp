// What of Value.h has to do with lists and dictionaries.
#include <algorithm>
#include <array>
#include <cassert>
#include <memory>
#include <new>
#include <utility>

#include "common/Value.h"

namespace halyard {

using detail::DictionaryBlock;
using detail::ListBlock;

// List

namespace detail {

ListBlock* ListBlock::make(std::size_t capacity) {
    void* const memory = ::operator new(sizeof(ListBlock) + capacity * sizeof(Value));
    return new (memory) ListBlock(static_cast<std::uint32_t>(capacity));
}

void ListBlock::free(ListBlock* block) noexcept {
    std::destroy_n(block->items(), block->size);
    block->~ListBlock();
    ::operator delete(block);
}

} // namespace detail

List::Builder::Builder(std::size_t capacity)
    : block_(capacity > 0 ? ListBlock::make(capacity) : nullptr) {}

List::Builder::~Builder() {
    if (block_ != nullptr) {
        ListBlock::free(block_);
    }
}

void List::Builder::add(Value item) noexcept {
    assert(block_ != nullptr && block_->size < block_->capacity);
    block_->add(std::move(item));
}

List List::Builder::finish() noexcept {
    List list;
    if (block_ != nullptr && block_->size > 0) {
        list.holder_.setBlock(Value::Kind::List, std::exchange(block_, nullptr));
    }
    return list;
}

List::List(std::initializer_list<Value> values) {
    Builder builder(values.size());
    for (const Value& value : values) {
        builder.add(value);
    }
    *this = builder.finish();
}

List::List(std::vector<Value> values) {
    Builder builder(values.size());
    for (Value& value : values) {
        builder.add(std::move(value));
    }
    *this = builder.finish();
}

ListBlock* List::block() const noexcept {
    return holder_.onHeap() ? static_cast<ListBlock*>(holder_.wide_.block) : nullptr;
}

const Value& List::operator[](std::size_t index) const noexcept {
    assert(index < size());
    return begin()[index];
}

void List::append(Value value) {
    ListBlock* own = block();
    if (own == nullptr || own->isShared() || own->size == own->capacity) {
        Builder copy(std::max<std::size_t>(2 * size(), 4));
        for (const Value& item : *this) {
            copy.add(item);
        }
        copy.add(std::move(value));
        *this = copy.finish();
        return;
    }
    own->add(std::move(value));
}

bool operator==(const List& left, const List& right) noexcept {
    return std::equal(left.begin(), left.end(), right.begin(), right.end());
}

// Dictionary

namespace detail {

DictionaryBlock* DictionaryBlock::make(std::size_t capacity) {
    void* const memory =
        ::operator new(sizeof(DictionaryBlock) + capacity * sizeof(Dictionary::Entry));
    return new (memory) DictionaryBlock(static_cast<std::uint32_t>(capacity));
}

void DictionaryBlock::free(DictionaryBlock* block) noexcept {
    std::destroy(block->entries() + block->fixed, block->entries() + block->size());
    block->~DictionaryBlock();
    ::operator delete(block);
}

void DictionaryBlock::add(Entry&& entry) noexcept {
    const std::uint32_t at = size();
    new (entries() + at) Entry(std::move(entry));
    used.store(at + 1, std::memory_order_relaxed);
}

void DictionaryBlock::truncate(std::size_t count) noexcept {
    if (count < size()) {
        std::destroy(entries() + count, entries() + size());
        used.store(static_cast<std::uint32_t>(count), std::memory_order_relaxed);
        forgetMeasure();
    }
}

std::size_t DictionaryBlock::lowerBound(std::string_view key) const noexcept {
    const auto at = std::lower_bound(order.begin(), order.end(), key,
                                     [this](std::uint32_t index, std::string_view wanted) {
                                         return entries()[index].key.text() < wanted;
                                     });
    return static_cast<std::size_t>(at - order.begin());
}

const Dictionary::Entry* DictionaryBlock::find(std::string_view key,
                                               std::size_t count) const noexcept {
    if (order.empty()) {
        const Entry* const end = entries() + count;
        const Entry* const found = std::find_if(
            entries(), end, [&](const Entry& entry) { return entry.key.text() == key; });
        return found != end ? found : nullptr;
    }
    const std::size_t at = lowerBound(key);
    if (at < order.size() && order[at] < count && entries()[order[at]].key.text() == key) {
        return &entries()[order[at]];
    }
    return nullptr;
}

void DictionaryBlock::rebuildOrder() {
    order.clear();
    if (size() > Dictionary::kIndexedAbove) {
        orderFrom(0);
    }
}

// Takes the entries from `first` on into the order: key by key, each would move those
// behind it.
void DictionaryBlock::orderFrom(std::size_t first) {
    const auto earlier = [this](std::uint32_t a, std::uint32_t b) {
        return entries()[a].key.text() < entries()[b].key.text();
    };
    order.reserve(size());
    for (std::size_t i = first; i < size(); ++i) {
        order.push_back(static_cast<std::uint32_t>(i));
    }
    const auto added = order.begin() + static_cast<std::ptrdiff_t>(first);
    std::stable_sort(added, order.end(), earlier);
    std::inplace_merge(order.begin(), added, order.end(), earlier);
}

void DictionaryBlock::removeDuplicatesAndNone() {
    rebuildOrder();
    Entry* const all = entries();
    if (order.empty()) {
        std::array<std::string_view, Dictionary::kIndexedAbove> keys;
        for (std::size_t i = 0; i < size(); ++i) {
            keys[i] = all[i].key.text();
            for (std::size_t j = 0; j < i; ++j) {
                if (keys[j] == keys[i]) {
                    all[j].value = Value(); // The later one wins.
                }
            }
        }
    } else {
        for (std::size_t i = 1; i < order.size(); ++i) {
            if (all[order[i - 1]].key == all[order[i]].key) {
                all[order[i - 1]].value = Value();
            }
        }
    }
    const Entry* const kept =
        std::remove_if(all, all + size(), [](const Entry& entry) { return entry.value.isNone(); });
    if (kept != all + size()) {
        truncate(static_cast<std::size_t>(kept - all));
        rebuildOrder();
    }
}

bool areEqual(std::span<const Dictionary::Entry> left, std::span<const Dictionary::Entry> right,
              const DictionaryBlock* block) noexcept {
    if (left.size() != right.size()) {
        return false;
    }
    for (std::size_t i = 0; i < left.size(); ++i) {
        const Dictionary::Entry& entry = left[i];
        // Messages of one kind carry their keys in one order: try that first.
        const Dictionary::Entry* const counterpart =
            right[i].key == entry.key ? &right[i] : block->find(entry.key.text(), right.size());
        if (counterpart == nullptr || !(entry.value == counterpart->value)) {
            return false;
        }
    }
    return true;
}

} // namespace detail

Dictionary::Builder::Builder(std::size_t capacity)
    : block_(capacity > 0 ? DictionaryBlock::make(capacity) : nullptr) {}

Dictionary::Builder::~Builder() {
    if (block_ != nullptr) {
        DictionaryBlock::free(block_);
    }
}

void Dictionary::Builder::add(Value key, Value value) noexcept {
    assert(key.isString() && block_ != nullptr && block_->size() < block_->capacity);
    block_->add(std::move(key), std::move(value));
}

Dictionary Dictionary::Builder::finish() {
    Dictionary dictionary;
    if (block_ != nullptr && block_->size() > 0) {
        block_->removeDuplicatesAndNone();
        dictionary.hold(std::exchange(block_, nullptr));
    }
    return dictionary;
}

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
    Builder builder(entries.size());
    for (const Entry& entry : entries) {
        builder.add(entry.key, entry.value);
    }
    *this = builder.finish();
}

Dictionary::Dictionary(std::vector<Entry> entries) {
    Builder builder(entries.size());
    for (Entry& entry : entries) {
        builder.add(std::move(entry.key), std::move(entry.value));
    }
    *this = builder.finish();
}

// With all its entries.
void Dictionary::hold(DictionaryBlock* block) noexcept {
    holder_ = Value();
    holder_.setBlock(Value::Kind::Dictionary, block, block->size());
}

DictionaryBlock& Dictionary::ownBlock(std::size_t capacity) {
    DictionaryBlock* const current = block();
    if (current != nullptr && !current->isShared() && current->fixed == 0 &&
        capacity <= current->capacity) {
        current->truncate(size()); // What somebody who has gone has added.
        return *current;
    }
    DictionaryBlock* const copy = DictionaryBlock::make(capacity);
    if (current != nullptr) {
        for (const Entry& entry : *this) {
            copy->add(entry.key, entry.value);
        }
        copy->order = current->order;
    }
    hold(copy);
    return *copy;
}

const Value* Dictionary::find(std::string_view key) const noexcept {
    const Entry* const entry = block() != nullptr ? block()->find(key, size()) : nullptr;
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
    const Entry* const present = block() != nullptr ? block()->find(key.text(), size()) : nullptr;
    if (present == nullptr) {
        append(std::move(key), std::move(value));
        return;
    }
    const std::ptrdiff_t index = present - begin();
    DictionaryBlock& own = ownBlock(size());
    own.entries()[index].value = std::move(value);
    own.forgetMeasure();
}

void Dictionary::append(Value&& key, Value&& value) {
    if (appendShared(key, value)) {
        return;
    }
    DictionaryBlock* const current = block();
    const bool isShared = current != nullptr && current->isShared();
    const bool isFull = current == nullptr || size() == current->capacity;
    if (!isShared && !isFull) {
        current->truncate(size());
    }
    DictionaryBlock& own = isShared ? ownBlock(size() + 1)
                           : isFull ? ownBlock(std::max<std::size_t>(size() * 2, 4))
                                    : *current;
    if (!own.order.empty()) {
        const auto at = own.order.begin() + static_cast<std::ptrdiff_t>(own.lowerBound(key.text()));
        own.order.insert(at, own.size());
    }
    own.add(std::move(key), std::move(value));
    holder_.wide_.extra = own.size();
    if (own.order.empty()) {
        own.rebuildOrder();
    }
}

// Several threads may try: the entry behind the last belongs to the first of them. Whoever
// gets to see it was handed this dictionary, or a copy of it, afterwards.
bool Dictionary::appendShared(Value& key, Value& value) noexcept {
    DictionaryBlock* const shared = block();
    std::uint32_t count = holder_.wide_.extra;
    if (shared == nullptr || count >= shared->capacity || count >= kIndexedAbove ||
        shared->isPart() || !shared->isShared() ||
        !shared->used.compare_exchange_strong(count, count + 1, std::memory_order_relaxed)) {
        return false;
    }
    new (shared->entries() + count) Entry{std::move(key), std::move(value)};
    holder_.wide_.extra = count + 1;
    return true;
}

void Dictionary::erase(std::string_view key) {
    const Entry* const present = block() != nullptr ? block()->find(key, size()) : nullptr;
    if (present == nullptr) {
        return;
    }
    // `key` may lie in the entries, which do not outlive the next line.
    const std::ptrdiff_t index = present - begin();
    DictionaryBlock& own = ownBlock(size());
    std::move(own.entries() + index + 1, own.entries() + own.size(), own.entries() + index);
    own.truncate(own.size() - 1);
    own.rebuildOrder();
    holder_.wide_.extra = own.size();
}

void Dictionary::merge(const Dictionary& other) {
    if (empty() || other.empty()) {
        *this = empty() ? other : *this;
        return;
    }
    const Dictionary kept = other; // It may be this very one.
    const std::size_t before = size();
    DictionaryBlock& own = ownBlock(before + kept.size());
    // Requires that no key stands twice in `kept`.
    for (const Entry& entry : kept) {
        if (const Entry* const present = own.find(entry.key.text(), before)) {
            own.entries()[present - own.entries()].value = entry.value;
        } else {
            own.add(entry.key, entry.value);
        }
    }
    if (own.order.empty()) {
        own.rebuildOrder();
    } else {
        own.orderFrom(before);
    }
    own.forgetMeasure();
    holder_.wide_.extra = own.size();
}

bool operator==(const Dictionary& left, const Dictionary& right) noexcept {
    return detail::areEqual({left.begin(), left.end()}, {right.begin(), right.end()},
                            right.block());
}

} // namespace halyard
