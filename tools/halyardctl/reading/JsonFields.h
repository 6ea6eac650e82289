// The entries of a JSON object that a row of the store holds.
//
// Whatever the text is, no entry is found in what is no object. One object for many
// texts: the memory of the last is used for the next. Not thread-safe.
#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>

#include <rapidjson/document.h>

namespace halyard::reading {

class JsonFields {
public:
    JsonFields() = default;
    JsonFields(const JsonFields&) = delete;
    JsonFields& operator=(const JsonFields&) = delete;

    // False when `text` is no JSON object.
    bool parse(std::string_view text);

    // Valid until the next parse().
    std::optional<std::string_view> text(const char* key) const;
    std::optional<double> number(const char* key) const;
    std::optional<std::int64_t> integer(const char* key) const;
    // The texts of a list, or the one text that stands in its place.
    void forEachText(const char* key, const std::function<void(std::string_view)>& take) const;
    // In their order.
    void forEachEntry(
        const std::function<void(std::string_view key, const rapidjson::Value&)>& take) const;
    // Null when there is none.
    const rapidjson::Value* find(const char* key) const;

private:
    // Enough for most texts; what more they take is given back at the next.
    std::array<char, 8 * 1024> first_{};
    rapidjson::MemoryPoolAllocator<> allocator_{first_.data(), first_.size()};
    rapidjson::Value root_;
};

} // namespace halyard::reading
