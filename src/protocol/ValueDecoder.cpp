#include "protocol/ValueDecoder.h"

#include <bit>
#include <fmt/format.h>
#include <utility>

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
        return arena_ != nullptr ? arena_->text(token.bytes()) : Value(token.bytes());
    case Family::Array:
        return arena_ != nullptr ? listInPiece(token, depth) : Value(list(token, depth));
    case Family::Map:
        return arena_ != nullptr ? dictionaryInPiece(token, depth)
                                 : Value(dictionary(token, depth));
    case Family::Extension:
        return date(token);
    }
    return {};
}

// None when it is not worth while, or no MessagePack.
std::optional<ValueArena::Size> ValueDecoder::sizeInPiece(const Token& map) const noexcept {
    Reader ahead = reader_;
    ValueArena::Size size;
    std::size_t left = std::size_t{2} * map.size;
    for (; left > 0; --left) {
        const Token token = ahead.next();
        if (token.family == Family::Text) {
            size.addText(token.bytes().size());
        } else if (token.family == Family::Array) {
            size.addList(token.size);
            left += token.size;
        } else if (token.family == Family::Map) {
            size.addDictionary(token.size);
            left += std::size_t{2} * token.size;
        }
        const bool isIndexed =
            token.family == Family::Map && token.size > Dictionary::kIndexedAbove;
        if (token.family == Family::Invalid || isIndexed || size.bytes() > kMostInPiece) {
            return std::nullopt;
        }
    }
    return size;
}

Dictionary ValueDecoder::message(const Token& map, int depth, std::size_t spare) {
    const auto inside = map.size <= Dictionary::kIndexedAbove ? sizeInPiece(map) : std::nullopt;
    if (!inside || depth >= kMaxDepth) {
        return dictionary(map, depth, spare);
    }
    ValueArena arena(map.size + spare, *inside);
    arena_ = &arena;
    fillInPiece(arena.root(), map, depth);
    arena_ = nullptr;
    return problem_ == Problem::None ? arena.finish() : Dictionary();
}

void ValueDecoder::fillInPiece(detail::DictionaryBlock& block, const Token& map, int depth) {
    for (std::size_t i = 0; i < map.size && problem_ == Problem::None; ++i) {
        const Token key = next();
        if (key.family != Family::Text) {
            fail(key.family == Family::Invalid ? Problem::Malformed : Problem::KeyIsNoString);
            return;
        }
        Value name =
            keys_ != nullptr ? arena_->key(keys_->intern(key.bytes())) : arena_->text(key.bytes());
        block.add(std::move(name), value(next(), depth + 1));
    }
}

Value ValueDecoder::dictionaryInPiece(const Token& map, int depth) {
    if (depth >= kMaxDepth) {
        fail(Problem::Malformed);
        return {};
    }
    detail::DictionaryBlock* const block = arena_->dictionary(map.size);
    if (block != nullptr) {
        fillInPiece(*block, map, depth);
    }
    return ValueArena::finish(block);
}

Value ValueDecoder::listInPiece(const Token& array, int depth) {
    if (depth >= kMaxDepth) {
        fail(Problem::Malformed);
        return {};
    }
    detail::ListBlock* const block = arena_->list(array.size);
    for (std::size_t i = 0; i < array.size && problem_ == Problem::None; ++i) {
        block->add(value(next(), depth + 1));
    }
    return ValueArena::finish(block);
}

Dictionary ValueDecoder::dictionary(const Token& map, int depth, std::size_t spare) {
    if (depth >= kMaxDepth) {
        fail(Problem::Malformed);
        return {};
    }
    Dictionary::Builder entries(map.size + spare);
    for (std::size_t i = 0; i < map.size && problem_ == Problem::None; ++i) {
        const Token key = next();
        if (key.family != Family::Text) {
            fail(key.family == Family::Invalid ? Problem::Malformed : Problem::KeyIsNoString);
            break;
        }
        // The key's bytes come before the value's.
        Value name = keys_ != nullptr ? keys_->intern(key.bytes()) : Value(key.bytes());
        entries.add(std::move(name), value(next(), depth + 1));
    }
    return entries.finish();
}

List ValueDecoder::list(const Token& array, int depth) {
    if (depth >= kMaxDepth) {
        fail(Problem::Malformed);
        return {};
    }
    List::Builder items(array.size);
    for (std::size_t i = 0; i < array.size && problem_ == Problem::None; ++i) {
        items.add(value(next(), depth + 1));
    }
    return items.finish();
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
