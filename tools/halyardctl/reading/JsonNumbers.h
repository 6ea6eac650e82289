// What a number of a JSON text is.
#pragma once

#include <charconv>
#include <cstdint>
#include <string_view>
#include <system_error>

namespace halyard::reading {

// Tells `handler` by its Int64, Uint64 or Double, and returns what that does. False when
// neither a 64-bit integer nor a double holds it. As the standard library reads them: exact,
// where the parser's own way to exact numbers shifts a zero such as "0e-88" by an undefined
// count.
template <class Handler> bool takeNumber(std::string_view text, Handler& handler) {
    const auto isWhole = [text](auto& number) {
        const auto read = std::from_chars(text.data(), text.data() + text.size(), number);
        return read.ec == std::errc() && read.ptr == text.data() + text.size();
    };
    // Of what has a fraction or an exponent these read the beginning at most: sooner than to
    // look for one.
    std::int64_t integer = 0;
    if (isWhole(integer) && (integer != 0 || text.front() != '-')) {
        return handler.Int64(integer);
    }
    std::uint64_t large = 0;
    if (isWhole(large)) {
        return handler.Uint64(large);
    }
    double real = 0;
    return isWhole(real) && handler.Double(real);
}

} // namespace halyard::reading
