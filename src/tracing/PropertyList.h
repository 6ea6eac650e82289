// Reads a property list in any of its forms: XML, binary, or the old text.
#pragma once

#include <string_view>
#include <variant>

#include "common/Error.h"
#include "common/Value.h"

namespace halyard {

// More levels, or more bytes, are an error: these files name a few hundred events.
inline constexpr std::size_t kMostPropertyListBytes = 1024 * 1024;

// The value, which is never none, or what is wrong with it. Any thread.
[[nodiscard]] std::variant<Value, Error> parsePropertyList(std::string_view bytes);

} // namespace halyard
