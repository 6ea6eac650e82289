// Reads the old-style (OpenStep) property list text that Description.h writes:
// dictionaries `{key = value;}`, lists `(a, b)`, quoted and unquoted strings,
// data `<0fbd77>`, and comments of both kinds. Trace parameter files may be
// written in it.
//
// Every scalar is a string here, so what was a number or a date comes back as
// its text; data keeps its text, too.
#pragma once

#include <string_view>
#include <variant>

#include "common/Error.h"
#include "common/Value.h"

namespace halyard {

// Deeper text is an error.
inline constexpr int kMostPropertyListLevels = 64;

// What can be wrong with a property list, whichever form it has.
inline constexpr std::string_view kPropertyListErrorDomain = "com.kestrel.halyard.plist";

// The value, which is never none, or what is wrong and in which line. Of equal
// keys the last one wins. Any thread.
[[nodiscard]] std::variant<Value, Error> parsePropertyListText(std::string_view text);

} // namespace halyard
