// The incident reporter: keeps one folder for each snapshot, with the incident's
// signature, what /proc tells about the detected process, and the service's
// latest log lines:
//
//     incidents/000017-20240229T123456Z-AudioAnalytics-haptics-DSP_IO-mpv/
//         incident.json  log.txt  process-4711/{status,stat,io,…}
//
// The newest are kept, within a bound in number and bytes. A folder is put together under a hidden
// name and appears whole. The rising number in front, not the time, tells which are the newest,
// since the clock may jump. The folders are the service's own to read: a process's facts are nobody
// else's business.
//
// Any thread may ask; snapshots are taken one after the other by a worker of its
// own, of lowest priority. Those that find too many waiting are refused and
// counted.
#pragma once

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "common/Result.h"
#include "linux/queues/Worker.h"
#include "platform/Clock.h"
#include "platform/IncidentReporter.h"

namespace halyard::linux_ {

class IncidentFolder final : public platform::IncidentReporter {
public:
    static constexpr std::size_t kKept = 50;
    static constexpr std::uintmax_t kKeptBytes = 32 * 1024 * 1024;
    static constexpr std::size_t kMostWaiting = 8;
    static constexpr std::size_t kMostLogBytes = 1024 * 1024;

    struct Options {
        std::filesystem::path directory; // made when needed, its parent too
        std::filesystem::path procRoot = "/proc";
        // The latest log lines, oldest first. On the worker.
        std::function<std::vector<std::string>()> recentLines;
        // Records a finished snapshot; `report` is the path of its folder. On
        // the worker.
        std::function<void(const Dictionary& signature, std::string_view report,
                           platform::WallTime time)>
            record;
    };

    // Borrows `clock`.
    IncidentFolder(const platform::Clock& clock, Options options);
    // Lets a running snapshot end; those that wait are dropped.
    ~IncidentFolder() override;

    // The response holds "success" and either "path" or "error".
    void snapshotWithSignature(const Dictionary& signature, double duration, const Value& event,
                               const Value& payload, Reply reply) override;

    // Runs `task` on the worker, behind the snapshots that wait.
    void whenIdle(std::function<void()> task) { worker_.post(std::move(task)); }

    std::uint64_t refusedSnapshots() const { return refused_.load(); }
    std::uint64_t failedSnapshots() const { return failed_.load(); }

private:
    struct Snapshot;
    void take(const Snapshot& snapshot);
    // The folder's path.
    Result<std::filesystem::path> write(const Snapshot& snapshot) const;
    Result<void> fillFolder(const std::filesystem::path& folder, const Snapshot& snapshot) const;
    void reportFailure(std::string_view what);

    const platform::Clock& clock_;
    const Options options_;
    std::atomic<std::size_t> waiting_{0};
    std::atomic<std::uint64_t> refused_{0};
    std::atomic<std::uint64_t> failed_{0};
    bool failing_ = false; // the worker's
    Worker worker_{"incidents", 1, platform::QueuePriority::Background};
};

// The name of an incident's folder, made of nothing but letters, digits, "_" and
// "-", whatever the signature holds.
std::string incidentFolderName(std::uint64_t number, platform::WallTime time,
                               const Dictionary& signature);

} // namespace halyard::linux_
