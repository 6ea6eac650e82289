// The textual description of a value, as log lines, joined summaries and trace
// parameter files use it: strings as they are, numbers in decimal, containers
// as an old-style (OpenStep) property list that parses back to the same value.
//
// Format: the OpenStep property list of GNUstep and plutil.
#pragma once

#include <string>
#include <string_view>

#include "common/Value.h"

namespace halyard {

// An absent value reads "(null)".
std::string describe(const Value& value);
void appendDescription(std::string& out, const Value& value);

// `text`; of a long one its first `limit` bytes, or a few less where a character would
// be cut, and "... (N bytes more)".
std::string shortened(std::string text, std::size_t limit);

// "yyyy-MM-dd HH:mm:ss +0000"
std::string describe(Date date);
// "yyyy-MM-ddTHH:mm:ssZ" (RFC 3339), with a fraction where there is one.
std::string rfc3339(Date date);
// Shortest decimal form that reads back as the same number of the same width.
std::string shortestDecimal(double value);
std::string shortestDecimal(float value);

} // namespace halyard
