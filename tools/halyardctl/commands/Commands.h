// The commands, each in a source of its own. They know nothing of the command line.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "Context.h"

namespace halyard::ctl {

Exit runStatus(Context& context);
Exit runSessions(Context& context);
Exit runMessages(Context& context);

} // namespace halyard::ctl
