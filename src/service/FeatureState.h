// The device state that goes into every session: the defaults, read once, and
// the features, read whenever they are asked for.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "common/Value.h"

namespace halyard {

struct FeatureRecord {
    std::string defaultsDomain;
    std::string featureDomain; // the key of the preference
    std::string notification;
    std::optional<int> notifyToken; // set once registered
};

// The two features the service follows, in the order in which they are read.
std::vector<FeatureRecord> makeFeatureRecords();

// {"device_name" (when set), "disable_reporting"}
Dictionary HYReportingDefaults();

// The features that are set, with the time of reading; none when none is set.
std::optional<Dictionary> readFeaturesState(const std::vector<FeatureRecord>& features);

// A list of the records as dictionaries, for log lines.
Value describeFeatures(const std::vector<FeatureRecord>& features);

} // namespace halyard
