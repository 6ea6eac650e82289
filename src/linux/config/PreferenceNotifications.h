// Announces changed preferences to the features that follow them.
#pragma once

#include <string_view>
#include <vector>

#include "linux/config/Configuration.h"
#include "linux/config/Settings.h"
#include "platform/Device.h"

namespace halyard::linux_ {

// The notifications of the followed preferences that differ, set and unset
// included. Pure.
[[nodiscard]] std::vector<std::string_view> changedPreferences(const Settings& before,
                                                               const Settings& after);

// From now on every reload of `configuration` posts what it changed. Borrows
// `notifications`, which must outlive the configuration.
void announceChangedPreferences(Configuration& configuration,
                                platform::Notifications& notifications);

} // namespace halyard::linux_
