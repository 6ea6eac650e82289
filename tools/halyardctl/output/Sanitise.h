// Text from the store, made fit for a terminal.
//
// Whoever may report may put anything into a name: sequences that move the cursor,
// overrides that turn the order of letters round, bytes that are no text at all. None
// of it reaches a terminal: it is shown as what it is, "\x1b" or "\u{202e}".
//
// Free functions; any thread, after the locale has been set (see Terminal).
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace halyard::ctl {

// One line of printable text. Tabs and line ends become "\t" and "\n", a backslash
// "\\", so that an escape can be told from a text that looks like one.
std::string sanitised(std::string_view text);

// Cells that a sanitised text takes.
std::size_t displayWidth(std::string_view text);

// Cut to `width` cells, the last of them "…" where something is missing.
std::string shortened(std::string_view text, std::size_t width);

// Whether a terminal may act upon this code point instead of showing it.
bool isUnsafe(char32_t code);

// The code point at `at`, which moves behind it. Requires valid UTF-8.
char32_t nextCodePoint(std::string_view text, std::size_t& at);

} // namespace halyard::ctl
