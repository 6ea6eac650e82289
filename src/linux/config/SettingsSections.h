// The sections of the configuration file that have a source of their own.
#pragma once

#include "linux/config/TomlReader.h"

namespace halyard::linux_ {

void readDrivers(TomlReader& reader, const NamedNode& at, Settings& into);
void readExport(TomlReader& reader, const NamedNode& at, Settings& into);

} // namespace halyard::linux_
