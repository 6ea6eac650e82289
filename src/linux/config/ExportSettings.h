// What of the store may leave the machine, and where to. The daemon sends nothing
// itself; it reads these so that a mistake is told where all others are, and notes when
// the owner's consent changes.
//
// A plain value.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace halyard::linux_ {

struct ExportSettings {
    bool consent = false;
    std::string endpoint;    // of the receiver, http: or https:; empty: none is named here
    std::string headersFile; // files are absolute paths; empty: none
    std::string certificate;
    std::string clientCertificate;
    std::string clientKey;
    std::vector<std::string> signals{"logs", "metrics", "traces"}; // of these three
    bool analyticsEvents = false;
    std::vector<std::string> omit{"device_name"}; // keys that never leave
    std::uint64_t maxBytesPerDay = 50ULL * 1024 * 1024;
    std::map<std::string, std::string> resource; // attributes beside the device's own

    bool operator==(const ExportSettings&) const = default;
};

} // namespace halyard::linux_
