// What is said of the device, once in each request.
//
// Free functions; any thread.
#pragma once

#include <map>
#include <optional>
#include <string>

#include "content/Omission.h"

namespace halyard::exporting {

// Of the machine that this runs on.
struct SystemFacts {
    std::string osVersion;    // the distribution's, else the kernel's
    std::string architecture; // as `host.arch` names it
};
SystemFacts systemFacts();

struct ResourceFacts {
    std::string device; // its identity
    std::optional<std::string> deviceName;
    SystemFacts system;
    std::map<std::string, std::string> own; // the operator's, which win
};

// The fields of a Resource.
std::string resourceAttributes(const ResourceFacts& facts, const Omission& omission);

} // namespace halyard::exporting
