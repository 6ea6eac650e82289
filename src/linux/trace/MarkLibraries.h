// Finds the files of libhalyard that processes have mapped, and in them the
// function whose calls a trace records.
//
// The files are the clients' own: nothing in them is trusted. Any thread.
#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "linux/system/RegularFile.h"

namespace halyard::linux_ {

// The offset in the file of a function that an ELF library exports; none when
// it has no such function.
[[nodiscard]] std::optional<std::uint64_t> functionOffset(const std::filesystem::path& library,
                                                          std::string_view function);

class MarkLibraries {
public:
    // The offset is one in this very file. Were the kernel given the name, its
    // owner could put another file there meanwhile, and the kernel would write into
    // the middle of whatever stands there.
    struct Library {
        std::string name; // for people: the path that the process has it by
        std::uint64_t offset;
        std::shared_ptr<RegularFile> file;
    };

    // More are left out: libraries of a session, which is told once, its processes
    // at a time, and paths of one process.
    static constexpr std::size_t kMostLibraries = 32;
    static constexpr std::size_t kMostProcesses = 4096;
    static constexpr std::size_t kMostOfProcess = 4;

    // Those that none of the processes asked for before had.
    [[nodiscard]] std::vector<Library> newLibrariesOf(const std::vector<std::int32_t>& pids);

private:
    void addLibrariesOf(std::int32_t pid, std::vector<Library>& found);
    void addLibrary(std::int32_t pid, const std::string& path, std::vector<Library>& found);

    std::set<std::int32_t> seenProcesses_;                        // that are still there
    std::set<std::pair<std::uint64_t, std::uint64_t>> seenFiles_; // device and inode
    bool toldOfMore_ = false;
};

} // namespace halyard::linux_
