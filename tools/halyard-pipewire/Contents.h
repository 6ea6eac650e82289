// What a message or a configuration says: keys and values in the order in which
// they are to be written. A value of its own, because libhalyard's dictionaries
// are only written, and the tests of the rules look at what was said.
#pragma once

#include <algorithm>
#include <cstdint>
#include <initializer_list>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace halyard::pipewire {

class Contents;

using Names = std::vector<std::string>;
using Dictionaries = std::vector<Contents>;
// A dictionary in a dictionary.
struct Nested {
    std::vector<Contents> inner; // one
    bool operator==(const Nested&) const = default;
};
using Fact = std::variant<std::int64_t, double, std::string, Names, Nested, Dictionaries>;

class Contents final {
public:
    struct Entry {
        std::string key;
        Fact value;
        bool operator==(const Entry&) const = default;
    };

    Contents() = default;
    Contents(std::initializer_list<Entry> entries) : entries_(entries) {}

    // Requires a key that is not there yet.
    void add(std::string key, Fact value) {
        entries_.push_back({std::move(key), std::move(value)});
    }
    bool empty() const { return entries_.empty(); }
    auto begin() const { return entries_.begin(); }
    auto end() const { return entries_.end(); }
    // What is said of `key`; the kind's empty value when that is nothing, or
    // something of another kind.
    template <class Kind> Kind get(std::string_view key) const {
        const auto found =
            std::find_if(begin(), end(), [key](const Entry& entry) { return entry.key == key; });
        const Kind* const value = found != end() ? std::get_if<Kind>(&found->value) : nullptr;
        return value != nullptr ? *value : Kind();
    }
    bool operator==(const Contents&) const = default;

private:
    std::vector<Entry> entries_;
};

} // namespace halyard::pipewire
