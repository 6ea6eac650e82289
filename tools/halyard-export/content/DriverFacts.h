// What a statistics key of the daemon means: driver, group, subgroup, channel and unit.
//
// The key joins them with "_", and leaves out what a channel has not; which of them are
// there is looked up among the channels that this device has. A value; any thread.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "linux/drivers/DriverChannel.h"

namespace halyard::exporting {

struct DriverFacts {
    std::string driver;
    std::string group;
    std::string subgroup;
    std::string channel;
    std::string unit; // may be empty

    bool operator==(const DriverFacts&) const = default;
};

class DriverNames {
public:
    DriverNames() = default;
    explicit DriverNames(const std::vector<linux_::DriverChannel>& channels);

    // `kind`: "Simple", "Histogram" or "State". None for what is no such key.
    std::optional<DriverFacts> factsOf(std::string_view key, std::string_view kind) const;

private:
    std::map<std::string, DriverFacts, std::less<>> known_; // by the key without its kind
    std::map<std::string, std::pair<std::string, std::string>, std::less<>> groups_;
};

} // namespace halyard::exporting
