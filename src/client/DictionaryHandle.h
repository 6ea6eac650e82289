// What stands behind the C ABI's dictionary handle.
#pragma once

#include "client/DictionaryWriter.h"
#include "halyard/halyard.h"

struct halyard_dictionary {
    halyard::client::DictionaryWriter writer;
};
