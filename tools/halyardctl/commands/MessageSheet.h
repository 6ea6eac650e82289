// What became of the messages that a daemon got, in lines for people.
//
// A free function; any thread.
#pragma once

#include <string>
#include <vector>

#include "common/Value.h"

namespace halyard::ctl {

// Of what admin.status answered; none where it has no such sheet.
std::vector<std::string> messageSheet(const Dictionary& status);

} // namespace halyard::ctl
