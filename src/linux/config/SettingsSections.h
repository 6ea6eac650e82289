// The section of the configuration file that has a source of its own.
#pragma once

#include "linux/config/TomlReader.h"

namespace halyard::linux_ {

void readDrivers(TomlReader& reader, const NamedNode& at, Settings& into);

} // namespace halyard::linux_
