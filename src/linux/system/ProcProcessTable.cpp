#include "linux/system/ProcProcessTable.h"

#include <unistd.h>
#include <utility>

#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

// Kernel threads may have longer names than the record holds.
constexpr std::size_t kMaxCommandName = 16;
constexpr std::size_t kMaxCommFile = 4096;

std::optional<std::string> commandName(const std::filesystem::path& process) {
    auto read = readSmallFile(process / "comm", kMaxCommFile);
    if (!read.ok()) {
        return std::nullopt;
    }
    std::string name = std::move(read).value();
    // The last newline is the file's; any other is the name's.
    if (name.ends_with('\n')) {
        name.pop_back();
    }
    name.resize(std::min(name.size(), kMaxCommandName));
    return name;
}

} // namespace

ProcProcessTable::ProcProcessTable(std::filesystem::path root) : root_(std::move(root)) {}

std::optional<platform::ProcessInfo> ProcProcessTable::infoForPID(std::int32_t pid) const {
    if (pid < 1) {
        return std::nullopt;
    }
    std::optional<std::string> name = commandName(root_ / std::to_string(pid));
    return name ? std::optional(platform::ProcessInfo{std::move(*name)}) : std::nullopt;
}

ProcOwnProcess::ProcOwnProcess(std::function<void()> lastWords, std::filesystem::path root)
    : lastWords_(std::move(lastWords)), root_(std::move(root)) {}

std::int32_t ProcOwnProcess::pid() const {
    return ::getpid();
}

std::string ProcOwnProcess::name() const {
    return commandName(root_ / "self").value_or("");
}

void ProcOwnProcess::terminate(int status) {
    if (ending_.exchange(true)) {
        // The first caller's last words must not be cut off.
        for (;;) {
            ::pause();
        }
    }
    if (lastWords_) {
        lastWords_();
    }
    ::_exit(status);
}

} // namespace halyard::linux_
