// Puts the statistics of cycles into files, where halyardd can read them as it
// reads those of drivers: into a folder that it has made, four files for each device
// (docs/drivers.md has the form).
//
// Each file is replaced as a whole, so that a reader sees the old one or the new
// one. A file that is missing tells readers that nothing has been counted, so what
// was counted before a file comes is forgotten then, or readers would take it for
// new. One thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "CycleStatistics.h"

namespace halyard::pipewire {

// The name of the device's files without their ".counts", ".wait", ".busy" and
// ".cycle": another one for each device, of at most 200 bytes.
std::string cycleFileName(std::string_view device, bool isSink);

// Where halyardd may have made the folder, given the process's environment and
// the socket that the user named, which may be empty.
std::vector<std::string> cycleFolders(const char* (*environment)(const char*), bool isRoot,
                                      const std::string& socketPath);

class CycleFiles {
public:
    using SteadyTime = std::chrono::steady_clock::time_point;
    using Note = std::function<void(const std::string&)>;

    // Of the folders, the first that is there counts, at each write. `note` is told
    // once that nothing can be written, and once that it can again.
    CycleFiles(std::vector<std::string> folders, Note note);

    // Writes the files of those devices whose counts have changed, unless that was
    // done less than a second ago. Before it does so for the first time, it removes
    // what earlier runs of the same user left there. To be called about once a second
    // while cycles are counted: what was counted before the first call after a device
    // came is told with its first file.
    void write(CycleStatistics& statistics, SteadyTime now);
    // Removes all that was written, at the end: after the sessions have been
    // stopped, or their statistics lack these.
    void remove();

private:
    class Folder;

    // Lets the counts of a device whose files have gone begin anew.
    void forgetLost(const Folder& folder, CycleStatistics& statistics);
    // An errno value, or 0.
    int writeChanged(const Folder& folder, const CycleStatistics& statistics);
    void tell(const Folder& folder, int error);

    const std::vector<std::string> folders_;
    const Note note_;
    static constexpr std::uint64_t kNothing = UINT64_MAX;

    std::vector<std::string> names_;     // of the files of each device
    std::vector<std::uint64_t> written_; // and the cycles that they tell
    std::optional<SteadyTime> last_;
    bool swept_ = false;
    bool failing_ = false;
};

} // namespace halyard::pipewire
