#include "linux/trace/Tracefs.h"

#include <atomic>
#include <charconv>
#include <fcntl.h>
#include <fmt/format.h>
#include <optional>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kPrefix = "halyard_";
constexpr std::size_t kMostDefinitions = 4 * 1024 * 1024;

// What tells a process from a later one of the same number.
std::optional<std::uint64_t> startTime(int pid) {
    const auto stat = readSmallFile(fmt::format("/proc/{}/stat", pid), 4096);
    if (!stat.ok()) {
        return std::nullopt;
    }
    // The name, in parentheses, may hold anything; the time is field 22.
    std::istringstream fields(stat.value().substr(stat.value().rfind(')') + 1));
    std::string field;
    for (int i = 3; i <= 22; ++i) {
        fields >> field;
    }
    std::uint64_t time = 0;
    std::from_chars(field.data(), field.data() + field.size(), time);
    return time;
}

bool isLeftover(std::string_view name) {
    int pid = 0;
    std::uint64_t time = 0;
    const char* const end = name.data() + name.size();
    if (!name.starts_with(kPrefix)) {
        return false;
    }
    const auto afterPid = std::from_chars(name.data() + kPrefix.size(), end, pid);
    if (afterPid.ec != std::errc{} || afterPid.ptr == end || *afterPid.ptr != '_') {
        return false;
    }
    const auto afterTime = std::from_chars(afterPid.ptr + 1, end, time);
    return afterTime.ec == std::errc{} && startTime(pid) != time;
}

std::size_t removeInstances(const fs::path& tracefs) {
    std::size_t removed = 0;
    std::error_code error;
    std::vector<fs::path> instances;
    for (const auto& entry : fs::directory_iterator(tracefs / "instances", error)) {
        instances.push_back(entry.path());
    }
    for (const fs::path& instance : instances) {
        if (isLeftover(instance.filename().string())) {
            (void)writeTracefs(instance / "events/enable", "0");
            removed += ::rmdir(instance.c_str()) == 0 ? 1U : 0U;
        }
    }
    return removed;
}

// Lines like "p:uprobes/name /path:0x0000123 arguments".
std::size_t removeProbes(const fs::path& tracefs) {
    const auto read = readSmallFile(tracefs / "uprobe_events", kMostDefinitions);
    std::size_t removed = 0;
    std::istringstream lines(read.ok() ? read.value() : std::string());
    for (std::string line; std::getline(lines, line);) {
        const std::string probe = line.substr(0, line.find(' '));
        if (probe.starts_with("p:") && isLeftover(std::string_view(probe).substr(2))) {
            const auto result =
                writeTracefs(tracefs / "uprobe_events", "-:" + probe.substr(2) + "\n", true);
            removed += result.ok() ? 1U : 0U;
        }
    }
    return removed;
}

} // namespace

Result<void> writeTracefs(const fs::path& file, std::string_view text, bool append) {
    const int fd = ::open(file.c_str(), O_WRONLY | O_CLOEXEC | (append ? O_APPEND : O_TRUNC));
    if (fd < 0) {
        return Failure::ofErrno(file.string());
    }
    Result<void> result;
    if (::write(fd, text.data(), text.size()) < 0) {
        result = Failure::ofErrno(file.string());
    }
    ::close(fd);
    return result;
}

std::string uniqueTraceName() {
    static std::atomic<unsigned> count{0};
    const int pid = ::getpid();
    return fmt::format("{}{}_{}_{}", kPrefix, pid, startTime(pid).value_or(0), count.fetch_add(1));
}

std::size_t removeTraceLeftovers(const fs::path& tracefs) {
    const std::size_t instances = removeInstances(tracefs); // They hold the probes.
    return instances + removeProbes(tracefs);
}

} // namespace halyard::linux_
