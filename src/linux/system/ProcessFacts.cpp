#include "linux/system/ProcessFacts.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <fstream>
#include <optional>

#include "common/Utf8.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kKernelNameLength = 15;

constexpr std::array kFactFiles = {"status", "stat",   "statm", "schedstat", "io",
                                   "limits", "cgroup", "wchan", "oom_score"};

std::optional<std::string> readStart(const fs::path& path, std::size_t most) {
    std::ifstream file(path, std::ios::binary);
    if (!file) {
        return std::nullopt;
    }
    std::string text(most, '\0');
    file.read(text.data(), static_cast<std::streamsize>(most));
    text.resize(static_cast<std::size_t>(file.gcount()));
    if (file.bad() || (text.empty() && !file.eof())) {
        return std::nullopt;
    }
    return text;
}

std::optional<std::int32_t> processNumber(const std::string& name) {
    std::int32_t pid = 0;
    const char* const end = name.data() + name.size();
    const auto result = std::from_chars(name.data(), end, pid);
    return result.ec == std::errc{} && result.ptr == end && pid > 0 ? std::optional(pid)
                                                                    : std::nullopt;
}

// Clients' names have been made valid text, so the kernel's is compared as such.
bool isNamed(const fs::path& process, std::string_view name) {
    auto own = readStart(process / "comm", kKernelNameLength + 1);
    if (!own) {
        return false;
    }
    if (own->ends_with('\n')) {
        own->pop_back();
    }
    return replaceInvalidUtf8(*own) == name || *own == name.substr(0, kKernelNameLength);
}

ProcessFacts factsOf(std::int32_t pid, const fs::path& process) {
    ProcessFacts result{pid, {}};
    for (const char* name : kFactFiles) {
        if (auto text = readStart(process / name, kMostFactBytes)) {
            result.facts.push_back({name, std::move(*text)});
        }
    }
    std::error_code error;
    if (const fs::path program = fs::read_symlink(process / "exe", error); !error) {
        result.facts.push_back({"exe", program.string() + '\n'});
    }
    return result;
}

} // namespace

NamedProcesses processesNamed(std::string_view name, const fs::path& procRoot) {
    std::vector<std::int32_t> found;
    std::size_t scanned = 0;
    std::error_code error;
    for (fs::directory_iterator at(procRoot, error), end; !error && at != end;
         at.increment(error)) {
        const auto pid = processNumber(at->path().filename().string());
        if (!pid) {
            continue;
        }
        if (++scanned > kMostProcessesScanned) {
            break;
        }
        if (isNamed(at->path(), name)) {
            found.push_back(*pid);
        }
    }
    std::sort(found.begin(), found.end());
    NamedProcesses result;
    result.leftOut = found.size() - std::min(found.size(), kMostProcessesReported);
    found.resize(found.size() - result.leftOut);
    for (const std::int32_t pid : found) {
        result.processes.push_back(factsOf(pid, procRoot / std::to_string(pid)));
    }
    return result;
}

} // namespace halyard::linux_
