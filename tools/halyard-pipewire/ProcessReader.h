// Reads what the kernel tells of one process and of the thread of it that works in
// the graph.
//
// Which thread that is nobody says. It is the one that wakes once a cycle: found by
// the name that PipeWire gives it, else by its real-time class, else by how often it
// was scheduled between two looks.
//
// Files stay open, so that a look costs a few system calls, and a process ID that
// is used again is never taken for the old process. Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <string>
#include <sys/types.h>

#include "Samples.h"

namespace halyard::pipewire {

// Closes its descriptor.
class Descriptor final {
public:
    Descriptor() = default;
    explicit Descriptor(int fd) : fd_(fd) {}
    Descriptor(Descriptor&& other) noexcept : fd_(other.fd_) { other.fd_ = -1; }
    Descriptor& operator=(Descriptor&& other) noexcept;
    ~Descriptor();

    int get() const { return fd_; }
    explicit operator bool() const { return fd_ >= 0; }

private:
    int fd_ = -1;
};

class ProcessReader final {
public:
    static constexpr std::size_t kMaxThreads = 512;

    struct Places {
        std::filesystem::path processes = "/proc";
        std::filesystem::path controlGroups = "/sys/fs/cgroup";
    };

    // Opens what there is; a process that is not there, or not ours to see, is one of
    // which nothing is known.
    ProcessReader(pid_t process, Places places);

    // Looks at the threads for the first time. The only one that PipeWire has named for
    // it is known then; the only one of a real-time class is taken for now.
    void beginSearch();
    // Looks for the thread that was scheduled about `wakeUps` times since then, or that
    // for each of several streams. True when it is known; to be called until it is.
    bool findThread(std::uint64_t wakeUps, int streams = 1);
    bool threadKnown() const { return known_; }
    // The one that is read: known, or taken for now. Empty when there is none.
    const std::string& thread() const { return thread_; }

    [[nodiscard]] ThreadSample sample(Nanoseconds now);
    // How the process ended.
    struct Ending {
        bool gone = false;
        std::optional<int> status; // as wait() gives it, where the kernel tells
        // By a signal that nobody sends who only wants it to end.
        bool died() const;
    };
    [[nodiscard]] Ending ending() const;

private:
    struct Candidate {
        std::uint64_t slices = 0;
    };
    void openThread(const std::string& thread);
    bool frozen();
    void followGroup(const std::string& groups);

    Places places_;
    Descriptor handle_; // tells of its end after it is gone
    Descriptor folder_;
    Descriptor processStat_;
    Descriptor groups_;
    Descriptor threadStat_;
    Descriptor threadTimes_;
    std::string thread_;
    bool known_ = false;
    std::string knownGroups_;
    Descriptor freezerOne_; // freezer.state, of the first kind of control groups
    Descriptor freezerTwo_; // cgroup.events, of the second
    std::map<std::string, Candidate> candidates_;
};

} // namespace halyard::pipewire
