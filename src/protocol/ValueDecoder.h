// MessagePack objects to Values. Private to protocol/.
#pragma once

#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <type_traits>

#include "common/KeyTable.h"
#include "common/Value.h"
#include "common/ValueArena.h"
#include "protocol/MessagePack.h"

namespace halyard::protocol {

// An integer object, whatever its width on the wire.
struct Integer {
    std::uint64_t bits = 0;
    bool negative = false;

    // Nullopt when the object is no integer.
    static std::optional<Integer> from(const Token& token) noexcept;

    // Nullopt when out of T's range.
    template <class T> std::optional<T> as() const noexcept {
        if (negative) {
            const auto value = static_cast<std::int64_t>(bits);
            if (std::is_unsigned_v<T> || std::cmp_less(value, std::numeric_limits<T>::min())) {
                return std::nullopt;
            }
        } else if (std::cmp_greater(bits, std::numeric_limits<T>::max())) {
            return std::nullopt;
        }
        return static_cast<T>(bits);
    }
    std::string text() const;
};

inline std::optional<Integer> Integer::from(const Token& token) noexcept {
    if (token.family == Family::Unsigned) {
        return Integer{loadBig(token.payload, token.size), false};
    }
    if (token.family != Family::Signed) {
        return std::nullopt;
    }
    std::int64_t value = 0;
    switch (token.size) {
    case 0:
        value = static_cast<std::int8_t>(token.payload[-1]);
        break;
    case 1:
        value = static_cast<std::int8_t>(token.payload[0]);
        break;
    case 2:
        value = static_cast<std::int16_t>(loadBig<std::uint16_t>(token.payload));
        break;
    case 4:
        value = static_cast<std::int32_t>(loadBig<std::uint32_t>(token.payload));
        break;
    default:
        value = static_cast<std::int64_t>(loadBig<std::uint64_t>(token.payload));
        break;
    }
    return Integer{static_cast<std::uint64_t>(value), value < 0};
}

// Decodes the contents of one frame straight into Values: one reservation for
// each container, no tree in between.
//
// The first thing that has no Value form ends the decoding; what is returned
// from then on is to be thrown away.
class ValueDecoder {
public:
    enum class Problem : std::uint8_t {
        None,
        Malformed, // The bytes end early, nest too deep or are no MessagePack.
        KeyIsNoString,
        ForeignExtension,
        BadTimestamp,
    };

    // Borrows both; no `keys` means that keys are not interned.
    ValueDecoder(std::string_view bytes, KeyTable* keys) noexcept : reader_(bytes), keys_(keys) {}

    Token next() noexcept { return reader_.next(); }
    bool atEnd() const noexcept { return reader_.atEnd(); }

    // `depth` is the number of containers around the object.
    Value value(const Token& token, int depth);
    // Requires a map. Keeps room for as many entries more as `spare` says.
    Dictionary dictionary(const Token& map, int depth, std::size_t spare = 0);
    // The same in one piece of memory, unless it is large: for what comes, is looked at
    // and goes as a whole.
    Dictionary message(const Token& map, int depth, std::size_t spare);

    Problem problem() const noexcept { return problem_; }
    // "a dictionary key that is no string"
    std::string problemText() const;

private:
    static constexpr std::size_t kMostInPiece = 8192;

    List list(const Token& array, int depth);
    std::optional<ValueArena::Size> sizeInPiece(const Token& map) const noexcept;
    void fillInPiece(detail::DictionaryBlock& block, const Token& map, int depth);
    Value dictionaryInPiece(const Token& map, int depth);
    Value listInPiece(const Token& array, int depth);
    Value date(const Token& extension);
    void fail(Problem problem) noexcept;

    Reader reader_;
    KeyTable* keys_;
    ValueArena* arena_ = nullptr; // while a message is decoded
    Problem problem_ = Problem::None;
    int extensionType_ = 0;
};

// "a string", for messages.
std::string_view kindName(const Token& token);

} // namespace halyard::protocol
