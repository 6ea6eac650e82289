// Makes a digest of a store: its sessions, then its glitches, then its messages and the
// other tables, each row once, as they stream by.
//
// Not thread-safe.
#pragma once

#include <functional>

#include "Context.h"
#include "report/Digest.h"

namespace halyard::ctl {

// Called with how far it is, from 0 to 1.
using ReportProgress = std::function<void(double)>;

// `digest` was made with `limits`, and has its scope.
Outcome<void> gatherDigest(reading::StoreReader& reader, Digest& digest,
                           const Digest::Limits& limits, const ReportProgress& progress);

} // namespace halyard::ctl
