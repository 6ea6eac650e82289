#include "common/ValueArena.h"

#include <cassert>
#include <cstring>
#include <new>
#include <utility>

namespace halyard {
namespace {

using detail::Counted;
using detail::DictionaryBlock;
using detail::ListBlock;
using detail::StringBlock;

// While it is made, so that whatever part is dropped frees nothing.
constexpr std::uint32_t kUnfinished = 0x40000000;

constexpr std::size_t kMaxInlineText = 14;

constexpr std::size_t aligned(std::size_t bytes) {
    return (bytes + alignof(Value) - 1) / alignof(Value) * alignof(Value);
}

constexpr std::size_t textBytes(std::size_t length) {
    return length > kMaxInlineText ? aligned(sizeof(StringBlock) + length) : 0;
}
constexpr std::size_t listBytes(std::size_t items) {
    return items > 0 ? sizeof(ListBlock) + items * sizeof(Value) : 0;
}
constexpr std::size_t dictionaryBytes(std::size_t entries) {
    return entries > 0 ? sizeof(DictionaryBlock) + entries * sizeof(Dictionary::Entry) : 0;
}

} // namespace

void ValueArena::Size::addText(std::size_t length) {
    bytes_ += textBytes(length);
}
void ValueArena::Size::addList(std::size_t items) {
    bytes_ += listBytes(items);
}
void ValueArena::Size::addDictionary(std::size_t entries) {
    bytes_ += dictionaryBytes(entries);
}

ValueArena::ValueArena(std::size_t capacity, Size inside) {
    const std::size_t own = sizeof(DictionaryBlock) + capacity * sizeof(Dictionary::Entry);
    auto* const memory = static_cast<char*>(::operator new(own + inside.bytes()));
    root_ = new (memory) DictionaryBlock(static_cast<std::uint32_t>(capacity));
    root_->references.store(kUnfinished, std::memory_order_relaxed);
    free_ = memory + own;
    end_ = free_ + inside.bytes();
}

// Nothing in it is counted.
ValueArena::~ValueArena() {
    if (root_ != nullptr) {
        root_->~DictionaryBlock();
        ::operator delete(root_);
    }
}

void* ValueArena::take(std::size_t bytes) {
    assert(free_ + bytes <= end_);
    return std::exchange(free_, free_ + bytes);
}

Value ValueArena::text(std::string_view text) {
    if (text.size() <= kMaxInlineText) {
        return Value(text);
    }
    auto* const block = new (take(textBytes(text.size()))) StringBlock;
    block->length = static_cast<std::uint32_t>(text.size());
    std::memcpy(block->bytes(), text.data(), text.size());
    block->offset =
        static_cast<std::uint32_t>(reinterpret_cast<char*>(block) - reinterpret_cast<char*>(root_));
    Value value;
    value.setBlock(Value::Kind::String, block);
    return value;
}

Value ValueArena::key(Value key) {
    return key.onHeap() && !key.wide_.block->isImmortal() ? text(key.text()) : std::move(key);
}

ListBlock* ValueArena::list(std::size_t capacity) {
    if (capacity == 0) {
        return nullptr;
    }
    auto* const block =
        new (take(listBytes(capacity))) ListBlock(static_cast<std::uint32_t>(capacity));
    block->offset =
        static_cast<std::uint32_t>(reinterpret_cast<char*>(block) - reinterpret_cast<char*>(root_));
    return block;
}

DictionaryBlock* ValueArena::dictionary(std::size_t capacity) {
    if (capacity == 0) {
        return nullptr;
    }
    auto* const block =
        new (take(dictionaryBytes(capacity))) DictionaryBlock(static_cast<std::uint32_t>(capacity));
    block->offset =
        static_cast<std::uint32_t>(reinterpret_cast<char*>(block) - reinterpret_cast<char*>(root_));
    return block;
}

Value ValueArena::finish(ListBlock* list) {
    Value value{List()};
    if (list != nullptr && list->size > 0) {
        value.setBlock(Value::Kind::List, list);
    }
    return value;
}

Value ValueArena::finish(DictionaryBlock* dictionary) {
    Value value{Dictionary()};
    if (dictionary != nullptr && dictionary->size() > 0) {
        dictionary->removeDuplicatesAndNone();
        dictionary->fixed = dictionary->size();
        value.setBlock(Value::Kind::Dictionary, dictionary, dictionary->size());
    }
    return value;
}

Dictionary ValueArena::finish() {
    root_->removeDuplicatesAndNone();
    root_->fixed = root_->size();
    Dictionary whole;
    if (root_->fixed > 0) {
        root_->references.store(1, std::memory_order_relaxed);
        whole.hold(std::exchange(root_, nullptr));
    }
    return whole;
}

} // namespace halyard
