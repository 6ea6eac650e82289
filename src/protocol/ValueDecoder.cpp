#include "protocol/ValueDecoder.h"

#include <bit>
#include <fmt/format.h>
#include <vector>

#include "protocol/Wire.h"

namespace halyard::protocol {
namespace {

constexpr int kTimestampType = -1;
constexpr std::uint32_t kNanosecondsPerSecond = 1'000'000'000;

// The three widths of a timestamp; nullopt for every other.
std::optional<Date> timestamp(std::string_view data) noexcept {
    switch (data.size()) {
    case 4:
        return Date{loadBig<std::uint32_t>(data.data()), 0};
    case 8: {
        const auto packed = loadBig<std::uint64_t>(data.data());
        return Date{static_cast<std::int64_t>(packed & 0x3'FFFF'FFFFU),
                    static_cast<std::uint32_t>(packed >> 34U)};
    }
    case 12:
        return Date{static_cast<std::int64_t>(loadBig<std::uint64_t>(data.data() + 4)),
                    loadBig<std::uint32_t>(data.data())};
    default:
        return std::nullopt;
    }
}

} // namespace

std::string Integer::text() const {
    return negative ? fmt::to_string(static_cast<std::int64_t>(bits)) : fmt::to_string(bits);
}

Value ValueDecoder::value(const Token& token, int depth) {
    switch (token.family) {
    case Family::Invalid:
        fail(Problem::Malformed);
        return {};
    case Family::Nil:
        return {};
    case Family::False:
        return false;
    case Family::True:
        return true;
    case Family::Signed:
        return static_cast<std::int64_t>(Integer::from(token)->bits);
    case Family::Unsigned:
        return Integer::from(token)->bits;
    case Family::Float32:
        return std::bit_cast<float>(loadBig<std::uint32_t>(token.payload));
    case Family::Float64:
        return std::bit_cast<double>(loadBig<std::uint64_t>(token.payload));
    case Family::Text:
        return token.bytes();
    case Family::Array:
        return list(token, depth);
    case Family::Map:
        return dictionary(token, depth);
    case Family::Extension:
        return date(token);
    }
    return {};
}

Dictionary ValueDecoder::dictionary(const Token& map, int depth, std::size_t spare) {
    if (depth >= kMaxDepth) {
        fail(Problem::Malformed);
        return {};
    }
    std::vector<Dictionary::Entry> entries;
    entries.reserve(map.size + spare);
    for (std::size_t i = 0; i < map.size && problem_ == Problem::None; ++i) {
        const Token key = next();
        if (key.family != Family::Text) {
            fail(key.family == Family::Invalid ? Problem::Malformed : Problem::KeyIsNoString);
            break;
        }
        // In the braces' order: the key's bytes come before the value's.
        entries.push_back({keys_ != nullptr ? keys_->intern(key.bytes()) : Value(key.bytes()),
                           value(next(), depth + 1)});
    }
    return Dictionary(std::move(entries));
}

List ValueDecoder::list(const Token& array, int depth) {
    if (depth >= kMaxDepth) {
        fail(Problem::Malformed);
        return {};
    }
    std::vector<Value> items;
    items.reserve(array.size);
    for (std::size_t i = 0; i < array.size && problem_ == Problem::None; ++i) {
        items.push_back(value(next(), depth + 1));
    }
    return List(std::move(items));
}

Value ValueDecoder::date(const Token& extension) {
    extensionType_ = static_cast<signed char>(extension.payload[0]);
    if (extensionType_ != kTimestampType) {
        fail(Problem::ForeignExtension);
        return {};
    }
    const auto moment = timestamp(extension.bytes().substr(1));
    if (!moment || moment->nanoseconds >= kNanosecondsPerSecond) {
        fail(Problem::BadTimestamp);
        return {};
    }
    return *moment;
}

void ValueDecoder::fail(Problem problem) noexcept {
    if (problem_ == Problem::None) {
        problem_ = problem;
    }
}

std::string ValueDecoder::problemText() const {
    switch (problem_) {
    case Problem::None:
        break;
    case Problem::Malformed:
        return "bytes that are no MessagePack";
    case Problem::KeyIsNoString:
        return "a dictionary key that is no string";
    case Problem::ForeignExtension:
        return fmt::format("an extension of type {} (only timestamps, -1, are known)",
                           extensionType_);
    case Problem::BadTimestamp:
        return "an ill-formed timestamp";
    }
    return {};
}

std::string_view kindName(const Token& token) {
    switch (token.family) {
    case Family::Invalid:
        break;
    case Family::Nil:
        return "nil";
    case Family::False:
    case Family::True:
        return "a boolean";
    case Family::Signed:
    case Family::Unsigned:
        return "an integer";
    case Family::Float32:
    case Family::Float64:
        return "a real";
    case Family::Text:
        return "a string";
    case Family::Array:
        return "a list";
    case Family::Map:
        return "a dictionary";
    case Family::Extension:
        return "an extension";
    }
    return "nothing";
}

} // namespace halyard::protocol
