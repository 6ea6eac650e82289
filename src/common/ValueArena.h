// Makes a dictionary with all that it holds in one piece of memory.
//
// A message of a dozen keys would else be half a dozen blocks, which one thread allocates,
// two look at and another frees: each of them is a cache miss for everybody, and the
// allocator walks through all of them. In one piece a message is read as it lies, counted
// once and freed at a stroke.
//
// The parts refer to each other without being counted. Whoever copies one of them keeps
// all alive, which is charged to nobody: keep Value::detached() of it.
//
// Not thread-safe; what it makes is like any other dictionary.
#pragma once

#include <cstddef>
#include <string_view>

#include "common/Value.h"

namespace halyard {

class ValueArena {
public:
    // What a dictionary will take, added up before it is made.
    class Size {
    public:
        void addText(std::size_t length);
        void addList(std::size_t items);
        void addDictionary(std::size_t entries);
        std::size_t bytes() const { return bytes_; }

    private:
        std::size_t bytes_ = 0;
    };

    // The dictionary itself: with room for so many entries, and beside it for `inside`.
    ValueArena(std::size_t capacity, Size inside);
    ~ValueArena();
    ValueArena(const ValueArena&) = delete;
    ValueArena& operator=(const ValueArena&) = delete;

    // All of these require that Size has been told of them. What they return is to be
    // moved into a part of the same arena, or dropped.
    Value text(std::string_view text);
    // A key that is interned stays as it is.
    Value key(Value key);
    detail::ListBlock* list(std::size_t capacity);
    // Requires no more than Dictionary::kIndexedAbove entries.
    detail::DictionaryBlock* dictionary(std::size_t capacity);
    static Value finish(detail::ListBlock* list);
    static Value finish(detail::DictionaryBlock* dictionary);

    detail::DictionaryBlock& root() { return *root_; }
    // Hands it over. Of equal keys the last one wins.
    Dictionary finish();

private:
    void* take(std::size_t bytes);

    detail::DictionaryBlock* root_;
    char* free_;
    char* end_;
};

} // namespace halyard
