// UTF-8 checks for text that comes from outside.
#pragma once

#include <string>
#include <string_view>

namespace halyard {

[[nodiscard]] bool isValidUtf8(std::string_view text) noexcept;

// `text` with every maximal ill-formed part replaced by U+FFFD, as the Unicode
// standard (section 3.9, "U+FFFD Substitution of Maximal Subparts") recommends.
[[nodiscard]] std::string replaceInvalidUtf8(std::string_view text);

} // namespace halyard
