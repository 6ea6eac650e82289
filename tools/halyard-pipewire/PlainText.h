// Text that others gave, made fit for a terminal. Pure functions.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace halyard::pipewire {

// At most `longest` characters, the last an ellipsis when there were more. What
// would move the cursor, change colours or turn the writing round, and what is no
// UTF-8, is shown by its number: "\x1b". Requires longest > 0.
[[nodiscard]] std::string plainText(std::string_view text, std::size_t longest);

// Characters, not bytes, of what plainText() made.
[[nodiscard]] std::size_t widthOf(std::string_view text);

} // namespace halyard::pipewire
