// A digest as one JSON object: what the page is made of, and what --json prints.
//
// Free functions; any thread.
#pragma once

#include "output/JsonStream.h"
#include "report/Digest.h"

namespace halyard::ctl {

// Rows of tables as they are, or packed, in base64, as the page has them.
enum class RowForm : std::uint8_t { Plain, Packed };

void writeDigest(JsonStream& json, const Digest& digest, RowForm rows);

} // namespace halyard::ctl
