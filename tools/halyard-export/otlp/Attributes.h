// Attributes of the OpenTelemetry protocol: a key and a value of one of its kinds.
//
// What they are written into is any message of the protocol; `tag` is the field of the
// attributes there. Free functions; any thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include <protozero/pbf_writer.hpp>

#include "otlp/Fields.h"

namespace halyard::exporting::otlp {

using Writer = protozero::pbf_writer;

// Texts are UTF-8 there: what is not becomes U+FFFD.
void addText(Writer& writer, Tag tag, std::string_view key, std::string_view text);
void addInteger(Writer& writer, Tag tag, std::string_view key, std::int64_t value);
void addReal(Writer& writer, Tag tag, std::string_view key, double value);
void addBoolean(Writer& writer, Tag tag, std::string_view key, bool value);

// `value` is the encoded AnyValue, which may be empty: nothing.
void addAny(Writer& writer, Tag tag, std::string_view key, std::string_view value);

// Appends the fields of an AnyValue.
void appendText(std::string& any, std::string_view text);
void appendInteger(std::string& any, std::int64_t value);
void appendReal(std::string& any, double value);
void appendBoolean(std::string& any, bool value);

// Seconds since 1970 in nanoseconds; 0 for what the protocol cannot say.
std::uint64_t nanoseconds(double seconds);

} // namespace halyard::exporting::otlp
