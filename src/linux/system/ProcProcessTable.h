// Processes as procfs tells of them.
#pragma once

#include <atomic>
#include <filesystem>
#include <functional>

#include "platform/Device.h"

namespace halyard::linux_ {

// Any thread; a look-up is three system calls.
class ProcProcessTable final : public platform::ProcessTable {
public:
    explicit ProcProcessTable(std::filesystem::path root = "/proc");

    std::optional<platform::ProcessInfo> infoForPID(std::int32_t pid) const override;

private:
    const std::filesystem::path root_;
};

// Any thread.
class ProcOwnProcess final : public platform::OwnProcess {
public:
    // `lastWords` saves what must not be lost. It runs once, on the thread that
    // calls terminate(), and must come to an end by itself.
    explicit ProcOwnProcess(std::function<void()> lastWords, std::filesystem::path root = "/proc");

    std::int32_t pid() const override;
    // Empty when procfs is not there.
    std::string name() const override;
    // Runs no destructors and no exit handlers: other threads are still at work.
    void terminate(int status) override;

private:
    const std::function<void()> lastWords_;
    const std::filesystem::path root_;
    std::atomic<bool> ending_ = false;
};

} // namespace halyard::linux_
