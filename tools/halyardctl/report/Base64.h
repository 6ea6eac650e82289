// Bytes as a page can hold them. A free function; any thread.
#pragma once

#include <string>
#include <string_view>

namespace halyard::ctl {

// With "=" at its end where needed.
std::string base64(std::string_view bytes);

} // namespace halyard::ctl
