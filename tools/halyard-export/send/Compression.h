// gzip (RFC 1952). Pure; any thread.
#pragma once

#include <string>
#include <string_view>

namespace halyard::exporting {

// At the quickest level, which is most of what there is to gain. Empty when there is no
// memory for it.
std::string gzipped(std::string_view bytes);

} // namespace halyard::exporting
