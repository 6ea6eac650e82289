// The words of the command line, and what they make happen.
//
// A free function, called once by main.
#pragma once

#include "Context.h"

namespace halyard::ctl {

// Runs the command that is named; the status to end with.
Exit runCommandLine(Context& context, int count, const char* const* words);

} // namespace halyard::ctl
