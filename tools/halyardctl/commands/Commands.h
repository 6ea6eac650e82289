// The commands, each in a source of its own. They know nothing of the command line.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "Context.h"
#include "linux/store/Schema.h"
#include "reading/GlitchTally.h"

namespace halyard::ctl {

Exit runStatus(Context& context);
Exit runSessions(Context& context);
Exit runMessages(Context& context);
// Each, or summed up.
Exit runGlitches(Context& context, std::optional<reading::GlitchKey> by);
// The rows of a table that is none of the above.
Exit runTable(Context& context, linux_::StoreTable table);
Exit runTrace(Context& context, const std::string& file);

} // namespace halyard::ctl
