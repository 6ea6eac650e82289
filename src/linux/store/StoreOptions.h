// What a store is made with. Plain values.
#pragma once

#include <chrono>
#include <cstddef>
#include <filesystem>
#include <functional>

#include "linux/store/StoreLimits.h"
#include "linux/store/StoreQueue.h"

namespace halyard::linux_ {

struct StoreOptions {
    std::filesystem::path path; // of telemetry.db
    StoreLimits limits;
    StoreQueue::Marks marks;
    // Called from any thread that uses the store, never twice with the same value.
    StoreQueue::PressureHandler onPressure;
    // Called on the thread that opens the file, each time that it was opened or made.
    std::function<void()> onOpened;

    // A group is committed when it has this many rows, or limits.syncInterval after the
    // first of fewer came. A slow disk gets larger ones, and so does one that is to be
    // written to more seldom than kPromptInterval.
    std::size_t groupRows = 1024;
    // So many groups become one where they wait for it: that writes less, and syncs once.
    std::size_t mostGroups = 4;
    std::size_t patientRows = 6144;
    // Few rows at a time write less with smaller pages. Of a new file.
    int patientPageBytes = 2048;
    std::chrono::milliseconds busyTimeout{1000};
    std::chrono::nanoseconds firstRetry = std::chrono::milliseconds(100);
    std::chrono::nanoseconds lastRetry = std::chrono::seconds(5);
    // When one operation counts as hanging, by the clock, and how often to look.
    std::chrono::nanoseconds stuckAfter = std::chrono::seconds(10);
    std::chrono::nanoseconds watchPeriod = std::chrono::seconds(1); // while clients are held back
    std::chrono::nanoseconds calmWatchPeriod = std::chrono::seconds(5);
    // How often the age of rows is looked at, and how often at most when none come: a
    // tenth of the age in between.
    std::chrono::nanoseconds agePeriod = std::chrono::minutes(1);
    std::chrono::nanoseconds idlePeriod = std::chrono::minutes(10);
    // Damage is looked at so many times, with growing pauses, before it is believed, and
    // a file that cannot be read for so long is given up.
    int looks = 3;
    std::chrono::nanoseconds lookPause = std::chrono::milliseconds(50);
    std::chrono::nanoseconds unreadableFor = std::chrono::minutes(1);
    // When what was set aside and could not be read is tried again, at doubled intervals.
    std::chrono::nanoseconds firstRereading = std::chrono::seconds(10);
    std::chrono::nanoseconds lastRereading = std::chrono::minutes(10);
    // How long the end of the store may take.
    std::chrono::nanoseconds closeLimit = std::chrono::seconds(10);
    const char* vfs = nullptr; // SQLite's default
};

} // namespace halyard::linux_
