// A program in a tree of files like those of /proc, for tests of what is made of it.
#pragma once

#include <cstdint>
#include <filesystem>
#include <fmt/core.h>
#include <string>

#include "Cycle.h"
#include "ProcessReader.h"
#include "testing/TempTree.h"

namespace halyard::pipewire {

// No process has such an ID.
inline constexpr pid_t kProgram = 4'194'400;

struct FakeThread {
    pid_t id = 0;
    std::string name;
    char state = 'S';
    bool realTime = false;
    Nanoseconds cpu = 0;
    Nanoseconds delay = 0;
    std::uint64_t slices = 0;
    std::uint64_t majorFaults = 0;
};

class FakeProcesses final {
public:
    FakeProcesses() {
        machine(0);
        for (const char* resource : {"cpu", "memory", "io"}) {
            tree_.write(std::string("proc/pressure/") + resource,
                        "some avg10=0.00 avg60=0.00 avg300=0.00 total=0\n");
        }
    }

    ProcessReader::Places places() const { return {tree_ / "proc", tree_ / "groups"}; }
    const testing::TempTree& tree() const { return tree_; }

    // The process as a whole: its main thread's state, and how it ended.
    void process(pid_t id, char state = 'S', int status = 0) const {
        FakeThread whole{.id = id, .name = "main", .state = state};
        tree_.write(folder(id) + "stat", stat(whole, status));
        tree_.write(folder(id) + "cgroup", "7:freezer:/music\n0::/music\n");
    }
    void thread(pid_t process, const FakeThread& thread) const {
        const std::string place = folder(process) + "task/" + std::to_string(thread.id) + '/';
        tree_.write(place + "comm", thread.name + '\n');
        tree_.write(place + "stat", stat(thread, 0));
        tree_.write(place + "schedstat",
                    fmt::format("{} {} {}\n", thread.cpu, thread.delay, thread.slices));
    }
    // What the watching thread waited for processors.
    void machine(Nanoseconds ownDelay) const {
        tree_.write("proc/thread-self/schedstat", fmt::format("5 {} 1\n", ownDelay));
    }
    void frozen(bool isFrozen) const {
        tree_.write("groups/music/cgroup.events",
                    fmt::format("populated 1\nfrozen {}\n", isFrozen ? 1 : 0));
    }
    void frozenInFirstHierarchy(bool isFrozen) const {
        tree_.write("groups/freezer/music/freezer.state", isFrozen ? "FROZEN\n" : "THAWED\n");
    }

private:
    static std::string folder(pid_t id) { return "proc/" + std::to_string(id) + '/'; }

    // Fields by their number in proc(5).
    static std::string stat(const FakeThread& thread, int status) {
        std::string text = fmt::format("{} (a) b {}) {}", thread.id, thread.name, thread.state);
        for (int field = 4; field <= 52; ++field) {
            std::uint64_t value = 0;
            value = field == 12 ? thread.majorFaults : value;
            value = field == 41 && thread.realTime ? 1 : value; // SCHED_FIFO
            value = field == 52 ? static_cast<std::uint64_t>(status) : value;
            text += ' ' + std::to_string(value);
        }
        return text + '\n';
    }

    testing::TempTree tree_;
};

} // namespace halyard::pipewire
