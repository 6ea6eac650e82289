// From the device's configuration to what an exporter goes by.
//
// Free functions; any thread.
#pragma once

#include "Exporter.h"
#include "linux/config/Settings.h"

namespace halyard::exporting {

// Without a receiver. Where something about the sending is wrong, nothing is sent, and
// `trouble` says why.
Exporter::Plan planFor(const linux_::Settings& settings, const linux_::Environment& environment,
                       std::string& trouble);

// For who only looks: as if there were consent and somebody to send to, without bounds.
// What was collected without consent is looked at only while there is none.
reading::Outcome<Exporter::Plan> planToShow(const linux_::Settings& settings,
                                            const linux_::Environment& environment);

} // namespace halyard::exporting
