// The three time stamps that every message carries.
//
// A free function; any thread.
#pragma once

#include "common/Value.h"

namespace halyard::ctl {

// Adds those that `message` lacks, as libhalyard does for its programs.
void addStamps(Dictionary& message);

} // namespace halyard::ctl
