// The system's own pieces, as the platform offers them: clocks, randomness,
// conditions, files, the process table. None of them depends on a setting.
//
// Made and offered on one thread; the pieces may be used from any.
#pragma once

#include <filesystem>

#include "linux/system/LinuxFacts.h"
#include "linux/system/LinuxFiles.h"
#include "linux/system/ProcProcessTable.h"
#include "platform/Platform.h"

namespace halyard::linux_ {

struct SystemServices {
    explicit SystemServices(const Directories& directories) : files(directories) {}

    void offerTo(platform::Platform& platform) {
        platform.clock = &clock;
        platform.random = &random;
        platform.conditions = &conditions;
        platform.files = &files;
        platform.processTable = &processTable;
    }

    SystemClock clock;
    SystemRandom random;
    SystemConditions conditions;
    LinuxFiles files;
    ProcProcessTable processTable;
};

} // namespace halyard::linux_
