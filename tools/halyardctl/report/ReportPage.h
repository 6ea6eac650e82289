// The page: a frame that is part of this program, with a digest in its middle.
//
// The digest stands in it as JSON, in an element that browsers do not run, and without
// any "<", so that no text of the store can end that element. The frame's own script
// makes texts of it, never markup, and the page's policy lets no other script run.
//
// Free functions; any thread.
#pragma once

#include <cstdio>
#include <functional>
#include <string_view>

#include "output/JsonStream.h"

namespace halyard::ctl {

// Made when the program was built; holds kDigestMark once.
std::string_view pageFrame();
inline constexpr std::string_view kDigestMark = "@DIGEST@";

// False when `to` could not be written.
[[nodiscard]] bool writePage(std::FILE* to, const std::function<void(JsonStream&)>& writeDigest);

} // namespace halyard::ctl
