// A JSON text as a tree, for texts that somebody else wrote.
#pragma once

#include <string_view>

#include <rapidjson/document.h>

namespace halyard::reading {

enum class Encoding {
    Any,    // as it stands
    Checked // the text must be UTF-8
};

// False when `text` is no JSON, or has a number that no 64-bit integer and no double holds;
// `document` is null then. Takes no more of the stack for a deep text than for a flat one.
bool parseJson(std::string_view text, Encoding encoding, rapidjson::Document& document);

} // namespace halyard::reading
