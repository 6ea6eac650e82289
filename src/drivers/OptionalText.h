#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace halyard {

// How logs and keys print a name that may be absent.
inline std::string_view orNull(const std::optional<std::string_view>& text) {
    return text.value_or("(null)");
}
inline std::string_view orNull(const std::optional<std::string>& text) {
    return text ? std::string_view(*text) : "(null)";
}

} // namespace halyard
