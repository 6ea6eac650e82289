// The very bytes of a request in the JSON form of the protocol: lowerCamelCase names, 64-bit
// numbers as texts, identities in hexadecimal.
//
// Source: OpenTelemetry protocol specification 1.5, "JSON Protobuf Encoding". Pure; any
// thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "place/ExportPlace.h"

namespace halyard::exporting::otlp {

// None when `body` is no request of that signal.
std::optional<std::string> jsonOf(Signal signal, std::string_view body);

} // namespace halyard::exporting::otlp
