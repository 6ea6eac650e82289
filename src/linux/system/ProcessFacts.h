// What /proc tells about the processes of a given name.
//
// Reads only files that answer without waiting for the process itself, so that
// one that hangs can be looked at, and none that may hold its secrets (its
// environment, its arguments).
//
// Any thread.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

namespace halyard::linux_ {

struct ProcessFacts {
    struct Fact {
        std::string name; // of the file: "status", "io"
        std::string text;
    };

    std::int32_t pid = 0;
    std::vector<Fact> facts; // those that could be read
};

struct NamedProcesses {
    std::vector<ProcessFacts> processes;
    std::size_t leftOut = 0; // further ones of that name
};

inline constexpr std::size_t kMostProcessesScanned = 65536;
inline constexpr std::size_t kMostProcessesReported = 8;
inline constexpr std::size_t kMostFactBytes = 64 * 1024;

// `name` is compared as the kernel keeps it, cut to 15 bytes. A process that
// vanishes meanwhile has fewer facts, or none.
NamedProcesses processesNamed(std::string_view name, const std::filesystem::path& procRoot);

} // namespace halyard::linux_
