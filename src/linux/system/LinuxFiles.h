// Files of the real system. Paths below the audio logs' directory, as the
// service's constants name it, lie below the daemon's logs directory.
//
// Any thread.
#pragma once

#include "common/Mutex.h"
#include "linux/system/Directories.h"
#include "platform/Files.h"

namespace halyard::linux_ {

class LinuxFiles final : public platform::Files {
public:
    // What a directory keeps of files that are added.
    static constexpr std::size_t kMostAdded = 500;
    static constexpr std::uintmax_t kMostAddedBytes = 64 * 1024 * 1024;

    explicit LinuxFiles(Directories directories) : directories_(std::move(directories)) {}

    std::variant<std::string, Error> readFile(std::string_view path,
                                              std::size_t most) const override;
    std::string currentDirectory() const override;
    std::string located(std::string_view path) const override;
    MaybeError createDirectories(std::string_view path, std::uint32_t mode) override;
    MaybeError writeFileAtomically(std::string_view path, std::string_view contents) override;
    std::variant<std::string, Error> addFile(std::string_view path,
                                             std::string_view contents) override;

private:
    bool isOwn(const std::filesystem::path& path) const;

    const Directories directories_;
    Mutex adding_; // So that a name that is free stays so.
};

// What the core is told of the system's refusal: errno as the code.
Error systemError(const Failure& failure);

} // namespace halyard::linux_
