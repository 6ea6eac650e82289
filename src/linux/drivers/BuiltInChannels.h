// The driver channels that a Linux device has without being told, as far as it
// has the hardware. docs/drivers.md says which stand in which group, and why.
#pragma once

#include <vector>

#include "linux/drivers/ChannelSource.h"
#include "linux/drivers/DriverChannel.h"

namespace halyard::linux_ {

// Looks at what is there now. Bounded for each kind of device, so that a machine
// with hundreds of processors is still sampled in a moment.
std::vector<DriverChannel> builtInChannels(const SourceRoot& root);

} // namespace halyard::linux_
