// What it means when a receiver that speaks TLS breaks off, in words that name the key to set.
//
// The library tells which alert came, if any came before the connection broke, but not that a
// certificate of the client's is what was missing. Free functions; any thread.
#pragma once

#include <string>
#include <string_view>

namespace halyard::exporting {

// `why`: what the library says. `broke`: the connection was made, and ended before an answer.
std::string troubleWithoutCertificate(std::string_view why, bool broke);

} // namespace halyard::exporting
