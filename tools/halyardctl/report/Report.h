// The command `report`. It knows nothing of the command line.
#pragma once

#include <string>

#include "Context.h"

namespace halyard::ctl {

struct ReportOptions {
    std::string output{}; // a file; empty with --json only
    std::string trace{};  // a results file; empty: none
};
Exit runReport(Context& context, const ReportOptions& options);

} // namespace halyard::ctl
