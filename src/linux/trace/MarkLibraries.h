// Finds the files of libhalyard that processes have mapped, and in them the
// function whose calls a trace records.
//
// The files are the clients' own: nothing in them is trusted. Any thread.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace halyard::linux_ {

// The offset in the file of a function that an ELF library exports; none when
// it has no such function.
[[nodiscard]] std::optional<std::uint64_t> functionOffset(const std::filesystem::path& library,
                                                          std::string_view function);

class MarkLibraries {
public:
    struct Library {
        std::string path; // as the kernel can look it up for us
        std::uint64_t offset;
    };

    // More files and more processes are not looked at.
    static constexpr std::size_t kMostLibraries = 16;
    static constexpr std::size_t kMostProcesses = 4096;

    // Those that none of the processes asked for before had.
    [[nodiscard]] std::vector<Library> newLibrariesOf(const std::vector<std::int32_t>& pids);

private:
    void addLibrariesOf(std::int32_t pid, std::vector<Library>& found);

    std::set<std::int32_t> seenProcesses_;
    std::set<std::pair<std::uint64_t, std::uint64_t>> seenFiles_; // device and inode
};

} // namespace halyard::linux_
